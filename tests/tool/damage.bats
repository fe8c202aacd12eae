#!/usr/bin/env bats
# A database that is damaged, missing or out of reach, or a file that is not a database: each command says so in one
# sentence, changes nothing, and never takes it for a database without tokens

load common

MALFORMED="$REAL_DB is damaged (database disk image is malformed); \"vemo-access-token doctor\" says how badly"
READ_ONLY="$REAL_DB cannot be written to (attempt to write a readonly database); \"vemo-access-token doctor\" says why"

teardown() {
    # So that bats can remove what a failed test leaves.
    [ ! -d "$VEMO_REDIRECT_DIR" ] || chmod 0700 "$VEMO_REDIRECT_DIR"
}

# a_store: ten tokens, on several pages; $ID is one of them, and $DIR/other holds another one
a_store() {
    ID=$(a_token --allow Api:get --uses 5)
    tool export 2>/dev/null | sed '$d; s/"tid":"......../"tid":"________/' | whole >"$DIR/other"
    many_rows 9 "extra = json_object('data', hex(zeroblob(500))) WHERE tid <> '$ID'"
}

# all_fail SENTENCE [PATTERN]: the commands that match the pattern end with that, and leave everything as it was
all_fail() {
    local before arguments
    before=$(state)
    while read -r arguments; do
        fails 4 "$1" $arguments </dev/null
    done < <(calls | grep -E -- "${2-.}")
    [ "$(state)" = "$before" ]
    [ ! -e "$DIR/exported" ]
}

# spoil PAGE: replaces that page by random bytes or, with /dev/zero as second argument, by zeroes
spoil() {
    dd if="${2-/dev/urandom}" of="$DB" bs=4096 seek=$(($1 - 1)) count=1 conv=notrunc status=none
}

# leaf: a page among the tokens
leaf() {
    sql "SELECT max(pageno) FROM dbstat WHERE name = 'token' AND pagetype = 'leaf'"
}

@test "each command says what is wrong with the database, and changes nothing" {
    a_store
    cp -p "$DB" "$DIR/sound"
    all=. some='^(list$|show .{9}|grant|create|init|tune --wal)' unmade='^(list|show|check|grant|update|rotate|revoke|purge|stats|export|tune)'
    # Only init makes a directory. create and import make a file, but no table beside another.
    init='^init' all_but_init='^([^i]|import)'
    reading='^(list( -o.*)?$|show|check|grant|update|revoke [^-]|export$|create)' importing='^import .*other'
    # Those that only count tokens read the index of their ids.
    uncounted='^(list( -o.*)?$|show|check|grant|update|rotate|revoke [^-]|revoke --all --yes|purge|stats|export|import .*other|create)'
    # The table begins on page 3.
    while IFS='|' read -r damage which sentence finding; do
        echo "$damage"
        rm -rf "$VEMO_REDIRECT_DIR"
        mkdir -m 0700 "$VEMO_REDIRECT_DIR"
        cp -p "$DIR/sound" "$DB"
        eval "$damage"
        all_fail "$sentence" "${!which}"
        run_tool doctor
        [ "$status$stderr" = "$([[ $finding == note* ]] && echo 0 || echo 5)" ]
        [[ ${lines[0]} == $finding && ${lines[0]} != *'\x0a'* ]] # what SQLite says in several lines is on one
        [[ $output != *"vemo-access-token doctor"* ]] # that would be itself
    done <<TABLE
echo "These are the notes of somebody else." >"\$DB"|all|$NO_DATABASE|error: $NO_DATABASE
head -c 100 /dev/urandom >"\$DB"|some|$NO_DATABASE|error: $NO_DATABASE
spoil 1 /dev/zero|some|$NO_DATABASE|error: $NO_DATABASE
truncate -s 8192 "\$DB"|all|$MALFORMED|error: *malformed*
spoil 3 /dev/zero|uncounted|$MALFORMED|error: the database is damaged: *age 3: btreeInitPage() returns error code 11*
spoil 3|uncounted|$MALFORMED|error: the database is damaged: *
: >"\$DB"|unmade|$NO_TABLE|error: the database has no table of tokens
rm "\$DB"|unmade|$NO_FILE|note: there is no database $REAL_DB
sql "DROP TABLE token; CREATE TABLE other (tid)"|all_but_init|$NO_TABLE|error: the database has no table of tokens
sql "ALTER TABLE token DROP COLUMN extra"|reading|$REAL_DB failed: no such column: extra|error: the table of tokens lacks columns: extra
sql "ALTER TABLE token DROP COLUMN extra"|importing|$REAL_DB failed: table token has no column named extra|error: the table of tokens *
rm -r "\$VEMO_REDIRECT_DIR"|all_but_init|$NO_DIRECTORY|note: there is no directory $REAL_DIRECTORY
rm -r "\$VEMO_REDIRECT_DIR"; touch "\$VEMO_REDIRECT_DIR"|all_but_init|$REAL_DB: Not a directory|error: $REAL_DIRECTORY is not a directory
rm -r "\$VEMO_REDIRECT_DIR"; touch "\$VEMO_REDIRECT_DIR"|init|$REAL_DIRECTORY: Not a directory|error: $REAL_DIRECTORY is not a directory
rm "\$DB"; mkfifo "\$DB"|all|$REAL_DB is not a regular file|error: $REAL_DB is not a regular file
rm "\$DB"; mkdir "\$DB"|some|$REAL_DB is not a regular file|error: $REAL_DB is not a regular file
ln -sf / "\$DB"|some|$REAL_DB is not a regular file|error: $REAL_DB is a symbolic link
ln -sf /dev/zero "\$DB"|some|$REAL_DB is not a regular file|error: $REAL_DB is a symbolic link
ln -sf "\$DIR/nowhere" "\$DB"|all|$REAL_DB is a symbolic link to a file that is not there|error: $REAL_DB is a symbolic link
ln -sf vemo-access-token.db "\$DB"|some|$REAL_DB: Too many levels of symbolic links|error: $REAL_DB is a symbolic link
TABLE
    [ ! -e "$DIR/nowhere" ]
}

# Commands do not read what they do not need: here the map of pages, which is for shrinking the file.
@test "tokens can be listed as long as they can be read" {
    a_store
    cp "$DB" "$DIR/sound"
    leaf=$(leaf)
    spoil "$leaf" /dev/zero
    all_fail "$MALFORMED" '^(list$|export|purge$|stats$|create)'
    gives 10 list --count # by the index of their ids
    # Doctor names the page: a leaf, or the one where the index of the ids begins.
    for page in "$leaf" 4; do
        cp "$DIR/sound" "$DB"
        spoil "$page" /dev/zero
        run_tool doctor
        [[ ${lines[0]} == "error: the database is damaged: "*"age $page: btreeInitPage() returns error code 11"* ]]
    done
    cp "$DIR/sound" "$DB"
    spoil 2 /dev/zero
    cp "$DB" "$DIR/before"
    gives 10 list --count
    fails 0 "10 tokens exported" export "$DIR/exported"
    [ "$(wc -l <"$DIR/exported")" -eq 11 ]
    run_tool doctor
    [ "$status" -eq 5 ]
    [[ $output == "error: the database is damaged: "* && $output != *"says how badly"* ]]
    cmp "$DB" "$DIR/before"
}

# As the manual page describes it.
@test "what can be read of a damaged database can be saved" {
    many_rows 100 "function = 'VPN' || char(10), extra = json_object('data', hex(zeroblob(50)))"
    spoil "$(leaf)" /dev/zero
    run_tool export
    [ "$status" -eq 4 ]
    mv "$VEMO_REDIRECT_DIR" "$VEMO_REDIRECT_DIR.old"
    tool init
    {
        sqlite3 "$VEMO_REDIRECT_DIR.old/vemo-access-token.db" .dump 2>/dev/null | grep -E "^(BEGIN|INSERT INTO token )"
        echo "COMMIT;"
    } | sqlite3 "$DB"
    run_tool doctor
    [ "$status ${lines[-1]}" = "0 no findings" ] # but notes
    run_tool list --count
    [ "$output" -gt 80 ]
    [ "$output" -lt 100 ]
}

@test "a database or a directory that may not be read or written" {
    [ "$(id -u)" -ne 0 ] || skip "root may read and write everything"
    a_store
    writing='^(grant|update|revoke [^-]|revoke --all --yes|create|import .*other)'
    chmod 0000 "$DB"
    while read -r arguments; do
        fails 4 "$REAL_DB cannot be opened: Permission denied" $arguments
    done < <(calls)
    expect_first "error: $REAL_DB cannot be written to: Permission denied"
    chmod 0500 "$DB"
    all_fail "$READ_ONLY" "$writing"
    chmod 0700 "$DB"
    chmod 0500 "$VEMO_REDIRECT_DIR"
    all_fail "$READ_ONLY" "$writing"
    chmod 0000 "$VEMO_REDIRECT_DIR"
    expect_first "error: $REAL_DIRECTORY cannot be written to: Permission denied"
    all_fail "$REAL_DB: Permission denied" '^[^i]|^import'
}

@test "reading needs no room on the disk" {
    a_store
    for arguments in "show $ID --field count" "check $ID Api get" "list --count"; do
        # shellcheck disable=SC2016 # for the shell inside
        run bash -c 'trap "" XFSZ; ulimit -f 0; exec "$@"' - "$TOOL" $arguments
        [ "$status $output" = "0 $(tool $arguments)" ]
    done
}

@test "a NULL in a token" {
    a_store
    sql "UPDATE token SET extra = NULL WHERE tid = '$ID'"
    all_fail "$REAL_DB holds a token that cannot be read; \"vemo-access-token doctor\" finds it" \
        '^(list( -o.*)?$|export|show|check|grant|update|revoke [^-])'
    gives 1 show "${ZEROS}00000001" --field count # another token
    gives 10 list --count
    gives "10 tokens would be revoked" revoke --all --dry-run
    # An owner that is NULL is not root.
    sql "UPDATE token SET uid = NULL"
    run_tool stats -o jsonl
    [[ $output == *'"users":[{"tokens":10,"uid":null,"user":""}]}' ]]
    run_tool stats --no-header
    [ "${lines[-1]}" = "NULL    10" ]
}

@test "a word in the place of a number" {
    row token---
    for field in uid deadline count create_time; do
        sql "UPDATE token SET uid = 0, deadline = 32503680000, count = 5, create_time = 1;
             UPDATE token SET $field = 'some'"
        gives 1 list --count
        gives 0 show token--- --field $field
        succeeds stats
        gives "1 token would be revoked" revoke token--- --dry-run
    done
    # The purge compares in SQL, where a word is greater than all numbers. Programs grant such a token for ever.
    sql "UPDATE token SET deadline = 'some'"
    gives 0 list --expired --count
    gives "0 tokens would be purged" purge --dry-run
    gives allowed check token--- Api get
    gives granted grant "token---$ZEROS" Api get
}
