#!/usr/bin/env bats
# A database that is damaged, is none or cannot be had: one sentence, no crash, no wait, no change, and never
# "no tokens"

load common

NO_DATABASE="is not a token database, or is damaged (file is not a database)"
MALFORMED="is damaged (database disk image is malformed); \"vemo-access-token doctor\" says how badly"
UNREADABLE="holds a token that cannot be read; \"vemo-access-token doctor\" finds it"

teardown()
{
    # What a failed test may have made inaccessible must be removed.
    [ ! -d "$VEMO_REDIRECT_DIR" ] || chmod 0700 "$VEMO_REDIRECT_DIR"
}

# a_store: ten tokens, on several pages; $ID is one of them, and $DIR/other holds one that is none of them
a_store()
{
    ID=$(a_token --allow Api:get --uses 5)
    tool export 2>/dev/null | sed '$d; s/"tid":"......../"tid":"________/' | whole >"$DIR/other"
    sql "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 9)
         INSERT INTO token SELECT i || tid, bind_sid, uid, deadline, count, create_time, function, webapi_allow,
         json_object('data', hex(zeroblob(500))) FROM token, n"
}

# commands: one line of arguments for each way to open the database, but for init and doctor
commands()
{
    cat <<TABLE
list
show $ID
check $ID Api get
grant $ID Api get
update $ID --uses 2
rotate $ID
revoke $ID
revoke --all --dry-run
revoke --all --yes
purge
purge --dry-run
stats
export
export $DIR/exported
import $DIR/other
create --uid 0 --function TAG
tune
tune --wal
tune --dry-run
TABLE
}

# some_commands: one of each kind
some_commands()
{
    commands | grep -E '^(list|show|grant|create|tune --wal)'
}

# run_shortly ARGUMENTS...: run_tool, but hanging is a failure, and faster, for there are many
run_shortly()
{
    status=0
    timeout 20 "$TOOL" "$@" >"$DIR/output" 2>"$DIR/stderr" </dev/null || status=$?
    output=$(<"$DIR/output")
    stderr=$(<"$DIR/stderr")
    mapfile -t lines <"$DIR/output"
}

# all_fail SENTENCE [COMMANDS]: those commands, one on each line, end with it, and leave everything as it was
all_fail()
{
    local before arguments
    [ ! -f "$DB" ] || cp -f "$DB" "$DIR/before"
    before=$(ls -Al "$VEMO_REDIRECT_DIR" 2>&1 || true)
    while read -r arguments; do
        # shellcheck disable=SC2086 # several arguments
        run_shortly $arguments
        expect 4 "" "vemo-access-token: $1" || {
            echo "of: $arguments"
            return 1
        }
    done <<<"${2-$(commands)}"
    [ ! -f "$DB" ] || cmp "$DB" "$DIR/before"
    [ "$(ls -Al "$VEMO_REDIRECT_DIR" 2>&1 || true)" = "$before" ]
    [ ! -e "$DIR/exported" ]
}

# doctor_looks SENTENCE [note]: its first finding, without a repair
doctor_looks()
{
    run_shortly doctor
    [ "$status" -eq "$([ "${2-}" = note ] && echo 0 || echo 5)" ]
    [ "$stderr" = "" ]
    [ "${lines[0]}" = "${2-error}: $1" ]
}

# doctor_finds SENTENCE: this, and nothing else, with the same result for --repair; changes nothing
doctor_finds()
{
    [ ! -f "$DB" ] || cp "$DB" "$DIR/before"
    for arguments in doctor "doctor --repair"; do
        # shellcheck disable=SC2086
        run_shortly $arguments
        [ "$status" -eq 5 ] && [ "$stderr" = "" ] && [ "$(grep -vE '^    (meaning|remedy): .' <<<"$output")" = "error: $1" ] || {
            echo "status $status, output: $output"
            echo "stderr: $stderr"
            return 1
        }
        [ ! -f "$DB" ] || cmp "$DB" "$DIR/before"
    done
}

# spoil PAGE: random bytes or, with /dev/zero as second argument, zeroes in the place of that page
spoil()
{
    dd if="${2-/dev/urandom}" of="$DB" bs=4096 seek=$(($1 - 1)) count=1 conv=notrunc status=none
}

# root_page NAME: where a table or an index begins
root_page()
{
    sql "SELECT rootpage FROM sqlite_schema WHERE name = '$1'"
}

@test "a file that is no database" {
    a_store
    echo "These are the notes of somebody else." >"$DB"
    all_fail "$REAL_DB $NO_DATABASE"
    all_fail "$REAL_DB $NO_DATABASE" init
    doctor_finds "$REAL_DB $NO_DATABASE"
}

@test "a hundred random bytes" {
    a_store
    head -c 100 /dev/urandom >"$DB"
    all_fail "$REAL_DB $NO_DATABASE"
    all_fail "$REAL_DB $NO_DATABASE" init
    doctor_finds "$REAL_DB $NO_DATABASE"
}

@test "a database whose first page is gone" {
    a_store
    spoil 1 /dev/zero
    all_fail "$REAL_DB $NO_DATABASE" "$(some_commands)"
    doctor_finds "$REAL_DB $NO_DATABASE"
}

@test "a database that is cut off" {
    a_store
    truncate -s 8192 "$DB"
    all_fail "$REAL_DB $MALFORMED"
    all_fail "$REAL_DB $MALFORMED" init
}

# But their number can be told by the index of their ids.
@test "a database with zeroes for its first page of tokens" {
    a_store
    spoil "$(root_page token)" /dev/zero
    all_fail "$REAL_DB $MALFORMED" "$(commands | grep -v '^revoke --all --dry-run')"
}

@test "a database with garbage for its first page of tokens" {
    a_store
    spoil "$(root_page token)"
    all_fail "$REAL_DB $MALFORMED" "$(commands | grep -v '^revoke --all --dry-run')"
}

@test "a database with a bad page among its tokens" {
    a_store
    spoil "$(sql "SELECT max(pageno) FROM dbstat WHERE name = 'token' AND pagetype = 'leaf'")" /dev/zero
    all_fail "$REAL_DB $MALFORMED" "list
export
export $DIR/exported
purge
stats
create --uid 0 --function TAG"
    # Ids stand in an index as well, which is enough for a number.
    run_shortly list --count
    expect 0 10
}

@test "doctor says how badly a database is damaged" {
    a_store
    cp "$DB" "$DIR/sound"
    for page in "$(root_page token)" "$(root_page sqlite_autoindex_token_1)" 2; do
        cp "$DIR/sound" "$DB"
        spoil "$page" /dev/zero
        run_shortly doctor
        [ "$status" -eq 5 ]
        [ "$stderr" = "" ]
        [[ ${lines[0]} == "error: the database is damaged: "*[Pp]"age $page"* || $page -eq 2 ]] || {
            echo "page $page: $output"
            return 1
        }
        [[ $output != *"says how badly"* ]] # that would be itself
    done
    cp "$DIR/sound" "$DB"
    truncate -s 8192 "$DB"
    run_shortly doctor
    [ "$status" -eq 5 ]
    [[ ${lines[0]} == "error: "*"malformed"* ]]
    [[ $output != *"says how badly"* ]]
}

# What it does not need, doctor and the others leave alone: here the map of pages, which shrinking needs.
@test "tokens can be listed as long as they can be read" {
    a_store
    spoil 2 /dev/zero
    cp "$DB" "$DIR/before"
    run_shortly list --count
    expect 0 10
    run_shortly export "$DIR/exported"
    expect 0 "" "vemo-access-token: 10 tokens exported"
    [ "$(wc -l <"$DIR/exported")" -eq 11 ]
    run_shortly doctor
    [ "$status" -eq 5 ]
    [[ $output == "error: the database is damaged: "* ]]
    cmp "$DB" "$DIR/before"
}

# As the manual page tells it.
@test "what can be read of a damaged database can be saved" {
    a_store
    sql "WITH RECURSIVE n(i) AS (SELECT 10 UNION ALL SELECT i + 1 FROM n WHERE i < 99)
         INSERT INTO token SELECT i || substr(tid, 1, 127), bind_sid, uid, deadline, count, create_time,
         function || char(10), webapi_allow, extra FROM token, n WHERE tid = '$ID'"
    spoil "$(sql "SELECT max(pageno) FROM dbstat WHERE name = 'token' AND pagetype = 'leaf'")" /dev/zero
    run_shortly export
    [ "$status" -eq 4 ]
    mv "$VEMO_REDIRECT_DIR" "$VEMO_REDIRECT_DIR.old"
    tool init
    {
        sqlite3 "$VEMO_REDIRECT_DIR.old/vemo-access-token.db" .dump 2>/dev/null | grep -E "^(BEGIN|INSERT INTO token )"
        echo "COMMIT;"
    } | sqlite3 "$DB"
    run_shortly doctor
    [ "$status" -eq 0 ]
    [ "${lines[-1]}" = "no findings" ] # but notes
    run_shortly list --count
    [ "$output" -gt 80 ]
    [ "$output" -lt 100 ]
}

@test "an empty file has no table, and init makes it" {
    a_store
    : >"$DB"
    all_fail "$REAL_DB has no table of tokens; \"vemo-access-token doctor --repair\" makes it" \
        "$(some_commands | grep -v '^create')"
    run_shortly doctor
    [ "$status" -eq 5 ]
    [ "${lines[0]}" = "error: the database has no table of tokens" ]
    run_shortly init
    expect 0 "made the table of tokens"
    run_shortly list --count
    expect 0 0
}

@test "init changes nothing where all is there" {
    a_store
    cp "$DB" "$DIR/before"
    run_shortly init
    expect 0 "all was there already"
    cmp "$DB" "$DIR/before"
}

@test "a table that lacks a column" {
    a_store
    sql "ALTER TABLE token DROP COLUMN extra"
    all_fail "$REAL_DB failed: no such column: extra" "list
show $ID
check $ID Api get
grant $ID Api get
update $ID --uses 2
revoke $ID
export
create --uid 0 --function TAG"
    all_fail "$REAL_DB failed: table token has no column named extra" "import $DIR/other"
    doctor_finds "the table of tokens lacks columns: extra"
}

@test "what stands in the database's place is not a regular file" {
    a_store
    rm "$DB"
    local make finding
    while IFS='|' read -r make finding; do
        $make "$DB"
        all_fail "$REAL_DB is not a regular file" "$([ "$make" = mkfifo ] && commands || some_commands)"
        all_fail "$REAL_DB is not a regular file" init
        doctor_looks "$REAL_DB is $finding"
        rm -d "$DB"
    done <<'TABLE'
mkfifo|not a regular file
mkdir|not a regular file
ln -s /|a symbolic link
ln -s /dev/zero|a symbolic link
TABLE
}

@test "a link that leads nowhere is not taken for a missing database" {
    a_store
    rm "$DB"
    ln -s "$DIR/nowhere" "$DB"
    all_fail "$REAL_DB is a symbolic link to a file that is not there"
    all_fail "$REAL_DB is a symbolic link to a file that is not there" init
    [ ! -e "$DIR/nowhere" ]
    run_shortly doctor
    [ "$status" -eq 5 ]
    [ "${lines[0]}" = "error: $REAL_DB is a symbolic link" ]
    [[ $output != *init* ]]
}

@test "a link that leads to itself" {
    a_store
    ln -sf vemo-access-token.db "$DB"
    all_fail "$REAL_DB: Too many levels of symbolic links" "$(some_commands)"
    all_fail "$REAL_DB: Too many levels of symbolic links" init
}

@test "a directory that is none" {
    a_store
    mv "$VEMO_REDIRECT_DIR" "$DIR/away"
    echo "no directory" >"$VEMO_REDIRECT_DIR"
    all_fail "$REAL_DB: Not a directory" "$(some_commands)"
    all_fail "${REAL_DB%/*}: Not a directory" init
    run_shortly doctor
    [ "$status" -eq 5 ]
    [ "${lines[0]}" = "error: ${REAL_DB%/*} is not a directory" ]
}

@test "no database, and no directory" {
    a_store
    rm "$DB"
    all_fail "there is no database $REAL_DB; \"vemo-access-token init\" makes it" \
        "$(commands | grep -vE '^(create|import)')"
    doctor_looks "there is no database $REAL_DB" note
    rmdir "$VEMO_REDIRECT_DIR"
    all_fail "there is no directory ${REAL_DB%/*}; \"vemo-access-token init\" makes it"
    doctor_looks "there is no directory ${REAL_DB%/*}" note
    [ ! -e "$VEMO_REDIRECT_DIR" ]
}

@test "a database or a directory that may not be read or written" {
    [ "$(id -u)" -ne 0 ] || skip "root may read and write everything"
    a_store
    chmod 0000 "$DB"
    while read -r arguments; do
        # shellcheck disable=SC2086
        run_shortly $arguments
        expect 4 "" "vemo-access-token: $REAL_DB cannot be opened: Permission denied"
    done < <(commands; echo init)
    doctor_looks "$REAL_DB cannot be written to: Permission denied"
    chmod 0500 "$DB"
    all_fail "$REAL_DB cannot be written to (attempt to write a readonly database); \"vemo-access-token doctor\" says why" "grant $ID Api get
update $ID --uses 2
revoke $ID
revoke --all --yes
create --uid 0 --function TAG
import $DIR/other"
    chmod 0700 "$DB"
    chmod 0500 "$VEMO_REDIRECT_DIR"
    all_fail "$REAL_DB cannot be written to (attempt to write a readonly database); \"vemo-access-token doctor\" says why" "grant $ID Api get
update $ID --uses 2
revoke $ID
revoke --all --yes
create --uid 0 --function TAG
import $DIR/other"
    chmod 0000 "$VEMO_REDIRECT_DIR"
    doctor_looks "${REAL_DB%/*} cannot be written to: Permission denied"
    all_fail "$REAL_DB: Permission denied"
    chmod 0700 "$VEMO_REDIRECT_DIR"
}

@test "a NULL in a token" {
    a_store
    sql "UPDATE token SET extra = NULL WHERE tid = '$ID'"
    cp "$DB" "$DIR/before"
    all_fail "$REAL_DB $UNREADABLE" "list
list -o json
export
export $DIR/exported
show $ID
show ${ID:0:12}
check $ID Api get
grant $ID Api get
update $ID --uses 2
revoke $ID"
    run_shortly show "1$ID" --field count # another token
    expect 0 5
    run_shortly list --count
    expect 0 10
    run_shortly revoke --all --dry-run
    expect 0 "10 tokens would be revoked"
    doctor_looks "a NULL in 1 token (${ID:0:8})"
    cmp "$DB" "$DIR/before"
    run_shortly doctor --repair
    [ "$status" -eq 0 ]
    [ "$stderr" = "" ]
    [ "${lines[0]}" = "repaired: a NULL in 1 token (${ID:0:8})" ]
    run_shortly list --count
    expect 0 9
}

@test "a NULL for the owner is not root's" {
    a_token >"$DIR/id"
    sql "UPDATE token SET uid = NULL"
    run_shortly stats -o jsonl
    [[ $output == *'"users":[{"tokens":1,"uid":null,"user":""}]}' ]] || {
        echo "$output"
        return 1
    }
    run_shortly stats --no-header
    [ "${lines[-1]}" = "NULL    1" ]
}

@test "a word in the place of a number" {
    a_store
    sql "DELETE FROM token WHERE tid <> '$ID'"
    local field
    for field in uid deadline count create_time; do
        sql "UPDATE token SET uid = 0, deadline = 32503680000, count = 5, create_time = 1"
        sql "UPDATE token SET $field = 'some'"
        cp "$DB" "$DIR/before"
        run_shortly list --count
        expect 0 1
        run_shortly show "$ID" --field $field
        expect 0 0
        run_shortly stats
        [ "$status" -eq 0 ]
        run_shortly doctor
        [ "$status" -eq 5 ]
        [ "${lines[0]}" = "error: no whole number where there should be one in 1 token (${ID:0:8})" ]
        cmp "$DB" "$DIR/before"
        run_shortly revoke "$ID" --dry-run
        expect 0 "1 token would be revoked"
    done
}

# The purge compares in SQL, where a word lies behind all numbers. Programs grant such a token for ever.
@test "a word for a deadline never passes, as programs see it" {
    a_store
    sql "UPDATE token SET deadline = 'some'"
    run_shortly list --expired --count
    expect 0 0
    run_shortly purge --dry-run
    expect 0 "0 tokens would be purged"
    run_shortly check "$ID" Api get
    expect 0 allowed
    run_shortly grant "$ID" Api get
    expect 0 granted
}

@test "a number that is no user's" {
    a_store
    sql "DELETE FROM token WHERE tid <> '$ID'"
    local uid
    for uid in 4294967296 -4294967296 -1 9223372036854775807; do # the first two are 0 in 32 bits
        sql "UPDATE token SET uid = $uid, count = -1"
        run_shortly list --no-header --epoch
        [[ $output == "${ID:0:8}  $uid "* ]] || {
            echo "$uid: $output"
            return 1
        }
        run_shortly grant "$ID" Api get --print-user
        expect 4 "" "vemo-access-token: granted, but there is no user of the number $uid"
    done
}

@test "what a token opens is broken" {
    a_store
    sql "DELETE FROM token WHERE tid <> '$ID'"
    local allow reason whole
    while IFS='|' read -r allow reason; do
        sql "UPDATE token SET webapi_allow = '$allow'"
        cp "$DB" "$DIR/before"
        for arguments in list "show $ID"; do
            # shellcheck disable=SC2086
            run_shortly $arguments
            [ "$status" -eq 0 ] || {
                echo "$allow: $arguments: status $status, $stderr"
                return 1
            }
        done
        run_shortly check "$ID" Api get
        expect 1 "refused: $reason"
        run_shortly grant "$ID" Api get
        expect 1 "" "vemo-access-token: refused: $reason"
        cmp "$DB" "$DIR/before"
    done <<'TABLE'
|malformed token
{|API not listed
{"Other": {"method": [|API not listed
null|malformed token
7|malformed token
"Api"|malformed token
["Api"]|malformed token
{"Api": 7}|malformed token
{"Api": null}|malformed token
{"Api": []}|malformed token
{"Api": {}}|malformed token
{"Api": {"method": "get"}}|malformed token
{"Api": {"method": {"get": 1}}}|malformed token
{"Api": {"method": []}}|method not listed
{"Api": {"method": ["pu|method not listed
{"Api": {"method": [["get"]]}}|malformed token
{"Api": {"method": [{}]}}|malformed token
{"Api": {"method": [1, null, 1.5, true]}}|method not listed
TABLE
    # Deeper than is read.
    whole=$(printf '[%.0s' {1..2000})
    sql "UPDATE token SET webapi_allow = '{\"Api\": $whole', extra = '$whole'"
    run_shortly list
    [ "$status" -eq 0 ]
    run_shortly check "$ID" Api get
    [ "$status" -eq 1 ]
    run_shortly doctor
    [ "$status" -eq 5 ]
    [ "${lines[0]}" = "error: no JSON object where there should be one in 1 token (${ID:0:8})" ]
}

@test "data of a token that are no object" {
    a_store
    sql "DELETE FROM token WHERE tid <> '$ID'"
    for extra in '' null 7 '"x"' '[1, 2]' 'no JSON'; do
        sql "UPDATE token SET extra = '$extra'"
        cp "$DB" "$DIR/before"
        for arguments in list "show $ID"; do
            # shellcheck disable=SC2086
            run_shortly $arguments
            [ "$status" -eq 0 ]
        done
        run_shortly export
        [ "$status" -eq $([[ $extra == ?(no JSON) ]] && echo 4 || echo 0) ] # an import would make a null of it
        # A grant would have to save it.
        run_shortly check "$ID" Api get
        expect 1 "refused: malformed token"
        run_shortly grant "$ID" Api get
        expect 1 "" "vemo-access-token: refused: malformed token"
        run_shortly doctor
        [ "$status" -eq 5 ]
        [ "${lines[0]}" = "error: no JSON object where there should be one in 1 token (${ID:0:8})" ]
        cmp "$DB" "$DIR/before"
    done
    run_shortly update "$ID" --extra '{}'
    expect 0 "1 token updated"
    run_shortly grant "$ID" Api get
    expect 0 granted
}

@test "garbage in the journals hides no tokens" {
    a_store
    head -c 100 /dev/urandom >"$DB-journal"
    run_shortly list --count
    expect 0 10
    rm -f "$DB-journal"
    head -c 100 /dev/urandom >"$DB-wal"
    run_shortly list --count
    expect 0 10
    tool tune --wal >/dev/null
    head -c 100 /dev/urandom >"$DB-wal"
    run_shortly list --count
    expect 0 10
}
