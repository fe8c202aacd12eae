#!/usr/bin/env bats
# doctor

load common

DIRECTORY=/usr/vemo/etc/private/session

REPLACE='stop the programs, move the directory away, run "vemo-access-token init" and import a backup'
SAVE_AND_REPLACE='stop the programs, save the tokens with "vemo-access-token export", move the directory away, run "vemo-access-token init" and import them'

# [deadline=SQL] [count=SQL] [extra=SQL] ... a_row NAME: a token, written behind the tool's back; its id is the
# name with zeroes behind it
a_row()
{
    [ -e "$DB" ] || tool init >/dev/null
    sql "INSERT INTO token VALUES (substr('$1$ZEROS$ZEROS', 1, 127), '', ${uid-0}, ${deadline-9999999999},
         ${count-1}, ${create_time-0}, 'VPN', ${webapi_allow-"'{\"Api\":{\"method\":[\"get\"]}}'"}, ${extra-"'{}'"})"
}

# expect_left NAME...: the tokens that are there still, in order
expect_left()
{
    [ "$(sql "SELECT rtrim(tid, '0') FROM token ORDER BY tid" | xargs)" = "$*" ]
}

# expect_finding SEVERITY WHAT MEANING REMEDY: doctor finds that, and nothing else
expect_finding()
{
    run_tool doctor
    expect 5 "$1: $2
    meaning: $3
    remedy: $4"
}

# expect_note WHAT MEANING REMEDY: doctor tells that, and finds nothing
expect_note()
{
    run_tool doctor
    expect 0 "note: $1
    meaning: $2
    remedy: $3
no findings"
}

# expect_repair WHAT MEANING: doctor repairs that, and then there is nothing left
expect_repair()
{
    run_tool doctor --repair
    expect 0 "repaired: $1
    meaning: $2
no findings"
    run_tool doctor
    expect 0 "no findings"
}

# expect_no_repair SEVERITY WHAT MEANING REMEDY: doctor finds that, and leaves it to the administrator
expect_no_repair()
{
    expect_finding "$@"
    local found=$output
    run_tool doctor --repair
    expect 5 "$found"
}

# expect_sound: doctor finds nothing any more
expect_sound()
{
    run_tool doctor
    expect 0 "no findings"
}

# never_hang: from now on the tool has some seconds for each command
never_hang()
{
    printf '#!/bin/sh\nexec timeout 20 "%s" "$@"\n' "$TOOL" >"$DIR/shortly"
    chmod +x "$DIR/shortly"
    TOOL=$DIR/shortly
}

@test "a sound store gives no findings, and stays as it is" {
    a_token --ttl 30d --allow Example.File:get --extra '{"a":Infinity}'
    deadline="strftime('%s', 'now') - 3000" a_row expired-just-now
    count=-1 create_time="strftime('%s', 'now')" a_row unlimited
    cp "$DB" "$DIR/before"
    run_tool doctor
    expect 0 "no findings"
    run_tool doctor --repair
    expect 0 "no findings"
    run_tool doctor -o json
    expect 0 "[]"
    run_tool doctor -o jsonl
    expect 0 ""
    cmp "$DB" "$DIR/before"
}

@test "what is worth knowing of a sound store is told in numbers, and is no finding" {
    local now="strftime('%s', 'now')" i
    a_row plain
    for i in 1 2 3; do
        deadline="$now + 86000 * $i" a_row "soon$i" # of them, one within a day
    done
    deadline="$now + 7 * 86400 + 60" a_row later
    uid=4000000000 a_row ownerless
    webapi_allow="'{}'" a_row closed
    count=-1 create_time="$now - 365 * 86400 - 60" a_row old
    count=-2 create_time="$now - 365 * 86400 + 60" a_row younger
    run_tool doctor
    expect 0 "note: expiring within a day: 1 token
    meaning: who uses them is refused then
    remedy: \"vemo-access-token list --expiring 1d\" tells which; update --ttl gives them time
note: expiring within a week: 3 tokens
    meaning: who uses them is refused then
    remedy: \"vemo-access-token list --expiring 7d\" tells which; update --ttl gives them time
note: without an owner who is a user of this machine: 1 token
    meaning: they are granted on behalf of a number that another user can get
    remedy: \"vemo-access-token list --no-owner\" tells which; revoke --no-owner deletes them
note: opening nothing: 1 token
    meaning: every call with them is refused
    remedy: update --add-allow lets them open calls; or revoke them
note: of unlimited uses, and older than a year: 1 token
    meaning: whoever has got hold of one in all that time can use it
    remedy: revoke them, and create others
no findings"
    local notes=$output
    run_tool doctor --repair
    expect 0 "$notes"
    run_tool doctor -o jsonl
    [ "$status" -eq 0 ]
    [ "${lines[3]}" = '{"finding":"opening nothing: 1 token","meaning":"every call with them is refused","remedy":"update --add-allow lets them open calls; or revoke them","repaired":false,"severity":"note"}' ]
    # An owner whom nobody could look up may be there.
    VEMO_TEST_LOOKUP=5 run_tool doctor
    [[ $output != *"without an owner"* ]]
    # What is wrong comes first, and alone.
    sql "UPDATE token SET function = '' WHERE tid LIKE 'plain%'"
    expect_finding warning "an empty purpose in 1 token (plain000)" "no call deletes such a token by its purpose" \
        "revoke them, and create others"
}

@test "not being root is a finding, and the only one" {
    local user=()
    if [ "$(id -u)" -eq 0 ]; then
        user=(setpriv --reuid=65534 --regid=65534 --clear-groups)
        "${user[@]}" test -x "$TOOL" || skip "another user cannot run the tool here"
    fi
    run --separate-stderr "${user[@]}" env -u VEMO_REDIRECT_DIR "$TOOL" doctor --repair
    local uid=65534
    [ "$(id -u)" -eq 0 ] || uid=$(id -u)
    expect 5 "error: not run as root: the effective uid is $uid
    meaning: the database belongs to root and cannot be looked at
    remedy: run doctor as root"
}

@test "a missing directory, and then the file, are made" {
    local meaning="there is no store yet: no token can be created, and every call fails"
    expect_note "there is no directory $DIRECTORY" "$meaning" "vemo-access-token init"
    [ ! -e "$VEMO_REDIRECT_DIR" ]
    run_tool doctor --repair
    expect 0 "repaired: there is no directory $DIRECTORY
    meaning: $meaning
repaired: there is no database $REAL_DB
    meaning: there are no tokens; the first call that needs it makes it
no findings"
    [ "$(stat -c %a "$VEMO_REDIRECT_DIR" "$DB" | xargs)" = "700 700" ]
    [ "$(sql "PRAGMA auto_vacuum; SELECT count(*) FROM token" | xargs)" = "1 0" ]
}

@test "a missing file is made, with its table" {
    mkdir -m 0700 "$VEMO_REDIRECT_DIR"
    expect_note "there is no database $REAL_DB" "there are no tokens; the first call that needs it makes it" \
        "vemo-access-token init"
    [ ! -e "$DB" ]
    # With a journal there was one.
    install -m 0600 /dev/null "$DB-journal"
    expect_finding error "there is no database $REAL_DB" "there are no tokens; the first call that needs it makes it" \
        "vemo-access-token init"
    rm "$DB-journal"
    expect_repair "there is no database $REAL_DB" "there are no tokens; the first call that needs it makes it"
    [ "$(stat -c %a "$DB")" = 700 ]
    [ "$(sql "PRAGMA auto_vacuum; SELECT count(*) FROM token" | xargs)" = "1 0" ]
}

@test "a file without the table gets it" {
    mkdir -m 0700 "$VEMO_REDIRECT_DIR"
    install -m 0700 /dev/null "$DB"
    local meaning="every call fails: the table is made together with the file, and never later"
    expect_finding error "the database has no table of tokens" "$meaning" "vemo-access-token init"
    [ ! -s "$DB" ]
    expect_repair "the database has no table of tokens" "$meaning"
    [ "$(sql "PRAGMA auto_vacuum; SELECT count(*) FROM token" | xargs)" = "1 0" ]
}

@test "modes that let others in are tightened" {
    a_row aaaaaaaa
    local meaning="others than root can use it, and ids are credentials" mode
    for mode in 0755 0701 0710; do
        chmod "$mode" "$VEMO_REDIRECT_DIR"
        expect_finding error "$DIRECTORY has mode $mode" "$meaning" "chmod 0700 $DIRECTORY"
    done
    expect_repair "$DIRECTORY has mode 0710" "$meaning"
    for mode in 0644 0604 0720; do
        chmod "$mode" "$DB"
        expect_finding error "$REAL_DB has mode $mode" "$meaning" "chmod 0700 $REAL_DB"
    done
    expect_repair "$REAL_DB has mode 0720" "$meaning"
    [ "$(stat -c %a "$VEMO_REDIRECT_DIR" "$DB" | xargs)" = "700 700" ]
    chmod 0600 "$DB"
    run_tool doctor
    expect 0 "no findings"
}

@test "owners other than root are replaced" {
    [ "$(id -u)" -eq 0 ] || skip "only root can give files away"
    a_row aaaaaaaa
    local meaning="its owner can read and change every token, and may have done so"
    chown 4000000000 "$DB"
    expect_finding error "$REAL_DB belongs to uid 4000000000" "$meaning" "chown root $REAL_DB, and look at the tokens"
    expect_repair "$REAL_DB belongs to uid 4000000000" "$meaning"
    chown 4000000000:1 "$VEMO_REDIRECT_DIR"
    expect_finding error "$DIRECTORY belongs to uid 4000000000" "$meaning" "chown root $DIRECTORY, and look at the tokens"
    expect_repair "$DIRECTORY belongs to uid 4000000000" "$meaning"
    [ "$(stat -c '%u %g' "$VEMO_REDIRECT_DIR")" = "0 1" ]
}

@test "a symbolic link in place of the directory is left to the administrator, and what it leads to is not opened" {
    deadline=0 a_row aaaaaaaa
    mv "$VEMO_REDIRECT_DIR" "$DIR/elsewhere"
    ln -s elsewhere "$VEMO_REDIRECT_DIR"
    expect_no_repair error "$DIRECTORY is a symbolic link" "the tokens stand elsewhere, or nowhere" \
        "find out who made it; move the database to a directory of that name"
    rm -r "$DIR/elsewhere"
    run_tool doctor
    expect 5 "error: $DIRECTORY is a symbolic link
    meaning: the tokens stand elsewhere, or nowhere
    remedy: find out who made it; move the database to a directory of that name
note: there is no database $REAL_DB
    meaning: there are no tokens; the first call that needs it makes it
    remedy: vemo-access-token init"
}

@test "another thing in place of the directory is left to the administrator" {
    echo text >"$VEMO_REDIRECT_DIR"
    expect_no_repair error "$DIRECTORY is not a directory" "the tokens stand elsewhere, or nowhere" \
        "find out who made it; move the database to a directory of that name"
    [ "$(cat "$VEMO_REDIRECT_DIR")" = text ]
}

@test "a symbolic link in place of the file is left to the administrator" {
    a_row aaaaaaaa
    mv "$DB" "$DIR/elsewhere"
    ln -s ../elsewhere "$DB"
    expect_no_repair error "$REAL_DB is a symbolic link" "programs work on another file than this one, or on none" \
        "find out who made it; move the database to this name"
    rm "$DIR/elsewhere"
    expect_finding error "$REAL_DB is a symbolic link" "programs work on another file than this one, or on none" \
        "find out who made it; move the database to this name"
    [ ! -e "$DIR/elsewhere" ]
}

@test "another thing in place of the file is left to the administrator" {
    mkdir -m 0700 "$VEMO_REDIRECT_DIR"
    mkdir "$DB"
    expect_no_repair error "$REAL_DB is not a regular file" "programs work on another file than this one, or on none" \
        "find out who made it; move the database to this name"
}

@test "what stands in the place of a journal and is none is left to the administrator, and not opened" {
    a_row aaaaaaaa
    never_hang
    local suffix make kind
    for suffix in journal wal shm; do
        while IFS='|' read -r make kind; do
            $make "$DB-$suffix"
            expect_no_repair error "$REAL_DB-$suffix is $kind" \
                "the database takes it for a journal of its own: calls can fail, or never end" \
                "find out who made it; remove it while no program runs"
            rm -d "$DB-$suffix"
        done <<'TABLE'
mkfifo|not a regular file
mkdir|not a regular file
ln -s nowhere|a symbolic link
TABLE
    done
    # Nor is a missing database made then.
    mv "$DB" "$DIR/away"
    mkfifo "$DB-journal"
    run_tool doctor --repair
    [ "$status" -eq 5 ]
    [ "$stderr" = "" ]
    [ "${lines[0]}" = "error: $REAL_DB-journal is not a regular file" ]
    [ "${lines[3]}" = "error: there is no database $REAL_DB" ]
    rm "$DB-journal"
    mv "$DIR/away" "$DB"
    expect_sound
}

@test "journals are as private as the database" {
    a_row aaaaaaaa
    sql "PRAGMA journal_mode = PERSIST; UPDATE token SET count = 2"
    chmod 0640 "$DB-journal"
    expect_repair "$REAL_DB-journal has mode 0640" "others than root can use it, and ids are credentials"
    [ "$(stat -c %a "$DB-journal")" = 700 ]
}

@test "attributes that forbid changes are left to the administrator" {
    a_row aaaaaaaa
    chattr +a "$DB" 2>/dev/null || skip "no right to set attributes, or a file system without them"
    local meaning="no token can be created, changed or granted" wrong=""
    expect_finding error "$REAL_DB is append-only" "$meaning" "chattr -a $REAL_DB" || wrong=1
    chattr -a "$DB"
    chattr +i "$DB" "$VEMO_REDIRECT_DIR"
    run_tool doctor --repair
    chattr -i "$DB" "$VEMO_REDIRECT_DIR"
    expect 5 "error: $DIRECTORY is immutable
    meaning: $meaning
    remedy: chattr -i $DIRECTORY
error: $REAL_DB is immutable
    meaning: $meaning
    remedy: chattr -i $REAL_DB"
    [ ! "$wrong" ]
    run_tool doctor
    expect 0 "no findings"
}

@test "a file that cannot be written to is left to the administrator" {
    in_namespace '"$1" init >/dev/null && chmod 0755 "$3" && chmod 0750 "$2" && mount --bind "$2" "$2" &&
        mount -o remount,bind,ro "$2" && "$1" doctor --repair' "$TOOL" "$REAL_DB" "$DIRECTORY"
    expect 5 "repaired: $DIRECTORY has mode 0755
    meaning: others than root can use it, and ids are credentials
error: $REAL_DB has mode 0750
    meaning: others than root can use it, and ids are credentials
    remedy: chmod 0700 $REAL_DB
error: $REAL_DB cannot be written to: Read-only file system
    meaning: no token can be created, changed or granted
    remedy: make the file system writable, or the file" "vemo-access-token: cannot repair: $REAL_DB: Read-only file system"
}

@test "hard links are left to the administrator" {
    a_row aaaaaaaa
    ln "$DB" "$DIR/second"
    ln "$DB" "$DIR/third"
    expect_no_repair warning "$REAL_DB has 3 hard links" \
        "the tokens can be reached under another name, and a journal of that name is not found" \
        "find -samefile tells the other names; remove those"
    # What stands under the other names is made private by nobody.
    chmod 0640 "$DB"
    run_tool doctor --repair
    [ "$status" -eq 5 ]
    [ "$stderr" = "" ]
    [ "$(stat -c %a "$DB")" = 640 ]
}

@test "directories above that others can change are left to the administrator" {
    # And nothing below is opened: neither is a table missed, nor made.
    in_namespace 'mkdir /usr/vemo && chmod 0777 /usr/vemo && "$1" init >/dev/null && sqlite3 "$2" "DROP TABLE token" &&
        chmod 0755 "${2%/*}" && ! "$1" doctor --repair && mv /usr/vemo /usr/elsewhere && ln -s elsewhere /usr/vemo && "$1" doctor' "$TOOL" "$REAL_DB"
    expect 5 "warning: /usr/vemo belongs to uid 0 and has mode 0777
    meaning: others than root can replace the private directory below it
    remedy: chown root /usr/vemo && chmod go-w /usr/vemo
error: $DIRECTORY has mode 0755
    meaning: others than root can use it, and ids are credentials
    remedy: chmod 0700 $DIRECTORY
error: /usr/vemo is a symbolic link
    meaning: the tokens stand elsewhere, or nowhere
    remedy: find out who made it; move the directory to a directory of that name"
}

@test "a repair that fails is told" {
    in_namespace '"$1" init >/dev/null && chmod 0755 "$2" && mount -o remount,ro /usr && "$1" doctor --repair' \
        "$TOOL" "$DIRECTORY"
    expect 5 "error: $DIRECTORY has mode 0755
    meaning: others than root can use it, and ids are credentials
    remedy: chmod 0700 $DIRECTORY
error: $DIRECTORY cannot be written to: Read-only file system
    meaning: no token can be created, changed or granted
    remedy: make the file system writable, or the directory" "vemo-access-token: cannot repair: $DIRECTORY: Read-only file system"
}

@test "a repair that does not help is told, and not called one" {
    a_row aaaaaaaa
    echo '#include <errno.h>
        int chmod() { return 0; } int fchmod() { return 0; } int fchmodat() { return 0; }
        int unlinkat() { errno = EPERM; return -1; }' |
        cc -shared -fPIC -w -fno-builtin -x c -o "$DIR/no-chmod.so" - || skip "no C compiler"
    chmod 0750 "$DB"
    LD_PRELOAD=$DIR/no-chmod.so run_tool doctor --repair
    expect 5 "error: $REAL_DB has mode 0750
    meaning: others than root can use it, and ids are credentials
    remedy: chmod 0700 $REAL_DB" "vemo-access-token: the repair did not help: $REAL_DB has mode 0750"
    # Where others can still put a journal beside it, no database is made, and nobody knows whose the journal is.
    rm "$DB"
    chmod 0770 "$VEMO_REDIRECT_DIR"
    install -m 0640 /dev/null "$DB-journal"
    LD_PRELOAD=$DIR/no-chmod.so run_tool doctor --repair
    expect 5 "error: $DIRECTORY has mode 0770
    meaning: others than root can use it, and ids are credentials
    remedy: chmod 0700 $DIRECTORY
error: $REAL_DB-journal has mode 0640
    meaning: others than root can use it, and ids are credentials
    remedy: chmod 0700 $REAL_DB-journal
error: there is no database $REAL_DB
    meaning: there are no tokens; the first call that needs it makes it
    remedy: vemo-access-token init" "vemo-access-token: the repair did not help: $DIRECTORY has mode 0770"
    [ ! -e "$DB" ]
    rm "$DB-journal"
    chmod 0700 "$VEMO_REDIRECT_DIR"
    tool init >/dev/null
    install -m 0600 /dev/null "$VEMO_REDIRECT_DIR/backup.part"
    LD_PRELOAD=$DIR/no-chmod.so run_tool doctor --repair
    [ "$status" -eq 5 ]
    [ "$stderr" = "vemo-access-token: cannot repair: backup.part: Operation not permitted" ]
}

@test "what others change in the middle of a repair is not followed" {
    local between reason
    while IFS='|' read -r between reason; do
        rm -rf "$DIR/"s*
        mkdir -m 0700 "$VEMO_REDIRECT_DIR"
        tool init >/dev/null
        chmod 0640 "$DB"
        install -m 0640 /dev/null "$DB-journal" # which is repaired first
        VEMO_TEST_CALLS="fchmod|cd $DIR && $between" run_tool doctor --repair
        [ "$status" -eq 5 ]
        [ "$stderr" = "vemo-access-token: cannot repair: $reason" ]
        [ "$(stat -L -c %a "$DB")" = 640 ]
    done <<TABLE
ln $DB second|$REAL_DB has several hard links
mv $DB second && ln -s $DIR/second $DB|$REAL_DB is a symbolic link; name the place that it leads to
chmod 0750 session|$DIRECTORY is not root's alone
mv session second && ln -s second session|$DIRECTORY is a symbolic link; name the place that it leads to
TABLE
    # Remains of an export that another one takes, or that are gone.
    while IFS='|' read -r between reason; do
        rm -rf "$DIR/"s*
        mkdir -m 0750 "$VEMO_REDIRECT_DIR"
        tool init >/dev/null
        install -m 0600 /dev/null "$VEMO_REDIRECT_DIR/backup.part"
        VEMO_TEST_CALLS="fchmod|$between $VEMO_REDIRECT_DIR/backup.part" run_tool doctor --repair
        [ "$stderr" = "$reason" ]
    done <<TABLE
chmod 0640|vemo-access-token: cannot repair: backup.part: File exists
rm|
TABLE
}

@test "who can change a directory above in the middle of a repair gets nothing from root" {
    in_namespace '"$1" init >/dev/null && chmod 0640 "$2" && install -m 0640 /dev/null "$2-journal" &&
        VEMO_TEST_CALLS="fchmod|chmod 0777 /usr/vemo/etc" "$1" doctor --repair || stat -c %a "$2"' "$TOOL" "$REAL_DB"
    [ "${lines[-1]}" = 640 ]
    [ "$stderr" = "vemo-access-token: cannot repair: others than root can change /usr/vemo/etc" ]
}

@test "a place that cannot be looked at is a finding" {
    tool init
    local call error
    while IFS='|' read -r call error; do
        VEMO_TEST_CALLS="$call|$error" run_tool doctor
        expect 5 "error: $DIRECTORY: Too many open files
    meaning: programs fail in the same way
    remedy: mend the cause; or $REPLACE"
    done <<TABLE
openat session|24
open $DIRECTORY|24
fstatvfs|24
TABLE
    chmod 0750 "$VEMO_REDIRECT_DIR"
    for call in "openat ." fchown fchmod; do
        VEMO_TEST_CALLS="$call|24" run_tool doctor --repair
        [ "$status" -eq 5 ]
        [ "$stderr" = "vemo-access-token: cannot repair: $DIRECTORY: Too many open files" ]
    done
    rm -r "$VEMO_REDIRECT_DIR"
    ln -s session "$VEMO_REDIRECT_DIR"
    run_tool doctor
    expect 5 "error: $DIRECTORY is a symbolic link
    meaning: the tokens stand elsewhere, or nowhere
    remedy: find out who made it; move the database to a directory of that name
error: $DIRECTORY: Too many levels of symbolic links
    meaning: programs fail in the same way
    remedy: mend the cause; or $REPLACE"
}

@test "a file that is no database is a finding, and left" {
    mkdir -m 0700 "$VEMO_REDIRECT_DIR"
    echo "no database, but a text that is long enough to be told from an empty one" >"$DB"
    chmod 0600 "$DB"
    cp "$DB" "$DIR/text"
    expect_no_repair error "$REAL_DB is not a token database, or is damaged (file is not a database)" \
        "programs fail in the same way" "mend the cause; or $REPLACE"
    cmp "$DB" "$DIR/text"
}

@test "an index that does not fit its table is damage" {
    deadline=1 a_row aaaaaaaa # which is not looked at
    a_row bbbbbbbb
    # Newer versions of the shell protect the schema.
    sqlite3 -cmd '.dbconfig defensive off' "$DB" "
        CREATE INDEX i ON token (deadline); PRAGMA writable_schema = ON;
        UPDATE sqlite_schema SET sql = 'CREATE INDEX i ON token (uid)' WHERE name = 'i'" >"$DIR/defensive"
    expect_no_repair error "the database is damaged: row 1 missing from index i; row 2 missing from index i" "tokens may be lost or wrong" \
        "$SAVE_AND_REPLACE; where export fails, import a backup or what sqlite3 can still read: see vemo-access-token(8)"
    run_tool export
    [ "$status" -eq 0 ]
    # Where the check itself fails, it gives no report.
    sqlite3 -cmd '.dbconfig defensive off' "$DB" "
        PRAGMA writable_schema = ON;
        UPDATE sqlite_schema SET sql = 'CREATE INDEX i ON token (bind_sid COLLATE x)' WHERE name = 'i'" >"$DIR/defensive"
    run_tool doctor
    [ "${lines[0]}" = "error: the database is damaged: no such collation sequence: x" ]
}

@test "a page that is not one is damage, told on one line and without sending the reader in a circle" {
    tool init
    sql "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 100)
         INSERT INTO token SELECT printf('%0127d', i), '', 0, 9999999999, 1, 0, 'VPN', '{}', '{}' FROM n"
    # The roots of the table and of its index stand on pages 3 and 4; a leaf comes last.
    local pages page
    pages=$(sql "PRAGMA page_count")
    cp "$DB" "$DIR/sound"
    for page in 3 4 "$pages"; do
        cp "$DIR/sound" "$DB"
        dd if=/dev/zero of="$DB" bs=4096 seek=$((page - 1)) count=1 conv=notrunc status=none
        run_tool doctor
        [ "$status" -eq 5 ]
        [[ ${lines[0]} == "error: the database is damaged: "*"age $page: btreeInitPage() returns error code 11"* ]]
        [[ ${lines[0]} != *'\x0a'* ]]
        [ "${lines[1]}" = "    meaning: tokens may be lost or wrong" ]
        [[ $output != *"vemo-access-token doctor"* ]]
    done
}

# replace_database BACKUP, save_and_replace: what the remedy of that name tells; the backup holds two tokens
replace_database()
{
    mv "$VEMO_REDIRECT_DIR" "$DIR/away"
    run_tool init
    [ "$status" -eq 0 ]
    run_tool import "$1"
    expect 0 "2 tokens imported"
    rm -r "$DIR/away"
}

save_and_replace()
{
    tool export "$DIR/saved" 2>/dev/null
    replace_database "$DIR/saved"
}

# remake OLD NEW: another table of tokens in the place of the library's, with one for the other in its statement
remake()
{
    local made
    made=$(sql "SELECT sql FROM sqlite_schema WHERE name = 'token'")
    sql "ALTER TABLE token RENAME TO library; ${made/"$1"/"$2"};
         INSERT INTO token (tid, bind_sid, uid, deadline, count, create_time, function, webapi_allow, extra)
         SELECT * FROM library; DROP TABLE library"
}

@test "a table that is not the library's is left to the administrator, and can be replaced" {
    a_row aaaaaaaa
    a_row bbbbbbbb
    local old new differences
    while IFS='|' read -r old new differences; do
        echo "$new"
        remake "$old" "$new"
        expect_no_repair error "the table of tokens is not the one that the library makes: it $differences" \
            "calls can fail, spend no use, report what did not happen, or take one token for another" "$SAVE_AND_REPLACE"
        save_and_replace
    done <<'TABLE'
tid TEXT primary key NOT NULL|tid TEXT|has "tid TEXT", and lacks "tid TEXT primary key NOT NULL"
tid TEXT|tid TEXT COLLATE NOCASE|has "tid TEXT COLLATE NOCASE primary key NOT NULL", and lacks "tid TEXT primary key NOT NULL"
primary key|primary key ON CONFLICT IGNORE|has "tid TEXT primary key ON CONFLICT IGNORE NOT NULL", and lacks "tid TEXT primary key NOT NULL"
uid INTEGER|uid NUMERIC CHECK (uid IN (0, 1))|has "uid NUMERIC CHECK (uid IN (0, 1))", and lacks "uid INTEGER"
extra TEXT|extra TEXT, note TEXT NOT NULL DEFAULT 'a'|has "note TEXT NOT NULL DEFAULT 'a'"
extra TEXT|extra TEXT, upper TEXT AS (upper(tid)), UNIQUE (function, tid)|has "UNIQUE (function, tid)", "upper TEXT AS (upper(tid))"
extra TEXT)|extra TEXT) WITHOUT ROWID|has "WITHOUT ROWID"
extra TEXT)|extra TEXT) STRICT|has "STRICT"
TABLE
    expect_sound
    sql .dump >"$DIR/dump"
    install -m 0700 /dev/null "$DB"
    sqlite3 -cmd "PRAGMA encoding = 'UTF-16le'" "$DB" <"$DIR/dump"
    expect_no_repair error "the database is in UTF-16le, and not in UTF-8" \
        "bytes that are not UTF-8 are not kept: such an id is never found again" "$SAVE_AND_REPLACE"
    save_and_replace
    expect_sound
}

@test "the library's table in other words is none of another kind" {
    a_row aaaaaaaa
    remake "tid TEXT primary key NOT NULL,bind_sid TEXT," "bind_sid	text , tid TEXT
        PRIMARY KEY not null, "
    sql "ALTER TABLE token RENAME TO other; ALTER TABLE other RENAME TO TOKEN"
    expect_sound
    run_tool init
    expect 0 "all was there already"
}

@test "tokens of the same id are found where the table allows them" {
    a_row aaaaaaaa
    remake "primary key NOT NULL" ""
    sql "INSERT INTO token SELECT * FROM token"
    a_row bbbbbbbb
    a_row cccccccc
    run_tool doctor --repair
    [ "$status" -eq 5 ]
    [[ ${lines[0]} == "error: the table of tokens is not the one "* ]]
    [ "${lines[3]}" = "error: several tokens of the same id: 1 token (aaaaaaaa)" ]
    [ "${lines[4]}" = "    meaning: a grant reads one of them and saves another: their uses never end" ]
    [ "${lines[5]}" = "    remedy: revoke them by their whole ids" ]
    [ "${#lines[@]}" -eq 6 ]
    tool revoke "aaaaaaaa$ZEROS"
    save_and_replace
    expect_sound
}

@test "a view or a virtual table in the place of the table is left to the administrator, and can be replaced" {
    a_row aaaaaaaa
    a_row bbbbbbbb
    tool export "$DIR/backup"
    local meaning="programs read what it makes up, and their changes fail or go elsewhere"
    sql "ALTER TABLE token RENAME TO other; CREATE VIEW Token AS SELECT * FROM other"
    expect_no_repair error "a view stands in the place of the table of tokens" "$meaning" "$REPLACE"
    replace_database "$DIR/backup"
    expect_sound
    sql "DROP TABLE token; CREATE VIRTUAL TABLE token USING fts4(tid, bind_sid, uid, deadline, count, create_time,
         function, webapi_allow, extra)"
    expect_no_repair error "a virtual table stands in the place of the table of tokens" "$meaning" "$REPLACE"
}

@test "triggers and indexes that take part in changes are left to the administrator, and can be dropped" {
    a_row aaaaaaaa
    local kind trigger index meaning statement names dropped remedy
    trigger="a trigger on the table of tokens|it runs in every change that it is for: calls can report what did not happen, change other tokens, fail, or never end"
    index="an index on the table of tokens that does not only find them|changes can fail, and a grant can delete other tokens: those that a unique index takes for the same"
    while IFS='|' read -r kind statement names dropped; do
        echo "$statement"
        sql "$statement"
        IFS='|' read -r kind meaning <<<"${!kind}"
        remedy="sqlite3 $REAL_DB '$dropped'"
        expect_no_repair error "$kind: $names" "$meaning" "sqlite3 $REAL_DB '.schema token' shows what it does; $remedy"
        eval "${remedy//"$REAL_DB"/"$DB"}"
        expect_sound
    done <<'TABLE'
trigger|CREATE TRIGGER t AFTER INSERT ON token BEGIN DELETE FROM token; END|"t"|DROP TRIGGER "t";
trigger|CREATE TRIGGER b UPDATE ON token BEGIN SELECT 1; END; CREATE TRIGGER a DELETE ON TOKEN BEGIN SELECT 1; END|"a", "b"|DROP TRIGGER "a"; DROP TRIGGER "b";
trigger|CREATE TRIGGER "it's ""$(false)""" UPDATE ON token BEGIN SELECT 1; END|"it's "$(false)""|DROP TRIGGER "it'\''s ""$(false)""";
index|CREATE UNIQUE INDEX i ON token (function, tid)|"i"|DROP INDEX "i";
index|CREATE INDEX i ON token (uid) WHERE count = 1|"i"|DROP INDEX "i";
index|CREATE INDEX i ON token (uid, json(extra))|"i"|DROP INDEX "i";
TABLE
    sql "CREATE TABLE own (a UNIQUE); CREATE TRIGGER of_own UPDATE ON own BEGIN DELETE FROM token; END;
         CREATE INDEX plain ON token (function, uid DESC)"
    expect_sound
}

@test "tokens are not repaired while a trigger would take part" {
    a_row aaaaaaaa
    extra=NULL a_row bbbbbbbb
    sql "CREATE TRIGGER t BEFORE DELETE ON token BEGIN
         SELECT max(i) FROM (WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n) SELECT i FROM n); END"
    never_hang
    run_tool doctor --repair
    [ "$status" -eq 5 ]
    [ "${lines[0]}" = 'error: a trigger on the table of tokens: "t"' ]
    [ "${lines[3]}" = "error: a NULL in 1 token (bbbbbbbb)" ]
    [ "${lines[5]}" = "    remedy: when the table is mended: delete them: vemo-access-token doctor --repair" ]
    sql "DROP TRIGGER t"
    run_tool doctor --repair
    [ "$status" -eq 0 ]
}

@test "a table that lacks columns is left to the administrator" {
    a_row aaaaaaaa
    sql "ALTER TABLE token DROP COLUMN extra; ALTER TABLE token RENAME uid TO owner"
    expect_no_repair error "the table of tokens lacks columns: uid, extra" \
        "every call that reads or writes a token fails" "$REPLACE"
}

@test "tokens with a NULL are deleted" {
    a_row kept
    uid=NULL a_row aaaaaaaa-long
    count=NULL a_row bbbbbbbb
    local meaning="such a token cannot be read or granted, and every listing that meets it fails"
    expect_finding error "a NULL in 2 tokens (aaaaaaaa, bbbbbbbb)" "$meaning" \
        "delete them: vemo-access-token doctor --repair"
    expect_left aaaaaaaa-long bbbbbbbb kept
    expect_repair "a NULL in 2 tokens (aaaaaaaa, bbbbbbbb)" "$meaning"
    expect_left kept
    local column
    for column in bind_sid deadline count create_time extra; do
        a_row cccccccc
        sql "UPDATE token SET $column = NULL WHERE tid LIKE 'cccccccc%'"
        expect_repair "a NULL in 1 token (cccccccc)" "$meaning"
        expect_left kept
    done
}

@test "a finding names five tokens, and that there are more" {
    local i
    for i in 1 2 3 4 5 6; do
        deadline=1 a_row "${i}aaaaaaaaaaa"
    done
    expect_finding warning "expired for more than an hour: 6 tokens (1aaaaaaa, 2aaaaaaa, 3aaaaaaa, 4aaaaaaa, 5aaaaaaa, ...)" \
        "no program has called since, or its purges fail" "vemo-access-token purge"
    sql "DELETE FROM token WHERE tid LIKE '6%'"
    expect_finding warning "expired for more than an hour: 5 tokens (1aaaaaaa, 2aaaaaaa, 3aaaaaaa, 4aaaaaaa, 5aaaaaaa)" \
        "no program has called since, or its purges fail" "vemo-access-token purge"
}

@test "what is not a whole number is left to the administrator" {
    a_row kept
    deadline="'soon'" a_row aaaaaaaa
    count=1.5 a_row bbbbbbbb
    uid="x'3030'" a_row cccccccc
    create_time="'CURRENT_TIMESTAMP'" a_row dddddddd
    count="'7'" a_row becomes-a-number
    expect_no_repair error "no whole number where there should be one in 4 tokens (aaaaaaaa, bbbbbbbb, cccccccc, dddddddd)" \
        "it is read as another number, 0 for a word: deadline or uses are not what they seem" \
        "revoke them, or update what is wrong"
    run_tool revoke aaaaaaaa bbbbbbbb cccccccc dddddddd
    expect 0 "4 tokens revoked"
    run_tool doctor
    expect 0 "no findings"
}

@test "fields that the library does not write are left to the administrator, and tokens with them can go" {
    a_row kept
    local value severity what meaning remedy command
    while IFS='|' read -r value severity what meaning remedy command; do
        echo "$value"
        a_row aaaaaaaa
        sql "UPDATE token SET $value WHERE tid LIKE 'aaaaaaaa%'"
        expect_no_repair "$severity" "$what" "$meaning" "$remedy"
        eval "$command"
        expect_sound
        sql "DELETE FROM token WHERE tid LIKE 'aaaaaaaa%'"
    done <<TABLE
uid = 4294967296|error|a uid that is no user's in 1 token (aaaaaaaa)|programs take the lower 32 bits of it for the owner: 4294967296 is root's|revoke them|tool revoke aaaaaaaa
uid = 4294967295|error|a uid that is no user's in 1 token (aaaaaaaa)|programs take the lower 32 bits of it for the owner: 4294967296 is root's|revoke them|tool revoke aaaaaaaa
uid = -1|error|a uid that is no user's in 1 token (aaaaaaaa)|programs take the lower 32 bits of it for the owner: 4294967296 is root's|revoke them|tool revoke aaaaaaaa
tid = substr(tid, 1, 126)|warning|an id of fewer than 127 bytes in 1 token (aaaaaaaa)|it was not made by the library, and may be guessed|revoke them, and create others|tool revoke aaaaaaaa
bind_sid = CAST(x'6100' AS TEXT)|error|a NUL byte in a text of 1 token (aaaaaaaa)|programs see what stands before it, and no look-up by that field finds such a token|revoke them|tool revoke aaaaaaaa
function = ''|warning|an empty purpose in 1 token (aaaaaaaa)|no call deletes such a token by its purpose|revoke them, and create others|tool revoke aaaaaaaa
webapi_allow = '{"A":{"method":["get",["put"]]}}'|error|lists of methods that hold an array or an object in 1 token (aaaaaaaa)|the library throws an exception where it should grant or refuse, which ends a program that does not catch it|revoke them, or update --allow|tool update aaaaaaaa --allow A:get,put
webapi_allow = '{"A":{"method":[{}]}}'|error|lists of methods that hold an array or an object in 1 token (aaaaaaaa)|the library throws an exception where it should grant or refuse, which ends a program that does not catch it|revoke them, or update --allow|tool update aaaaaaaa --allow A
webapi_allow = '{"A":{"method":[]},"B":7}'|warning|an API without a list of methods in 1 token (aaaaaaaa)|it is open to calls that name no method, and to no others|revoke them, or update --allow|tool update aaaaaaaa --allow A
webapi_allow = '{"B":{"method":{"get":1}}}'|warning|an API without a list of methods in 1 token (aaaaaaaa)|it is open to calls that name no method, and to no others|revoke them, or update --allow|tool revoke aaaaaaaa
TABLE
}

@test "an id that no call can name is left to the administrator, and its token can be deleted" {
    a_row kept
    local condition="typeof(tid) = 'text' AND (tid = '' OR instr(tid, char(0)))" value
    local remedy="sqlite3 $REAL_DB \"DELETE FROM token WHERE $condition\""
    for value in "''" "char(0)" "'aaaaaaaa' || char(0) || '$ZEROS'"; do
        a_row aaaaaaaa
        sql "UPDATE token SET tid = $value WHERE tid LIKE 'aaaaaaaa%'"
        run_tool doctor --repair
        [ "$status" -eq 5 ]
        [[ ${lines[0]} == "error: an id that is empty or holds a NUL byte in 1 token ("* ]]
        [ "${lines[1]}" = "    meaning: no call can name such a token: it is listed, but cannot be granted or revoked" ]
        [ "${lines[2]}" = "    remedy: $remedy" ]
        eval "${remedy//"$REAL_DB"/"$DB"}"
        expect_left kept
        expect_sound
    done
}

@test "JSON so deep that reading it takes a large stack is left to the administrator" {
    local deep
    deep=$(printf '{"a":%.0s' {1..100})7$(printf '}%.0s' {1..100})
    extra="'$deep'" a_row as-deep-as-may-be
    extra="'{\"a\":\"$(printf '[%.0s' {1..200})\\\\\\\"{\"}'" a_row brackets-in-a-text
    expect_sound
    extra="'{\"b\":$deep}'" a_row aaaaaaaa
    webapi_allow="'{\"A\":{\"method\":[],\"x\":$deep}}'" a_row bbbbbbbb
    expect_no_repair warning "JSON of more than 100 levels in 2 tokens (aaaaaaaa, bbbbbbbb)" \
        "a program that reads such a token in a thread of a small stack crashes: 64 KiB have room for that many levels, 128 KiB for twice as many" \
        "revoke them, or update --allow and --extra"
    tool update aaaaaaaa --extra '{}'
    tool update bbbbbbbb --allow A
    expect_sound
}

@test "what is not a JSON object is left to the administrator" {
    a_row kept
    extra="'{\"a\":Infinity}'" a_row kept-too # JSON for the library
    webapi_allow="'[]'" a_row aaaaaaaa-long
    extra="'text'" a_row bbbbbbbb
    extra="''" a_row cccccccc
    webapi_allow="7" a_row dddddddd
    extra="'{\"a\":1} {}'" a_row eeeeeeee
    extra="'{\"a\":1} // a comment'" a_row ffffffff
    webapi_allow="'{\"A\":{\"method\":[\"g'" a_row gggggggg
    extra="'{\"a\":\"\ud800\"}'" a_row hhhhhhhh # JSON for SQLite
    local names="aaaaaaaa, bbbbbbbb, cccccccc, dddddddd, eeeeeeee, ..."
    expect_no_repair error "no JSON object where there should be one in 8 tokens ($names)" \
        "such a token opens nothing, or only what stands before the fault, or cannot be saved with a use less" \
        "revoke them, or update --allow and --extra"
    local name
    for name in aaaaaaaa dddddddd gggggggg; do
        tool update "$name" --allow Api:get
    done
    for name in bbbbbbbb cccccccc eeeeeeee ffffffff; do
        tool update "$name" --extra '{}'
    done
    tool revoke hhhhhhhh
    run_tool doctor
    expect 0 "no findings"
}

@test "a NULL in place of an object, or beside one that is none, is one finding" {
    extra=NULL a_row aaaaaaaa
    webapi_allow="'[]'" extra=NULL a_row bbbbbbbb
    webapi_allow="'[]'" uid=NULL a_row cccccccc
    local meaning="such a token cannot be read or granted, and every listing that meets it fails"
    expect_finding error "a NULL in 3 tokens (aaaaaaaa, bbbbbbbb, cccccccc)" "$meaning" \
        "delete them: vemo-access-token doctor --repair"
    expect_repair "a NULL in 3 tokens (aaaaaaaa, bbbbbbbb, cccccccc)" "$meaning"
    expect_left
}

@test "of many tokens without an object, five are named" {
    local i
    for i in 1 2 3 4 5 6 7; do
        extra="'[]'" a_row "${i}aaaaaaa"
    done
    run_tool doctor
    [ "$status" -eq 5 ]
    [[ ${lines[0]} == "error: no JSON object where there should be one in "*"5aaaaaaa, ...)" ]]
    [[ ${lines[0]} != *6aaaaaaa* ]]
}

@test "texts are made of bytes in place of a text, which no look-up finds" {
    local what="bytes where there should be a text in 1 token (aaaaaaaa)" column
    local meaning="no look-up by that field finds such a token"
    for column in tid bind_sid function; do
        a_row aaaaaaaa
        a_row bbbbbbbb
        sql "UPDATE token SET $column = $column || 'x' WHERE tid LIKE 'a%'"
        sql "SELECT * FROM token" >"$DIR/texts"
        sql "UPDATE token SET $column = CAST($column AS BLOB) WHERE tid LIKE 'a%'"
        expect_finding error "$what" "$meaning" "make texts of them: vemo-access-token doctor --repair"
        expect_repair "$what" "$meaning"
        sql "SELECT * FROM token" | diff "$DIR/texts" -
        [ "$(sql "SELECT DISTINCT typeof($column) FROM token")" = text ]
        sql "DELETE FROM token"
    done
}

@test "bytes are left as they are where the text is another token's id" {
    a_row aaaaaaaa
    sql "INSERT INTO token SELECT CAST(tid AS BLOB), 's', uid, deadline, count, create_time, function, webapi_allow, extra
         FROM token"
    sql ".dump" >"$DIR/before"
    run_tool doctor --repair
    [ "$status" -eq 5 ]
    [ "$stderr" = "vemo-access-token: cannot repair: $REAL_DB failed: UNIQUE constraint failed: token.tid" ]
    sql ".dump" | diff "$DIR/before" -
}

@test "deadlines that the purge will take are left to the administrator" {
    deadline=-1 a_row aaaaaaaa
    deadline=0 a_row bbbbbbbb
    expect_no_repair warning "a deadline of 0 or less in 2 tokens (aaaaaaaa, bbbbbbbb)" \
        "there is no value for \"never\": the next purge deletes them" "update --ttl gives them time"
    expect_left aaaaaaaa bbbbbbbb
}

@test "a backlog of expired tokens is purged, but not what was meant to last for ever" {
    a_row kept
    deadline=-1 a_row meant-to-last
    deadline=1 a_row aaaaaaaa
    deadline="strftime('%s', 'now') - 4000" a_row bbbbbbbb
    deadline="strftime('%s', 'now') - 3000" a_row expired-just-now
    run_tool doctor
    expect 5 'warning: a deadline of 0 or less in 1 token (meant-to)
    meaning: there is no value for "never": the next purge deletes them
    remedy: update --ttl gives them time
warning: expired for more than an hour: 2 tokens (aaaaaaaa, bbbbbbbb)
    meaning: no program has called since, or its purges fail
    remedy: vemo-access-token purge'
    run_tool doctor --repair
    expect 5 'repaired: expired for more than an hour: 2 tokens (aaaaaaaa, bbbbbbbb)
    meaning: no program has called since, or its purges fail
warning: a deadline of 0 or less in 1 token (meant-to)
    meaning: there is no value for "never": the next purge deletes them
    remedy: update --ttl gives them time'
    expect_left kept meant-to-last
}

@test "a large table without an index on the deadline is a finding" {
    tool init
    sql "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 10001)
         INSERT INTO token SELECT printf('%0127d', i), '', 0, 9999999999, 1, 0, 'VPN', '{\"A\":{\"method\":[]}}', '{}' FROM n"
    expect_no_repair warning "10001 tokens, and no index on their deadline" \
        "every call reads the whole table for expired tokens" "vemo-access-token tune"
    sql "CREATE INDEX of_another_column ON token (function, deadline)"
    run_tool doctor
    [ "$status" -eq 5 ]
    sql "DROP INDEX of_another_column; CREATE INDEX own ON token (deadline)"
    run_tool doctor
    expect 0 "no findings"
    sql "DROP INDEX own; DELETE FROM token WHERE rowid = 1"
    run_tool doctor
    expect 0 "no findings"
}

# a_half_change: the store as a program leaves it that stops in the middle of a change, with a journal
a_half_change()
{
    tool init
    sql "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 40)
         INSERT INTO token SELECT printf('%0127d', i), '', 0, 9999999999, 1, 0, 'VPN', '{\"A\":{\"method\":[]}}',
         json_object('data', hex(zeroblob(1000))) FROM n"
    # What does not fit into the cache is written before the end of the change.
    sqlite3 "$DB" >/dev/null <<SQL
PRAGMA cache_size = 1;
BEGIN;
UPDATE token SET function = 'half', extra = json_object('data', hex(randomblob(1000)));
.shell cp "$DB" "$DIR/half"; cp "$DB-journal" "$DIR/half-journal"
ROLLBACK;
SQL
    cp "$DIR/half" "$DB"
    cp "$DIR/half-journal" "$DB-journal"
    # What was written of the change is there indeed.
    grep -q half "$DB"
    [ -s "$DB-journal" ]
}

@test "a journal that was left behind is a finding, and undone by looking" {
    a_half_change
    touch -d "1 hour ago" "$DB-journal"
    local meaning="a program or the machine stopped in the middle of a change"
    expect_finding warning "$REAL_DB-journal was left behind" "$meaning" \
        "none needed: reading the database has just undone the half change"
    [ "$(ls -A "$VEMO_REDIRECT_DIR")" = vemo-access-token.db ]
    [ "$(sql "SELECT function, count(*) FROM token GROUP BY 1; PRAGMA integrity_check" | xargs)" = "VPN|40 ok" ]
    run_tool doctor
    expect 0 "no findings"

    cp "$DIR/half" "$DB"
    cp "$DIR/half-journal" "$DB-journal"
    touch -d "1 hour ago" "$DB-journal"
    expect_repair "$REAL_DB-journal was left behind" "$meaning"
    [ "$(sql "SELECT function, count(*) FROM token GROUP BY 1; PRAGMA integrity_check" | xargs)" = "VPN|40 ok" ]
}

@test "a journal of just now can be a living program's, and is no finding" {
    a_half_change
    touch -d "1 hour" "$DB-journal"
    run_tool doctor
    expect 0 "no findings"
    [ "$(sql "SELECT function, count(*) FROM token GROUP BY 1")" = "VPN|40" ]
}

@test "an old journal that is empty, or that its program has ended, holds no half change" {
    a_row aaaaaaaa
    install -m 0700 /dev/null "$DB-journal"
    touch -d "1 hour ago" "$DB-journal"
    run_tool doctor
    expect 0 "no findings"
    sql "PRAGMA journal_mode = PERSIST; UPDATE token SET count = 2"
    touch -d "1 hour ago" "$DB-journal"
    [ -s "$DB-journal" ]
    run_tool doctor
    expect 0 "no findings"
}

@test "a write-ahead journal that belongs to the database is no finding" {
    a_row aaaaaaaa
    # A program that still has the database open, and one that stopped.
    sqlite3 "$DB" >/dev/null <<SQL
PRAGMA journal_mode = WAL;
UPDATE token SET function = 'changed';
.shell cp "$DB" "$DIR/copy"; cp "$DB-wal" "$DIR/copy-wal"
.shell "$TOOL" doctor >"$DIR/doctor"
SQL
    [ "$(cat "$DIR/doctor")" = "no findings" ]
    cp "$DIR/copy" "$DB"
    cp "$DIR/copy-wal" "$DB-wal"
    touch -d "1 hour ago" "$DB-wal"
    run_tool doctor
    expect 0 "no findings"
    [ "$(sql "SELECT function FROM token")" = changed ]
}

@test "a write-ahead journal beside a database that has none is left to the administrator" {
    a_row aaaaaaaa
    install -m 0700 /dev/stdin "$DB-wal" <<<journal
    printf '\002' | dd of="$DB" bs=1 seek=18 conv=notrunc status=none # which says how it is written to, not read
    expect_no_repair warning "$REAL_DB-wal does not belong to the database" \
        "the database was copied or replaced without it, and may lack changes" \
        "if the database is complete, remove it while no program runs"
    [ "$(cat "$DB-wal")" = journal ]
}

@test "another store's write-ahead journal is not mixed into the database by looking" {
    a_row aaaaaaaa
    cp "$DB" "$DIR/backup"
    sqlite3 "$DB" >/dev/null <<SQL
PRAGMA journal_mode = WAL;
UPDATE token SET function = 'changed';
.shell cp "$DB-wal" "$DIR/copy-wal"
SQL
    cp "$DIR/backup" "$DB"
    cp "$DIR/copy-wal" "$DB-wal"
    run_tool doctor
    [ "$status" -eq 5 ]
    cmp "$DB" "$DIR/backup"
}

@test "findings come as JSON, and say what was repaired" {
    deadline=1 a_row aaaaaaaa
    deadline=0 a_row bbbbbbbb
    local never='{"finding":"a deadline of 0 or less in 1 token (bbbbbbbb)","meaning":"there is no value for \"never\": the next purge deletes them","remedy":"update --ttl gives them time","repaired":false,"severity":"warning"}'
    local old='{"finding":"expired for more than an hour: 1 token (aaaaaaaa)","meaning":"no program has called since, or its purges fail","remedy":"vemo-access-token purge","repaired":false,"severity":"warning"}'
    run_tool doctor -o jsonl
    expect 5 "$never
$old"
    chmod 0750 "$DB"
    run_tool doctor -o json
    [ "$status" -eq 5 ]
    [ "$stderr" = "" ]
    /usr/bin/python3 -c 'import json, sys
findings = json.loads(sys.argv[1])
assert findings[0] == {"severity": "error", "finding": sys.argv[4] + " has mode 0750", "repaired": False,
                       "meaning": "others than root can use it, and ids are credentials",
                       "remedy": "chmod 0700 " + sys.argv[4]}
assert findings[1:] == [json.loads(sys.argv[2]), json.loads(sys.argv[3])]' "$output" "$never" "$old" "$REAL_DB"
    chmod 0700 "$DB"
    run_tool doctor --repair --output jsonl
    expect 5 "${old/false/true}
$never"
    sql "DELETE FROM token"
    deadline=1 a_row aaaaaaaa
    run_tool doctor --repair -o jsonl
    expect 0 "${old/false/true}"
}

@test "control characters of a finding are made visible" {
    deadline=1 a_row $'a\e[31mb'
    run_tool doctor
    [ "${lines[0]}" = 'warning: expired for more than an hour: 1 token (a\x1b[31mb0)' ]
}

@test "doctor colours its findings on a terminal, but not with NO_COLOR" {
    deadline=1 a_row aaaaaaaa
    chmod 0750 "$DB"
    local on_terminal='
import pexpect, sys
child = pexpect.spawn(sys.argv[1], sys.argv[2:], timeout=30)
child.expect(pexpect.EOF)
child.wait()
sys.stdout.buffer.write(child.before.replace(b"\r\n", b"\n"))'
    run /usr/bin/python3 -c "$on_terminal" "$TOOL" doctor
    [ "${lines[0]}" = $'\e[31merror\e[0m: '"$REAL_DB has mode 0750" ]
    [ "${lines[3]}" = $'\e[33mwarning\e[0m: expired for more than an hour: 1 token (aaaaaaaa)' ]
    NO_COLOR=1 run /usr/bin/python3 -c "$on_terminal" "$TOOL" doctor
    [ "${lines[0]}" = "error: $REAL_DB has mode 0750" ]
    run /usr/bin/python3 -c "$on_terminal" "$TOOL" doctor --repair
    [ "${lines[0]}" = $'\e[32mrepaired\e[0m: '"$REAL_DB has mode 0750" ]
}

@test "bad arguments of doctor end in a sentence that names them" {
    a_row aaaaaaaa
    local arguments sentence
    while IFS='|' read -r arguments sentence; do
        run_tool doctor $arguments
        expect 2 "" "vemo-access-token: $sentence"
    done <<'TABLE'
-o xml|--output: "xml" is not a form: table, json or jsonl
--fix|unknown option "--fix"
aaaaaaaa|unexpected argument "aaaaaaaa"
TABLE
}

@test "doctor's result that cannot be written is no success" {
    a_row aaaaaaaa
    run --separate-stderr bash -c '"$0" doctor >/dev/full' "$TOOL"
    expect 4 "" "vemo-access-token: cannot write the result: No space left on device"
}

@test "what others may have put there is not opened" {
    a_row aaaaaaaa
    sql "UPDATE token SET deadline = 0"
    chmod 0720 "$VEMO_REDIRECT_DIR"
    expect_finding error "$DIRECTORY has mode 0720" "others than root can use it, and ids are credentials" "chmod 0700 $DIRECTORY"
    chmod 0700 "$VEMO_REDIRECT_DIR"
    # The end of a journal that names another file.
    (umask 077 && printf 'x\331\325\005\371\040\241\143\327' >"$DB-journal")
    expect_no_repair error "$REAL_DB-journal is one of several that belong together" \
        "the next program to open the database changes other files, too" \
        "find out who made it; remove it while no program runs"
    : >"$DB-journal"
    ln "$DB-journal" "$DIR/second"
    expect_no_repair error "$REAL_DB-journal has several hard links" \
        "the next program to open the database changes other files, too" \
        "find out who made it; remove it while no program runs"
    if [ "$(id -u)" -eq 0 ]; then
        chown 4000000000 "$DB-journal"
        expect_no_repair error "$REAL_DB-journal belongs to uid 4000000000" \
            "the next program to open the database may take its contents for changes" \
            "find out who made it; remove it while no program runs"
    fi
    rm "$DB-journal"
    run_tool doctor
    [ "${lines[0]}" = "warning: a deadline of 0 or less in 1 token (aaaaaaaa)" ]
}

@test "what only looks sound is found" {
    a_row aaaaaaaa
    cp "$DB" "$DIR/sound"
    printf '\003' | dd of="$DB" bs=1 seek=18 conv=notrunc 2>/dev/null
    run_tool doctor
    [ "${lines[0]}" = "error: the database says that only a later SQLite can write to it" ]
    cp "$DIR/sound" "$DB"
    local made
    made=$(sql "SELECT sql FROM sqlite_schema WHERE name = 'token'")
    local comment
    for comment in '/*(*/' $'--(\n'; do
        sql "DROP TABLE token; CREATE TABLE token $comment (${made#*(}"
        run_tool doctor
        [[ ${lines[0]} == "error: the table of tokens is not the one that the library makes: it has a comment, and lacks "* ]]
    done
}

@test "what an export into the private directory left behind is removed, but not while it is written" {
    a_row aaaaaaaa
    install -m 0600 /dev/null "$VEMO_REDIRECT_DIR/backup.part"
    run flock "$VEMO_REDIRECT_DIR/backup.part" "$TOOL" doctor
    [ "$output" = "no findings" ]
    touch "$VEMO_REDIRECT_DIR/x"
    expect_finding warning "$DIRECTORY/backup.part was left behind" \
        "an export was cut off; the file can hold whole ids" "remove it"
    chmod 0640 "$DB"
    VEMO_TEST_SYNC=directory run_tool doctor --repair
    [ "$status" -eq 5 ]
    local undone="vemo-access-token: cannot repair: $DIRECTORY: Input/output error; the change was made, but a power cut can undo it"
    [ "$stderr" = "$undone
$undone" ]
    install -m 0600 /dev/null "$VEMO_REDIRECT_DIR/backup.part"
    expect_repair "$DIRECTORY/backup.part was left behind" "an export was cut off; the file can hold whole ids"
    [ ! -e "$VEMO_REDIRECT_DIR/backup.part" ]
    # However many there are.
    (umask 077 && touch "$VEMO_REDIRECT_DIR/"{1..40}.part)
    run --separate-stderr bash -c 'ulimit -n 32 && "$0" doctor' "$TOOL"
    [ "${#lines[@]}" -eq 120 ]
}

@test "what is left of a file system is enough for a change and for another file, or is not" {
    tool init
    local room
    for room in "16 4096 0 0" "65536 1 2 1"; do
        VEMO_TEST_ROOM=$room run_tool doctor
        expect 0 "no findings"
    done
    VEMO_TEST_ROOM="65535 1 2 1" run_tool doctor
    [ "${lines[0]}" = "error: the file system of $DIRECTORY has no room for a change" ]
    VEMO_TEST_ROOM="16 4096 1 0" run_tool doctor
    [ "${lines[0]}" = "error: the file system of $DIRECTORY has no room for another file" ]
}
