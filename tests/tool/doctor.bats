#!/usr/bin/env bats
# doctor: what it finds, what it repairs, and what it leaves to the administrator

load common

REPLACE='stop the programs, move the directory away, run "vemo-access-token init" and import a backup'
SAVE_AND_REPLACE='stop the programs, save the tokens with "vemo-access-token export", move the directory away, run "vemo-access-token init" and import them'
DAMAGED="error: the database is damaged"
DAMAGE_HELP="tokens may be lost or wrong|$SAVE_AND_REPLACE; where export fails, import a backup or what sqlite3 can still read: see vemo-access-token(8)"
NOT_PRIVATE="others than root can use it, and ids are credentials"
NO_CHANGE="no token can be created, changed or granted"
ELSEWHERE="the tokens stand elsewhere, or nowhere|find out who made it; move the database to a directory of that name"
NO_TOKENS="there are no tokens; the first call that needs it makes it"
ALL_RIGHT="no findings"

# found STATUS FINDINGS [SENTENCE]: doctor has ended with that status and printed these findings, each of them here on one
# line "SEVERITY: WHAT|MEANING|REMEDY", and the sentence, if any
found() {
    output=${output//$'\n    meaning: '/|}
    output=${output//$'\n    remedy: '/|}
    expect "$1" "$2" "${3:+vemo-access-token: $3}"
}

# finds STATUS FINDINGS [ARGUMENTS...]: doctor does so, and says $SENTENCE, if that is set
finds() {
    run_tool doctor "${@:3}"
    found "$1" "$2" "${SENTENCE-}"
}

expect_sound() {
    gives "$ALL_RIGHT" doctor
}

# fresh: a store of two tokens and a backup of them, and nothing else in $DIR
fresh() {
    cd "$DIR"
    rm -rf ./*
    if [ ! -e "$DIR.fresh" ]; then
        rows <<<$'aaaaaaaa\nbbbbbbbb'
        tool export backup 2>/dev/null
        cp -rp . "$DIR.fresh"
    fi
    cp -rp "$DIR.fresh/." .
}

# each_is left|mended: each line of standard input is "CHANGE|SEVERITY: WHAT|MEANING|REMEDY". After the change of a
# fresh store, doctor finds that and no more. --repair mends it; or it leaves all as it is, and the remedy helps, where
# that is commands.
each_is() {
    local change finding remedy before
    while IFS='|' read -r change finding; do
        echo "$change"
        fresh
        eval "$change"
        before=$(find "$DIR" -printf '%P %i %m %T@ %l\n')
        finds 5 "$finding"
        if [ "$1" = mended ]; then
            finding=${finding#*: }
            finds 0 "repaired: ${finding%|*}"$'\n'"$ALL_RIGHT" --repair
        else
            finds 5 "$finding" --repair
            [ "$(find "$DIR" -printf '%P %i %m %T@ %l\n')" = "$before" ]
            remedy=${finding##*|}
            case $remedy in
                "$SAVE_AND_REPLACE") replace_database saved ;;
                "$REPLACE") replace_database backup ;;
                *"sqlite3 $REAL_DB"*) eval "sqlite3 $DB${remedy##*"sqlite3 $REAL_DB"}" ;;
                *) continue ;;
            esac
        fi
        expect_sound
    done
}

# replace_database BACKUP: as the remedies say; without a backup of that name, one is made now
replace_database() {
    [ -e "$1" ] || tool export "$DIR/$1" 2>/dev/null
    mv "$VEMO_REDIRECT_DIR" away
    tool init
    gives "2 tokens imported" import "$1"
}

# remake OLD NEW: another table of tokens in the place of the library's, with one for the other in its statement
remake() {
    local made
    made=$(sql "SELECT sql FROM sqlite_schema WHERE name = 'token'")
    sql "ALTER TABLE token RENAME TO library; ${made/"$1"/"$2"};
         INSERT INTO token (tid, bind_sid, uid, deadline, count, create_time, function, webapi_allow, extra)
         SELECT * FROM library; DROP TABLE library"
}

@test "a sound store gives no findings, and stays as it is" {
    rows <<END
lasting|extra = '{"a":Infinity}', create_time = strftime('%s', 'now')
expired-just-now|deadline = strftime('%s', 'now') - 3000
unlimited|count = -1, create_time = strftime('%s', 'now')
deepest|extra = '$(printf '{"a":%.0s' {1..100})7$(printf '}%.0s' {1..100})'
brackets-in-a-text|extra = '{"a":"$(printf '[%.0s' {1..200})\\\\\\"{"}'
END
    cp "$DB" "$DIR/before"
    gives "$ALL_RIGHT" doctor
    gives "$ALL_RIGHT" doctor --repair
    gives "[]" doctor -o json
    gives "" doctor -o jsonl
    cmp "$DB" "$DIR/before"
}

@test "notes about a sound store are numbers, and no findings" {
    now="strftime('%s', 'now')"
    rows <<END
plain
soon1|deadline = $now + 86000
soon2|deadline = $now + 86000 * 2
soon3|deadline = $now + 86000 * 3
later|deadline = $now + 7 * 86400 + 60
ownerless|uid = 4000000000
closed|webapi_allow = '{}'
old|count = -1, create_time = $now - 365 * 86400 - 60
younger|count = -2, create_time = $now - 365 * 86400 + 60
END
    notes='note: expiring within a day: 1 token|who uses them is refused then|"vemo-access-token list --expiring 1d" tells which; update --ttl gives them time
note: expiring within a week: 3 tokens|who uses them is refused then|"vemo-access-token list --expiring 7d" tells which; update --ttl gives them time
note: without an owner who is a user of this machine: 1 token|they are granted on behalf of a number that another user can get|"vemo-access-token list --no-owner" tells which; revoke --no-owner deletes them
note: opening nothing: 1 token|every call with them is refused|update --add-allow lets them open calls; or revoke them
note: of unlimited uses, and older than a year: 1 token|whoever has got hold of one in all that time can use it|revoke them, and create others
no findings'
    finds 0 "$notes"
    finds 0 "$notes" --repair
    run_tool doctor -o jsonl
    [ "$status ${lines[3]}" = '0 {"finding":"opening nothing: 1 token","meaning":"every call with them is refused","remedy":"update --add-allow lets them open calls; or revoke them","repaired":false,"severity":"note"}' ]
    # An owner who could not be looked up may exist.
    VEMO_TEST_LOOKUP=5 run_tool doctor
    [[ $output != *"without an owner"* ]]
    # A finding comes without notes.
    sql "UPDATE token SET function = '' WHERE tid LIKE 'plain%'"
    finds 5 "warning: an empty purpose in 1 token (plain000)|no call deletes such a token by its purpose|revoke them, and create others"
}

# The place.

@test "parts of the store that are missing are made" {
    no_store="there is no directory $REAL_DIRECTORY|there is no store yet: no token can be created, and every call fails"
    no_file="there is no database $REAL_DB|$NO_TOKENS"
    no_table="the database has no table of tokens|every call fails: the table is made together with the file, and never later"
    finds 0 "note: $no_store|vemo-access-token init"$'\n'"$ALL_RIGHT"
    [ ! -e "$VEMO_REDIRECT_DIR" ]
    finds 0 "repaired: $no_store"$'\n'"repaired: $no_file"$'\n'"$ALL_RIGHT" --repair
    expect_made

    rm "$DB"
    finds 0 "note: $no_file|vemo-access-token init"$'\n'"$ALL_RIGHT"
    [ ! -e "$DB" ]
    # A journal without a database shows that there was one.
    install -m 0600 /dev/null "$DB-journal"
    finds 5 "error: $no_file|vemo-access-token init"
    rm "$DB-journal"
    finds 0 "repaired: $no_file"$'\n'"$ALL_RIGHT" --repair
    expect_made

    : >"$DB"
    finds 5 "error: $no_table|vemo-access-token init"
    [ ! -s "$DB" ]
    finds 0 "repaired: $no_table"$'\n'"$ALL_RIGHT" --repair
    expect_made
}

@test "modes that let others in are tightened" {
    each_is mended <<TABLE
chmod 0755 session|error: $REAL_DIRECTORY has mode 0755|$NOT_PRIVATE|chmod 0700 $REAL_DIRECTORY
chmod 0701 session|error: $REAL_DIRECTORY has mode 0701|$NOT_PRIVATE|chmod 0700 $REAL_DIRECTORY
chmod 0710 session|error: $REAL_DIRECTORY has mode 0710|$NOT_PRIVATE|chmod 0700 $REAL_DIRECTORY
chmod 0644 $DB|error: $REAL_DB has mode 0644|$NOT_PRIVATE|chmod 0700 $REAL_DB
chmod 0604 $DB|error: $REAL_DB has mode 0604|$NOT_PRIVATE|chmod 0700 $REAL_DB
chmod 0720 $DB|error: $REAL_DB has mode 0720|$NOT_PRIVATE|chmod 0700 $REAL_DB
install -m 0640 /dev/null $DB-journal|error: $REAL_DB-journal has mode 0640|$NOT_PRIVATE|chmod 0700 $REAL_DB-journal
TABLE
    [ "$(stat -c %a "$VEMO_REDIRECT_DIR" "$DB" "$DB-journal" | xargs)" = "700 700 700" ]
    chmod 0600 "$DB"
    expect_sound
}

@test "owners other than root are replaced" {
    [ "$(id -u)" -eq 0 ] || skip "only root can give files away"
    meaning="its owner can read and change every token, and may have done so"
    each_is mended <<TABLE
chown 4000000000 $DB|error: $REAL_DB belongs to uid 4000000000|$meaning|chown root $REAL_DB, and look at the tokens
chown 4000000000:1 session|error: $REAL_DIRECTORY belongs to uid 4000000000|$meaning|chown root $REAL_DIRECTORY, and look at the tokens
TABLE
    [ "$(stat -c '%u %g' session)" = "0 1" ]
}

@test "anything else in place of the directory, the file or a journal is left to the administrator, and not opened" {
    file="programs work on another file than this one, or on none|find out who made it; move the database to this name"
    hide='sql "UPDATE token SET deadline = 0"' # which would be a finding
    remove="find out who made it; remove it while no program runs"
    journal="the database takes it for a journal of its own: calls can fail, or never end|$remove"
    others="the next program to open the database changes other files, too|$remove"
    {
        cat <<TABLE
$hide; mv session other; ln -s other session|error: $REAL_DIRECTORY is a symbolic link|$ELSEWHERE
rm -r session; echo text >session|error: $REAL_DIRECTORY is not a directory|$ELSEWHERE
$hide; mv $DB other; ln -s ../other $DB|error: $REAL_DB is a symbolic link|$file
mv $DB other; ln -s ../nowhere $DB|error: $REAL_DB is a symbolic link|$file
rm $DB; mkdir $DB|error: $REAL_DB is not a regular file|$file
ln $DB second; ln $DB third|warning: $REAL_DB has 3 hard links|the tokens can be reached under another name, and a journal of that name is not found|find -samefile tells the other names; remove those
$hide; (umask 077; printf 'x\331\325\005\371\040\241\143\327' >$DB-journal)|error: $REAL_DB-journal is one of several that belong together|$others
$hide; install -m 0600 /dev/null $DB-journal; ln $DB-journal second|error: $REAL_DB-journal has several hard links|$others
TABLE
        [ "$(id -u)" -ne 0 ] || echo "$hide; install -m 0600 -o 4000000000 /dev/null $DB-journal|error: $REAL_DB-journal belongs to uid 4000000000|the next program to open the database may take its contents for changes|$remove"
        for suffix in journal wal shm; do
            echo "$hide; mkfifo $DB-$suffix|error: $REAL_DB-$suffix is not a regular file|$journal"
            echo "$hide; mkdir $DB-$suffix|error: $REAL_DB-$suffix is not a regular file|$journal"
            echo "$hide; ln -s nowhere $DB-$suffix|error: $REAL_DB-$suffix is a symbolic link|$journal"
        done
    } >"$DIR.table"
    each_is left <"$DIR.table"

    # Of what is not private, nothing is opened either, and what has other names is not made private.
    fresh
    sql "UPDATE token SET deadline = 0"
    chmod 0720 "$VEMO_REDIRECT_DIR"
    finds 5 "error: $REAL_DIRECTORY has mode 0720|$NOT_PRIVATE|chmod 0700 $REAL_DIRECTORY"
    chmod 0700 "$VEMO_REDIRECT_DIR"
    expect_first "warning: a deadline of 0 or less in 2 tokens (aaaaaaaa, bbbbbbbb)"
    ln "$DB" second
    chmod 0640 "$DB"
    run_tool doctor --repair
    [ "$status$stderr $(stat -c %a "$DB")" = "5 640" ]
    # Beside what takes the place of a journal, no database is made.
    rm "$DB"
    mkfifo "$DB-journal"
    run_tool doctor --repair
    [ "$status$stderr" = 5 ]
    [ "${lines[0]}" = "error: $REAL_DB-journal is not a regular file" ]
    [ "${lines[3]}" = "error: there is no database $REAL_DB" ]
    rm -r "$VEMO_REDIRECT_DIR"
    mkdir other
    ln -s other "$VEMO_REDIRECT_DIR"
    finds 5 "error: $REAL_DIRECTORY is a symbolic link|$ELSEWHERE
note: there is no database $REAL_DB|$NO_TOKENS|vemo-access-token init"
}

@test "attributes that forbid changes are left to the administrator" {
    row aaaaaaaa
    chattr +a "$DB" 2>/dev/null || skip "no right to set attributes, or a file system without them"
    finds 5 "error: $REAL_DB is append-only|$NO_CHANGE|chattr -a $REAL_DB" || wrong=1
    chattr -a "$DB"
    chattr +i "$DB" "$VEMO_REDIRECT_DIR"
    finds 5 "error: $REAL_DIRECTORY is immutable|$NO_CHANGE|chattr -i $REAL_DIRECTORY
error: $REAL_DB is immutable|$NO_CHANGE|chattr -i $REAL_DB" --repair || wrong=1
    chattr -i "$DB" "$VEMO_REDIRECT_DIR"
    [ ! "${wrong-}" ]
    expect_sound
}

@test "a place that cannot be written to is left to the administrator, and a repair that fails is reported" {
    in_namespace 'tool init >/dev/null && chmod 0755 "$REAL_DIRECTORY" && chmod 0750 "$REAL_DB" &&
        mount --bind "$REAL_DB" "$REAL_DB" && mount -o remount,bind,ro "$REAL_DB" && tool doctor --repair'
    found 5 "repaired: $REAL_DIRECTORY has mode 0755|$NOT_PRIVATE
error: $REAL_DB has mode 0750|$NOT_PRIVATE|chmod 0700 $REAL_DB
error: $REAL_DB cannot be written to: Read-only file system|$NO_CHANGE|make the file system writable, or the file" \
        "cannot repair: $REAL_DB: Read-only file system"
    in_namespace 'tool init >/dev/null && chmod 0755 "$REAL_DIRECTORY" &&
        mount -o remount,ro /usr && tool doctor --repair'
    found 5 "error: $REAL_DIRECTORY has mode 0755|$NOT_PRIVATE|chmod 0700 $REAL_DIRECTORY
error: $REAL_DIRECTORY cannot be written to: Read-only file system|$NO_CHANGE|make the file system writable, or the directory" \
        "cannot repair: $REAL_DIRECTORY: Read-only file system"
}

@test "directories above that others can change are left to the administrator" {
    # Nothing below is opened: the missing table is neither reported nor mended.
    in_namespace 'mkdir /usr/vemo && chmod 0777 /usr/vemo && tool init >/dev/null && chmod 0755 "$REAL_DIRECTORY" &&
        sqlite3 "$REAL_DB" "DROP TABLE token" && ! tool doctor --repair &&
        mv /usr/vemo /usr/elsewhere && ln -s elsewhere /usr/vemo && tool doctor'
    found 5 "warning: /usr/vemo belongs to uid 0 and has mode 0777|others than root can replace the private directory below it\
|chown root /usr/vemo && chmod go-w /usr/vemo
error: $REAL_DIRECTORY has mode 0755|$NOT_PRIVATE|chmod 0700 $REAL_DIRECTORY
error: /usr/vemo is a symbolic link|the tokens stand elsewhere, or nowhere\
|find out who made it; move the directory to a directory of that name"
}

@test "a repair that does not help is reported, and not called one" {
    echo '#include <errno.h>
        int fchmod() { return 0; } int unlinkat() { errno = EPERM; return -1; }' |
        cc -shared -fPIC -w -fno-builtin -x c -o "$DIR.no-chmod.so" - || skip "no C compiler"
    fresh
    chmod 0750 "$DB"
    LD_PRELOAD=$DIR.no-chmod.so SENTENCE="the repair did not help: $REAL_DB has mode 0750" \
        finds 5 "error: $REAL_DB has mode 0750|$NOT_PRIVATE|chmod 0700 $REAL_DB" --repair
    # Where others can still put a journal beside it, no database is made. Nobody knows whose the journal is.
    rm "$DB"
    chmod 0770 "$VEMO_REDIRECT_DIR"
    install -m 0640 /dev/null "$DB-journal"
    LD_PRELOAD=$DIR.no-chmod.so SENTENCE="the repair did not help: $REAL_DIRECTORY has mode 0770" \
        finds 5 "error: $REAL_DIRECTORY has mode 0770|$NOT_PRIVATE|chmod 0700 $REAL_DIRECTORY
error: $REAL_DB-journal has mode 0640|$NOT_PRIVATE|chmod 0700 $REAL_DB-journal
error: there is no database $REAL_DB|$NO_TOKENS|vemo-access-token init" --repair
    [ ! -e "$DB" ]
    fresh
    install -m 0600 /dev/null "$VEMO_REDIRECT_DIR/backup.part"
    LD_PRELOAD=$DIR.no-chmod.so run_tool doctor --repair
    [ "$status $stderr" = "5 vemo-access-token: cannot repair: backup.part: Operation not permitted" ]
}

@test "a repair does not follow what others change in the middle of it" {
    # What is repaired first is the journal; or the directory, and then another program takes or removes the other file.
    journal="install -m 0640 /dev/null $DB-journal"
    part="chmod 0750 session; install -m 0600 /dev/null session/backup.part"
    while IFS='|' read -r prepare between failure status_and_mode; do
        fresh
        chmod 0640 "$DB"
        eval "$prepare"
        VEMO_TEST_CALLS="fchmod|cd $DIR && $between" run_tool doctor --repair
        [ "$stderr" = "${failure:+vemo-access-token: cannot repair: $failure}" ]
        [ "$status $(stat -L -c %a "$DB")" = "$status_and_mode" ]
    done <<TABLE
$journal|ln $DB second|$REAL_DB has several hard links|5 640
$journal|mv $DB second && ln -s $DIR/second $DB|$REAL_DB is a symbolic link; name the place that it leads to|5 640
$journal|chmod 0750 session|$REAL_DIRECTORY is not root's alone|5 640
$journal|mv session second && ln -s second session|$REAL_DIRECTORY is a symbolic link; name the place that it leads to|5 640
$part|chmod 0640 session/backup.part|backup.part: File exists|5 640
$part|rm session/backup.part||0 700
TABLE
}

@test "a user who can change a directory above gets nothing from root in the middle of a repair" {
    in_namespace 'tool init >/dev/null && chmod 0640 "$REAL_DB" && install -m 0640 /dev/null "$REAL_DB-journal" &&
        VEMO_TEST_CALLS="fchmod|chmod 0777 /usr/vemo/etc" tool doctor --repair || stat -c %a "$REAL_DB"'
    [ "${lines[-1]}" = 640 ]
    [ "$stderr" = "vemo-access-token: cannot repair: others than root can change /usr/vemo/etc" ]
}

@test "a place that cannot be looked at is a finding" {
    cause="programs fail in the same way|mend the cause; or $REPLACE"
    tool init
    for call in "openat session" "open $REAL_DIRECTORY" fstatvfs; do
        VEMO_TEST_CALLS="$call|24" finds 5 "error: $REAL_DIRECTORY: Too many open files|$cause"
    done
    chmod 0750 "$VEMO_REDIRECT_DIR"
    for call in "openat ." fchown fchmod; do
        VEMO_TEST_CALLS="$call|24" run_tool doctor --repair
        [ "$status $stderr" = "5 vemo-access-token: cannot repair: $REAL_DIRECTORY: Too many open files" ]
    done
    rm -r "$VEMO_REDIRECT_DIR"
    ln -s session "$VEMO_REDIRECT_DIR"
    finds 5 "error: $REAL_DIRECTORY is a symbolic link|$ELSEWHERE
error: $REAL_DIRECTORY: Too many levels of symbolic links|$cause"
}

@test "a file that an export left in the private directory is removed, but not while it is written" {
    part=$VEMO_REDIRECT_DIR/backup.part
    each_is mended <<<"install -m 0600 /dev/null $part; touch session/x|warning: $REAL_DIRECTORY/backup.part was left behind|an export was cut off; the file can hold whole ids|remove it"
    [ ! -e "$part" ]
    install -m 0600 /dev/null "$part"
    run flock "$part" "$TOOL" doctor
    [ "$output" = "$ALL_RIGHT" ]
    chmod 0640 "$DB"
    VEMO_TEST_SYNC=directory run_tool doctor --repair
    undone="vemo-access-token: cannot repair: $REAL_DIRECTORY: Input/output error; the change was made, but a power cut can undo it"
    [ "$status $stderr" = "5 $undone
$undone" ]
    # However many there are.
    (umask 077 && touch "$VEMO_REDIRECT_DIR/"{1..40}.part)
    run --separate-stderr bash -c 'ulimit -n 32 && "$0" doctor' "$TOOL"
    [ "${#lines[@]}" -eq 120 ]
}

@test "the room that a file system has left is enough for a change and for another file, or is a finding" {
    each_is left <<TABLE
export VEMO_TEST_ROOM="65535 1 2 1"|error: the file system of $REAL_DIRECTORY has no room for a change|$NO_CHANGE|remove what is not needed there: "df $REAL_DIRECTORY" tells how full it is
export VEMO_TEST_ROOM="16 4096 1 0"|error: the file system of $REAL_DIRECTORY has no room for another file|$NO_CHANGE|remove what is not needed there: "df -i $REAL_DIRECTORY" tells how full it is
TABLE
    for VEMO_TEST_ROOM in "16 4096 0 0" "65536 1 2 1"; do
        expect_sound
    done
}

# The database.

@test "an index that does not fit its table is damage" {
    rows <<<$'aaaaaaaa|deadline = 1\nbbbbbbbb' # of which one is not looked at
    # Newer versions of the shell protect the schema.
    sqlite3 -cmd '.dbconfig defensive off' "$DB" "
        CREATE INDEX i ON token (deadline); PRAGMA writable_schema = ON;
        UPDATE sqlite_schema SET sql = 'CREATE INDEX i ON token (uid)' WHERE name = 'i'" >"$DIR/defensive"
    damage="$DAMAGED: row 1 missing from index i; row 2 missing from index i|$DAMAGE_HELP"
    finds 5 "$damage"
    finds 5 "$damage" --repair
    tool export >"$DIR/exported"
    # The check itself can fail.
    sqlite3 -cmd '.dbconfig defensive off' "$DB" "
        PRAGMA writable_schema = ON;
        UPDATE sqlite_schema SET sql = 'CREATE INDEX i ON token (bind_sid COLLATE x)' WHERE name = 'i'" >"$DIR/defensive"
    expect_first "error: the database is damaged: no such collation sequence: x"
}

IN_PARTS="to hold no program up, the database is checked in parts, and pages that hold no token are not looked at; \"sqlite3 $REAL_DB 'PRAGMA integrity_check'\" looks at all"

@test "a check of the database that no thread could end is done in parts" {
    ! grep -q __asan_init "$TOOL" || skip "AddressSanitizer takes more memory"
    [[ $(ldd "$TOOL" 2>&1) != *"not a dynamic executable"* ]] || skip "valgrind takes more memory"
    row token---
    ulimit -s 4000000 2>/dev/null || skip "the stack of a thread cannot be made larger than the memory"
    ulimit -v 2000000
    SENTENCE=$IN_PARTS
    finds 0 "$ALL_RIGHT"
}

@test "a check of the database that takes long is done in parts" {
    many_rows 300
    sql "UPDATE token SET extra = json_object('long', hex(zeroblob(5000))) WHERE rowid = 150"
    # The check of each row of the table "slow" takes some milliseconds.
    sql "CREATE TABLE slow (x CHECK (0 = instr(printf('%.*c', 60000, 'a'), printf('%.*c', 30000, 'a') || x)));
         PRAGMA ignore_check_constraints = ON; INSERT INTO slow SELECT 'b' FROM token;
         CREATE TABLE other (tid TEXT PRIMARY KEY); INSERT INTO other SELECT tid FROM token WHERE rowid <= 298"
    SENTENCE=$IN_PARTS
    finds 0 "$ALL_RIGHT"
    cp "$DB" "$DIR/sound"
    sqlite3 -cmd '.dbconfig defensive off' "$DB" "
        PRAGMA writable_schema = ON;
        UPDATE sqlite_schema SET rootpage = (SELECT rootpage FROM sqlite_schema WHERE tbl_name = 'other' AND type = 'index')
            WHERE tbl_name = 'token' AND type = 'index'" >"$DIR/defensive"
    finds 5 "$DAMAGED: rows missing in the index of the ids: 2|$DAMAGE_HELP"
    cp "$DIR/sound" "$DB"
    page=$(sql "SELECT pageno FROM dbstat WHERE name = 'token' AND pagetype = 'overflow' ORDER BY path LIMIT 1")
    dd if=/dev/zero of="$DB" bs=4096 seek=$((page - 1)) count=1 conv=notrunc status=none
    finds 5 "$DAMAGED: database disk image is malformed|$DAMAGE_HELP"
    # Tables without an index of the ids. In the second, the table is the index.
    while IFS='|' read -r old new; do
        cp "$DIR/sound" "$DB"
        remake "$old" "$new"
        run_tool doctor
        [[ "$status $stderr" == "5 vemo-access-token: $SENTENCE" && ${lines[0]} == "error: the table of tokens is not the one"* ]]
    done <<'TABLE'
primary key NOT NULL|
extra TEXT)|extra TEXT) WITHOUT ROWID
TABLE
    # With a write-ahead journal, a long check keeps nobody from writing.
    cp "$DIR/sound" "$DB"
    sql "PRAGMA journal_mode = wal; DELETE FROM slow WHERE rowid > 100" >"$DIR/journal"
    SENTENCE=
    finds 0 "$ALL_RIGHT"
}

@test "a file or a table that is not the library's is left to the administrator, and can be replaced" {
    table="the table of tokens is not the one that the library makes: it"
    wrong="calls can fail, spend no use, report what did not happen, or take one token for another|$SAVE_AND_REPLACE"
    made_up="programs read what it makes up, and their changes fail or go elsewhere|$REPLACE"
    place="in the place of the table of tokens"
    utf16='sql .dump >dump; install -m 0700 /dev/null $DB; sqlite3 -cmd "PRAGMA encoding = '\''UTF-16le'\''" $DB <dump'
    listed='[ "$(tool list --sort tid --limit 1 --field tid --show-ids 2>/dev/null)" = "aaaaaaaa$ZEROS" ]' # first
    while IFS='|' read -r old new differences; do
        echo "remake '$old' \"$new\"; $listed|error: $table $differences|$wrong"
    done >"$DIR.table" <<'TABLE'
tid TEXT primary key NOT NULL|tid TEXT|has "tid TEXT", and lacks "tid TEXT primary key NOT NULL"
tid TEXT|tid TEXT COLLATE NOCASE|has "tid TEXT COLLATE NOCASE primary key NOT NULL", and lacks "tid TEXT primary key NOT NULL"
primary key|primary key ON CONFLICT IGNORE|has "tid TEXT primary key ON CONFLICT IGNORE NOT NULL", and lacks "tid TEXT primary key NOT NULL"
uid INTEGER|uid NUMERIC CHECK (uid IN (0, 1))|has "uid NUMERIC CHECK (uid IN (0, 1))", and lacks "uid INTEGER"
extra TEXT|extra TEXT, note TEXT NOT NULL DEFAULT 'a'|has "note TEXT NOT NULL DEFAULT 'a'"
extra TEXT|extra TEXT, upper TEXT AS (upper(tid)), UNIQUE (function, tid)|has "UNIQUE (function, tid)", "upper TEXT AS (upper(tid))"
extra TEXT)|extra TEXT) WITHOUT ROWID|has "WITHOUT ROWID"
extra TEXT)|extra TEXT) STRICT|has "STRICT"
TABLE
    cat >>"$DIR.table" <<TABLE
echo "no database, but a text that is long enough to be told from an empty one" >$DB|error: $NO_DATABASE|programs fail in the same way|mend the cause; or $REPLACE
$utf16|error: the database is in UTF-16le, and not in UTF-8|bytes that are not UTF-8 are not kept: such an id is never found again|$SAVE_AND_REPLACE
sql "ALTER TABLE token RENAME TO other; CREATE VIEW Token AS SELECT * FROM other"|error: a view stands $place|$made_up
sql "DROP TABLE token; CREATE VIRTUAL TABLE token USING fts4(tid, bind_sid, uid, deadline, count, create_time, function, webapi_allow, extra)"|error: a virtual table stands $place|$made_up
sql "ALTER TABLE token DROP COLUMN extra; ALTER TABLE token RENAME uid TO owner"|error: the table of tokens lacks columns: uid, extra|every call that reads or writes a token fails|$REPLACE
TABLE
    each_is left <"$DIR.table"
}

@test "the library's table in other words is no other table, but one that only looks like it is" {
    row aaaaaaaa
    made=$(sql "SELECT sql FROM sqlite_schema WHERE name = 'token'")
    for comment in '/*(*/' $'--(\n'; do
        sql "DROP TABLE token; CREATE TABLE token $comment (${made#*(}"
        run_tool doctor
        [[ ${lines[0]} == "error: the table of tokens is not the one that the library makes: it has a comment, and lacks "* ]]
    done
    sql "DROP TABLE token; $made"
    remake "tid TEXT primary key NOT NULL,bind_sid TEXT," "bind_sid	text , tid TEXT
        PRIMARY KEY not null, "
    sql "ALTER TABLE token RENAME TO other; ALTER TABLE other RENAME TO TOKEN"
    expect_sound
    gives "all was there already" init
    printf '\003' | dd of="$DB" bs=1 seek=18 conv=notrunc status=none
    expect_first "error: the database says that only a later SQLite can write to it"
}

@test "tokens of the same id are found where the table allows them" {
    row aaaaaaaa
    remake "primary key NOT NULL" ""
    sql "INSERT INTO token SELECT * FROM token"
    row bbbbbbbb
    row cccccccc
    run_tool doctor --repair
    [ "$status" -eq 5 ]
    [[ ${lines[0]} == "error: the table of tokens is not the one "* ]]
    [ "$(tail -n +4 <<<"$output")" = "error: several tokens of the same id: 1 token (aaaaaaaa)
    meaning: a grant reads one of them and saves another: their uses never end
    remedy: revoke them by their whole ids" ]
    tool revoke "aaaaaaaa$ZEROS"
    cd "$DIR"
    replace_database saved
    expect_sound
}

@test "triggers and indexes that take part in changes are left to the administrator, and can be dropped" {
    trigger="error: a trigger on the table of tokens: "
    runs="it runs in every change that it is for: calls can report what did not happen, change other tokens, fail, or never end"
    index='error: an index on the table of tokens that does not only find them: "i"|changes can fail, and a grant can delete other tokens: those that a unique index takes for the same'
    schema="sqlite3 $REAL_DB '.schema token' shows what it does; sqlite3 $REAL_DB"
    each_is left <<TABLE
sql 'CREATE TRIGGER t AFTER INSERT ON token BEGIN DELETE FROM token; END'|$trigger"t"|$runs|$schema 'DROP TRIGGER "t";'
sql 'CREATE TRIGGER b UPDATE ON token BEGIN SELECT 1; END; CREATE TRIGGER a DELETE ON TOKEN BEGIN SELECT 1; END'|$trigger"a", "b"|$runs|$schema 'DROP TRIGGER "a"; DROP TRIGGER "b";'
sql 'CREATE TRIGGER "it'\''s ""\$(false)""" UPDATE ON token BEGIN SELECT 1; END'|$trigger"it's "\$(false)""|$runs|$schema 'DROP TRIGGER "it'\''s ""\$(false)""";'
sql 'CREATE UNIQUE INDEX i ON token (function, tid)'|$index|$schema 'DROP INDEX "i";'
sql 'CREATE INDEX i ON token (uid) WHERE count = 1'|$index|$schema 'DROP INDEX "i";'
sql 'CREATE INDEX i ON token (uid, json(extra))'|$index|$schema 'DROP INDEX "i";'
TABLE
    sql "CREATE TABLE own (a UNIQUE); CREATE TRIGGER of_own UPDATE ON own BEGIN DELETE FROM token; END;
         CREATE INDEX plain ON token (function, uid DESC)"
    expect_sound
}

@test "tokens are not repaired while a trigger would take part" {
    row aaaaaaaa
    row bbbbbbbb "extra = NULL"
    sql "CREATE TRIGGER t BEFORE DELETE ON token BEGIN
         SELECT max(i) FROM (WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n) SELECT i FROM n); END"
    run_tool doctor --repair # which would never end
    [ "$status" -eq 5 ]
    [ "${lines[0]}" = 'error: a trigger on the table of tokens: "t"' ]
    [ "${lines[3]}" = "error: a NULL in 1 token (bbbbbbbb)" ]
    [ "${lines[5]}" = "    remedy: when the table is mended: delete them: vemo-access-token doctor --repair" ]
    sql "DROP TRIGGER t"
    succeeds doctor --repair
}

@test "a large table without an index on the deadline is a finding" {
    each_is left <<<"many_rows 9999|warning: 10001 tokens, and no index on their deadline|every call reads the whole table for expired tokens|vemo-access-token tune"
    sql "CREATE INDEX of_another_column ON token (function, deadline)"
    expect_first "warning: 10001 tokens, and no index on their deadline"
    sql "DROP INDEX of_another_column; CREATE INDEX own ON token (deadline)"
    expect_sound
    sql "DROP INDEX own; DELETE FROM token WHERE rowid = 1"
    expect_sound
}

# Journals.

# stopped STATEMENTS: the store as a program leaves it that has executed these, and is stopped then
stopped() {
    sqlite3 "$DB" >/dev/null <<SQL
$1
.shell cp -a "$VEMO_REDIRECT_DIR" "$DIR/stopped"
SQL
    rm -r "$VEMO_REDIRECT_DIR"
    mv "$DIR/stopped" "$VEMO_REDIRECT_DIR"
}

# half_change [WHEN]: the store as it is in the middle of a change: with a journal, of an hour ago, or of then
half_change() {
    [ -e "$DB" ] || many_rows 40 "extra = json_object('data', hex(zeroblob(1000)))"
    # What does not fit into the cache is written before the end of the change.
    stopped "PRAGMA cache_size = 1; BEGIN;
        UPDATE token SET function = 'half', extra = json_object('data', hex(randomblob(1000)));"
    touch -d "${1-1 hour ago}" "$DB-journal"
    grep -q half "$DB"
    [ -s "$DB-journal" ]
}

# expect_undone: the half change is undone
expect_undone() {
    [ "$(sql "SELECT function, count(*) FROM token GROUP BY 1; PRAGMA integrity_check" | xargs)" = "VPN|40 ok" ]
}

@test "a journal that was left behind is a finding, and reading the database undoes the half change" {
    journal="$REAL_DB-journal was left behind|a program or the machine stopped in the middle of a change"
    half_change
    finds 5 "warning: $journal|none needed: reading the database has just undone the half change"
    [ "$(ls -A "$VEMO_REDIRECT_DIR")" = vemo-access-token.db ]
    expect_undone
    expect_sound
    half_change
    finds 0 "repaired: $journal"$'\n'"$ALL_RIGHT" --repair
    expect_undone
    half_change
    VEMO_TEST_SYNC=file finds 5 "error: $REAL_DB failed: disk I/O error|programs fail in the same way|mend the cause; or $REPLACE"
    # A journal of just now can belong to a program that is running.
    half_change "1 hour"
    expect_sound
    expect_undone
}

@test "an old journal that is empty, or whose change has ended, holds no half change" {
    row aaaaaaaa
    install -m 0700 /dev/null "$DB-journal"
    touch -d "1 hour ago" "$DB-journal"
    expect_sound
    sql "PRAGMA journal_mode = PERSIST; UPDATE token SET count = 2"
    touch -d "1 hour ago" "$DB-journal"
    [ -s "$DB-journal" ]
    expect_sound
}

@test "a write-ahead journal that belongs to the database is no finding" {
    row aaaaaaaa
    # Of a program that still has the database open, and of one that was stopped.
    stopped "PRAGMA journal_mode = WAL; UPDATE token SET function = 'changed';
.shell \"$TOOL\" doctor >\"$DIR/doctor\""
    [ "$(cat "$DIR/doctor")" = "no findings" ]
    touch -d "1 hour ago" "$DB-wal"
    expect_sound
    [ "$(sql "SELECT function FROM token")" = changed ]
}

@test "a write-ahead journal that does not belong to the database is left to the administrator, and not mixed into it" {
    row aaaaaaaa
    cp "$DB" "$DIR/backup"
    stopped "PRAGMA journal_mode = WAL; UPDATE token SET function = 'changed';"
    cp "$DIR/backup" "$DB"
    run_tool doctor
    [ "$status" -eq 5 ]
    cmp "$DB" "$DIR/backup"

    # The byte that says how the database is written to says nothing about reading.
    each_is left <<TABLE
install -m 0700 /dev/stdin $DB-wal <<<journal; dd of=$DB bs=1 seek=18 conv=notrunc status=none < <(printf '\002')|\
warning: $REAL_DB-wal does not belong to the database|the database was copied or replaced without it, and may lack changes|\
if the database is complete, remove it while no program runs
TABLE
}

# Tokens.

@test "tokens that the library does not write are left to the administrator, and can be mended or revoked" {
    deep=$(printf '{"a":%.0s' {1..100})7$(printf '}%.0s' {1..100})
    rows <<TABLE
uid-high|uid = 4294967296
uid-last|uid = 4294967295
uid-less|uid = -1
short---|tid = substr(tid, 1, 126)
nul-byte|bind_sid = CAST(x'6100' AS TEXT)
empty---|function = ''
number-1|deadline = 'soon'
number-2|count = 1.5
number-3|uid = x'3030'
number-4|create_time = 'CURRENT_TIMESTAMP'
never--0|deadline = 0
never--1|deadline = -1
nested-1|webapi_allow = '{"A":{"method":["get",["put"]]}}'
nested-2|webapi_allow = '{"A":{"method":[{}]}}'
no-list1|webapi_allow = '{"A":{"method":[]},"B":7}'
no-list2|webapi_allow = '{"B":{"method":{"get":1}}}'
object-1|webapi_allow = '[]'
object-2|extra = 'text'
object-3|extra = ''
object-4|webapi_allow = 7
object-5|extra = '{"a":1} {}'
object-6|extra = '{"a":1} // a comment'
object-7|webapi_allow = '{"A":{"method":["g'
object-8|extra = '{"a":"\ud800"}'
deep---1|extra = '{"b":$deep}'
deep---2|webapi_allow = '{"A":{"method":[],"x":$deep}}'
sound---|count = '7'
TABLE
    findings='error: no whole number where there should be one in 4 tokens (number-1, number-2, number-3, number-4)|it is read as another number, 0 for a word: deadline or uses are not what they seem|revoke them, or update what is wrong
error: a uid that is no user'\''s in 3 tokens (uid-high, uid-last, uid-less)|programs take the lower 32 bits of it for the owner: 4294967296 is root'\''s|revoke them
warning: an id of fewer than 127 bytes in 1 token (short---)|it was not made by the library, and may be guessed|revoke them, and create others
error: a NUL byte in a text of 1 token (nul-byte)|programs see what stands before it, and no look-up by that field finds such a token|revoke them
warning: an empty purpose in 1 token (empty---)|no call deletes such a token by its purpose|revoke them, and create others
warning: a deadline of 0 or less in 2 tokens (never--0, never--1)|there is no value for "never": the next purge deletes them|update --ttl gives them time
error: no JSON object where there should be one in 8 tokens (object-1, object-2, object-3, object-4, object-5, ...)|such a token opens nothing, or only what stands before the fault, or cannot be saved with a use less|revoke them, or update --allow and --extra
error: lists of methods that hold an array or an object in 2 tokens (nested-1, nested-2)|the library throws an exception where it should grant or refuse, which ends a program that does not catch it|revoke them, or update --allow
warning: an API without a list of methods in 2 tokens (no-list1, no-list2)|it is open to calls that name no method, and to no others|revoke them, or update --allow
warning: JSON of more than 100 levels in 2 tokens (deep---1, deep---2)|a program that reads such a token in a thread of a small stack crashes: 64 KiB have room for that many levels, 128 KiB for twice as many|revoke them, or update --allow and --extra'
    finds 5 "$findings"
    finds 5 "$findings" --repair
    for name in object-1 object-4 object-7 nested-1 nested-2 no-list1 deep---2; do
        tool update "$name" --allow A:get,put
    done
    for name in object-2 object-3 object-5 object-6 deep---1; do
        tool update "$name" --extra '{}'
    done
    tool update never--0 --ttl 30d
    tool update never--1 --ttl 30d
    gives "12 tokens revoked" revoke uid-high uid-last uid-less short--- nul-byte empty--- number-{1..4} no-list2 object-8
    expect_sound
}

@test "an id that no call can name is left to the administrator, and its token can be deleted" {
    finding="error: an id that is empty or holds a NUL byte in 1 token"
    unnamed="no call can name such a token: it is listed, but cannot be granted or revoked"
    remedy="sqlite3 $REAL_DB \"DELETE FROM token WHERE typeof(tid) = 'text' AND (tid = '' OR instr(tid, char(0)))\""
    each_is left <<TABLE
sql "UPDATE token SET tid = '' WHERE tid LIKE 'a%'"|$finding ()|$unnamed|$remedy
sql "UPDATE token SET tid = replace('N$ZEROS$ZEROS', 'N', char(0)) WHERE tid LIKE 'a%'"|$finding ()|$unnamed|$remedy
sql "UPDATE token SET tid = replace('aaaaaaaaN$ZEROS', 'N', char(0)) WHERE tid LIKE 'a%'"|$finding (aaaaaaaa)|$unnamed|$remedy
TABLE
    expect_left bbbbbbbb
}

@test "tokens with a NULL are deleted, and each of them is one finding" {
    cat >"$DIR.rows" <<'END'
null---0-long|uid = NULL
null---1|count = NULL
null---2|bind_sid = NULL
null---3|deadline = NULL
null---4|create_time = NULL
null---5|extra = NULL
null---6|webapi_allow = '[]', extra = NULL
null---7|webapi_allow = '[]', uid = NULL
END
    each_is mended <<<"rows <$DIR.rows|error: a NULL in 8 tokens (null---0, null---1, null---2, null---3, null---4, ...)|such a token cannot be read or granted, and every listing that meets it fails|delete them: vemo-access-token doctor --repair"
    expect_left aaaaaaaa bbbbbbbb
}

@test "bytes in place of a text, which no look-up finds, are made a text" {
    bytes="bytes where there should be a text in 3 tokens (bytes-1x, bytes-2x, bytes-3x)|no look-up by that field finds such a token"
    rows <<'END'
sound
bytes-1x|tid = CAST(tid || 'x' AS BLOB)
bytes-2x|bind_sid = CAST(bind_sid || 'x' AS BLOB)
bytes-3x|function = CAST(function || 'x' AS BLOB)
END
    sql "SELECT * FROM token" >"$DIR/before"
    finds 5 "error: $bytes|make texts of them: vemo-access-token doctor --repair"
    finds 0 "repaired: $bytes"$'\n'"$ALL_RIGHT" --repair
    sql "SELECT * FROM token" | diff "$DIR/before" -
    [ "$(sql "SELECT DISTINCT typeof(tid) || typeof(bind_sid) || typeof(function) FROM token")" = texttexttext ]

    # They stay as they are where the text is the id of another token.
    sql "INSERT INTO token SELECT CAST(tid AS BLOB), 's', uid, deadline, count, create_time, function, webapi_allow, extra
         FROM token WHERE tid LIKE 'sound%'"
    sql ".dump" >"$DIR/before"
    run_tool doctor --repair
    [ "$status $stderr" = "5 vemo-access-token: cannot repair: $REAL_DB failed: UNIQUE constraint failed: token.tid" ]
    sql ".dump" | diff "$DIR/before" -
}

@test "a backlog of expired tokens is purged, but not tokens that were meant to last for ever" {
    backlog="expired for more than an hour: 6 tokens (expired1, expired2, expired3, expired4, expired5, ...)|no program has called since, or its purges fail"
    never='warning: a deadline of 0 or less in 1 token (meant-to)|there is no value for "never": the next purge deletes them|update --ttl gives them time'
    rows <<'END'
sound
meant-to-last|deadline = -1
expired1|deadline = 1
expired2|deadline = 2
expired3|deadline = 3
expired4|deadline = 4
expired5|deadline = 5
expired6|deadline = strftime('%s', 'now') - 4000
expired-just-now|deadline = strftime('%s', 'now') - 3000
END
    finds 5 "$never"$'\n'"warning: $backlog|vemo-access-token purge"
    finds 5 "repaired: $backlog"$'\n'"$never" --repair
    expect_left meant-to-last sound
}

# The output.

@test "findings come as JSON, and say what was repaired" {
    rows <<'END'
aaaaaaaa|deadline = 1
bbbbbbbb|deadline = 0
END
    never='{"finding":"a deadline of 0 or less in 1 token (bbbbbbbb)","meaning":"there is no value for \"never\": the next purge deletes them","remedy":"update --ttl gives them time","repaired":false,"severity":"warning"}'
    old='{"finding":"expired for more than an hour: 1 token (aaaaaaaa)","meaning":"no program has called since, or its purges fail","remedy":"vemo-access-token purge","repaired":false,"severity":"warning"}'
    mode="{\"finding\":\"$REAL_DB has mode 0750\",\"meaning\":\"$NOT_PRIVATE\",\"remedy\":\"chmod 0700 $REAL_DB\",\"repaired\":false,\"severity\":\"error\"}"
    chmod 0750 "$DB"
    ends 5 "$mode
$never
$old" doctor -o jsonl
    run_tool doctor -o json
    [ "$status$stderr" = 5 ]
    [ "$(sqlite3 :memory: "SELECT json('${output//\'/\'\'}')")" = "[$mode,$never,$old]" ]
    chmod 0700 "$DB"
    ends 5 "${old/false/true}
$never" doctor --repair --output jsonl
}

@test "control characters of a finding are made visible" {
    row $'a\e[31mb' "deadline = 1"
    expect_first 'warning: expired for more than an hour: 1 token (a\x1b[31mb0)'
}
