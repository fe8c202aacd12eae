#!/usr/bin/env bats
# doctor: what it finds, what it repairs, and what it leaves to the administrator

load common

REPLACE='stop the programs, move the directory away, run "vemo-access-token init" and import a backup'
SAVE_AND_REPLACE='stop the programs, save the tokens with "vemo-access-token export", move the directory away, run "vemo-access-token init" and import them'
NOT_PRIVATE="others than root can use it, and ids are credentials"
NO_CHANGE="no token can be created, changed or granted"

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
    expect_sound
}

# expect_no_repair SEVERITY WHAT MEANING REMEDY: doctor finds that, and leaves it to the administrator
expect_no_repair()
{
    expect_finding "$@"
    local found=$output
    ends 5 "$found" doctor --repair
}

# expect_sound: doctor finds nothing
expect_sound()
{
    gives "no findings" doctor
}

# expect_first SEVERITY WHAT: doctor's first finding
expect_first()
{
    run_tool doctor
    [ "$status $stderr${lines[0]}" = "5 $1: $2" ]
}

# expect_made: the directory, the file and an empty table are there, as programs expect them
expect_made()
{
    [ "$(stat -c %a "$VEMO_REDIRECT_DIR" "$DB" | xargs)" = "700 700" ]
    [ "$(sql "PRAGMA auto_vacuum; SELECT count(*) FROM token" | xargs)" = "1 0" ]
}

# A store as it is when a program or the machine stops in the middle of a change: with a journal.
half_change()
{
    many_rows 40 "extra = json_object('data', hex(zeroblob(1000)))"
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
    grep -q half "$DB"
    [ -s "$DB-journal" ]
}

# replace_database BACKUP, save_and_replace: what the remedies of these names say; the backup holds two tokens
replace_database()
{
    mv "$VEMO_REDIRECT_DIR" "$DIR/away"
    tool init
    gives "2 tokens imported" import "$1"
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

# --- what is well

@test "a sound store gives no findings, and stays as it is" {
    rows <<END
lasting|extra = '{"a":Infinity}', create_time = strftime('%s', 'now')
expired-just-now|deadline = strftime('%s', 'now') - 3000
unlimited|count = -1, create_time = strftime('%s', 'now')
deepest|extra = '$(printf '{"a":%.0s' {1..100})7$(printf '}%.0s' {1..100})'
brackets-in-a-text|extra = '{"a":"$(printf '[%.0s' {1..200})\\\\\\"{"}'
END
    cp "$DB" "$DIR/before"
    expect_sound
    gives "no findings" doctor --repair
    gives "[]" doctor -o json
    gives "" doctor -o jsonl
    cmp "$DB" "$DIR/before"
}

@test "what is worth knowing of a sound store is told in numbers, and is no finding" {
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
    gives "$output" doctor --repair
    run_tool doctor -o jsonl
    [ "$status" -eq 0 ]
    [ "${lines[3]}" = '{"finding":"opening nothing: 1 token","meaning":"every call with them is refused","remedy":"update --add-allow lets them open calls; or revoke them","repaired":false,"severity":"note"}' ]
    # An owner who could not be looked up may exist.
    VEMO_TEST_LOOKUP=5 run_tool doctor
    [[ $output != *"without an owner"* ]]
    # A finding comes without notes.
    sql "UPDATE token SET function = '' WHERE tid LIKE 'plain%'"
    expect_finding warning "an empty purpose in 1 token (plain000)" "no call deletes such a token by its purpose" \
        "revoke them, and create others"
}

# --- the place

@test "what is missing of the store is made" {
    no_store="there is no store yet: no token can be created, and every call fails"
    no_tokens="there are no tokens; the first call that needs it makes it"
    no_table="every call fails: the table is made together with the file, and never later"
    expect_note "there is no directory $REAL_DIRECTORY" "$no_store" "vemo-access-token init"
    [ ! -e "$VEMO_REDIRECT_DIR" ]
    run_tool doctor --repair
    expect 0 "repaired: there is no directory $REAL_DIRECTORY
    meaning: $no_store
repaired: there is no database $REAL_DB
    meaning: $no_tokens
no findings"
    expect_made

    rm "$DB"
    expect_note "there is no database $REAL_DB" "$no_tokens" "vemo-access-token init"
    [ ! -e "$DB" ]
    # A journal without a database tells that there was one.
    install -m 0600 /dev/null "$DB-journal"
    expect_finding error "there is no database $REAL_DB" "$no_tokens" "vemo-access-token init"
    rm "$DB-journal"
    expect_repair "there is no database $REAL_DB" "$no_tokens"
    expect_made

    : >"$DB"
    expect_finding error "the database has no table of tokens" "$no_table" "vemo-access-token init"
    [ ! -s "$DB" ]
    expect_repair "the database has no table of tokens" "$no_table"
    expect_made
}

@test "modes that let others in are tightened" {
    row aaaaaaaa
    # With a journal that no change is using.
    sql "PRAGMA journal_mode = PERSIST; UPDATE token SET count = 2"
    while read -r path name mode; do
        chmod "$mode" "$path"
        expect_finding error "$name has mode $mode" "$NOT_PRIVATE" "chmod 0700 $name"
        expect_repair "$name has mode $mode" "$NOT_PRIVATE"
        [ "$(stat -c %a "$path")" = 700 ]
    done <<END
$VEMO_REDIRECT_DIR $REAL_DIRECTORY 0755
$VEMO_REDIRECT_DIR $REAL_DIRECTORY 0701
$VEMO_REDIRECT_DIR $REAL_DIRECTORY 0710
$DB $REAL_DB 0644
$DB $REAL_DB 0604
$DB $REAL_DB 0720
$DB-journal $REAL_DB-journal 0640
END
    chmod 0600 "$DB"
    expect_sound
}

@test "owners other than root are replaced" {
    [ "$(id -u)" -eq 0 ] || skip "only root can give files away"
    row aaaaaaaa
    meaning="its owner can read and change every token, and may have done so"
    chown 4000000000 "$DB"
    expect_finding error "$REAL_DB belongs to uid 4000000000" "$meaning" "chown root $REAL_DB, and look at the tokens"
    expect_repair "$REAL_DB belongs to uid 4000000000" "$meaning"
    chown 4000000000:1 "$VEMO_REDIRECT_DIR"
    expect_finding error "$REAL_DIRECTORY belongs to uid 4000000000" "$meaning" \
        "chown root $REAL_DIRECTORY, and look at the tokens"
    expect_repair "$REAL_DIRECTORY belongs to uid 4000000000" "$meaning"
    [ "$(stat -c '%u %g' "$VEMO_REDIRECT_DIR")" = "0 1" ]
}

@test "what stands in the place of the directory or the file is left to the administrator, and not opened" {
    directory="the tokens stand elsewhere, or nowhere|find out who made it; move the database to a directory of that name"
    file="programs work on another file than this one, or on none|find out who made it; move the database to this name"
    links="the tokens can be reached under another name, and a journal of that name is not found|find -samefile tells the other names; remove those"
    while IFS='|' read -r change kind finding; do
        echo "$change"
        rm -rf "$DIR/"*
        row aaaaaaaa "deadline = 0" # which would be a finding
        cd "$DIR"
        eval "$change"
        before=$(find "$DIR" -printf '%P %i %m %T@ %l\n')
        IFS='|' read -r meaning remedy <<<"${!kind}"
        expect_no_repair "${finding%% *}" "${finding#* }" "$meaning" "$remedy"
        [ "$(find "$DIR" -printf '%P %i %m %T@ %l\n')" = "$before" ]
    done <<TABLE
mv session other; ln -s other session|directory|error $REAL_DIRECTORY is a symbolic link
rm -r session; echo text >session|directory|error $REAL_DIRECTORY is not a directory
mv $DB other; ln -s ../other $DB|file|error $REAL_DB is a symbolic link
mv $DB other; ln -s ../nowhere $DB|file|error $REAL_DB is a symbolic link
rm $DB; mkdir $DB|file|error $REAL_DB is not a regular file
TABLE
    rm -r "$VEMO_REDIRECT_DIR"
    mkdir other
    ln -s other "$VEMO_REDIRECT_DIR"
    run_tool doctor
    expect 5 "error: $REAL_DIRECTORY is a symbolic link
    meaning: ${directory%|*}
    remedy: ${directory#*|}
note: there is no database $REAL_DB
    meaning: there are no tokens; the first call that needs it makes it
    remedy: vemo-access-token init"

    # A file with other names is not made private.
    rm "$VEMO_REDIRECT_DIR"
    row aaaaaaaa
    ln "$DB" second
    ln "$DB" third
    expect_no_repair warning "$REAL_DB has 3 hard links" "${links%|*}" "${links#*|}"
    chmod 0640 "$DB"
    run_tool doctor --repair
    [ "$status$stderr" = 5 ]
    [ "$(stat -c %a "$DB")" = 640 ]
}

@test "what stands in the place of a journal and is none is left to the administrator, and not opened" {
    row aaaaaaaa
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
    # No database is made beside it either.
    rm "$DB"
    mkfifo "$DB-journal"
    run_tool doctor --repair
    [ "$status$stderr" = 5 ]
    [ "${lines[0]}" = "error: $REAL_DB-journal is not a regular file" ]
    [ "${lines[3]}" = "error: there is no database $REAL_DB" ]
}

@test "what others may have put there is not opened" {
    row aaaaaaaa "deadline = 0" # which would be a finding
    chmod 0720 "$VEMO_REDIRECT_DIR"
    expect_finding error "$REAL_DIRECTORY has mode 0720" "$NOT_PRIVATE" "chmod 0700 $REAL_DIRECTORY"
    chmod 0700 "$VEMO_REDIRECT_DIR"
    others="the next program to open the database changes other files, too"
    remedy="find out who made it; remove it while no program runs"
    # The end of a journal that names another file.
    (umask 077 && printf 'x\331\325\005\371\040\241\143\327' >"$DB-journal")
    expect_no_repair error "$REAL_DB-journal is one of several that belong together" "$others" "$remedy"
    : >"$DB-journal"
    ln "$DB-journal" "$DIR/second"
    expect_no_repair error "$REAL_DB-journal has several hard links" "$others" "$remedy"
    if [ "$(id -u)" -eq 0 ]; then
        chown 4000000000 "$DB-journal"
        expect_no_repair error "$REAL_DB-journal belongs to uid 4000000000" \
            "the next program to open the database may take its contents for changes" "$remedy"
    fi
    rm "$DB-journal"
    expect_first warning "a deadline of 0 or less in 1 token (aaaaaaaa)"
}

@test "attributes that forbid changes are left to the administrator" {
    row aaaaaaaa
    chattr +a "$DB" 2>/dev/null || skip "no right to set attributes, or a file system without them"
    wrong=""
    expect_finding error "$REAL_DB is append-only" "$NO_CHANGE" "chattr -a $REAL_DB" || wrong=1
    chattr -a "$DB"
    chattr +i "$DB" "$VEMO_REDIRECT_DIR"
    run_tool doctor --repair
    chattr -i "$DB" "$VEMO_REDIRECT_DIR"
    expect 5 "error: $REAL_DIRECTORY is immutable
    meaning: $NO_CHANGE
    remedy: chattr -i $REAL_DIRECTORY
error: $REAL_DB is immutable
    meaning: $NO_CHANGE
    remedy: chattr -i $REAL_DB"
    [ ! "$wrong" ]
    expect_sound
}

@test "a file or a directory that cannot be written to is left to the administrator, and a repair that fails is told" {
    in_namespace '"$1" init >/dev/null && chmod 0755 "$3" && chmod 0750 "$2" && mount --bind "$2" "$2" &&
        mount -o remount,bind,ro "$2" && "$1" doctor --repair' "$TOOL" "$REAL_DB" "$REAL_DIRECTORY"
    expect 5 "repaired: $REAL_DIRECTORY has mode 0755
    meaning: $NOT_PRIVATE
error: $REAL_DB has mode 0750
    meaning: $NOT_PRIVATE
    remedy: chmod 0700 $REAL_DB
error: $REAL_DB cannot be written to: Read-only file system
    meaning: $NO_CHANGE
    remedy: make the file system writable, or the file" "vemo-access-token: cannot repair: $REAL_DB: Read-only file system"
    rmdir "$DIR/layer"
    in_namespace '"$1" init >/dev/null && chmod 0755 "$2" && mount -o remount,ro /usr && "$1" doctor --repair' \
        "$TOOL" "$REAL_DIRECTORY"
    expect 5 "error: $REAL_DIRECTORY has mode 0755
    meaning: $NOT_PRIVATE
    remedy: chmod 0700 $REAL_DIRECTORY
error: $REAL_DIRECTORY cannot be written to: Read-only file system
    meaning: $NO_CHANGE
    remedy: make the file system writable, or the directory" \
        "vemo-access-token: cannot repair: $REAL_DIRECTORY: Read-only file system"
}

@test "directories above that others can change are left to the administrator" {
    # Nothing below is opened: that the table is missing is neither told nor mended.
    in_namespace 'mkdir /usr/vemo && chmod 0777 /usr/vemo && "$1" init >/dev/null && sqlite3 "$2" "DROP TABLE token" &&
        chmod 0755 "${2%/*}" && ! "$1" doctor --repair && mv /usr/vemo /usr/elsewhere && ln -s elsewhere /usr/vemo &&
        "$1" doctor' "$TOOL" "$REAL_DB"
    expect 5 "warning: /usr/vemo belongs to uid 0 and has mode 0777
    meaning: others than root can replace the private directory below it
    remedy: chown root /usr/vemo && chmod go-w /usr/vemo
error: $REAL_DIRECTORY has mode 0755
    meaning: $NOT_PRIVATE
    remedy: chmod 0700 $REAL_DIRECTORY
error: /usr/vemo is a symbolic link
    meaning: the tokens stand elsewhere, or nowhere
    remedy: find out who made it; move the directory to a directory of that name"
}

@test "a repair that does not help is told, and not called one" {
    row aaaaaaaa
    echo '#include <errno.h>
        int chmod() { return 0; } int fchmod() { return 0; } int fchmodat() { return 0; }
        int unlinkat() { errno = EPERM; return -1; }' |
        cc -shared -fPIC -w -fno-builtin -x c -o "$DIR/no-chmod.so" - || skip "no C compiler"
    chmod 0750 "$DB"
    LD_PRELOAD=$DIR/no-chmod.so run_tool doctor --repair
    expect 5 "error: $REAL_DB has mode 0750
    meaning: $NOT_PRIVATE
    remedy: chmod 0700 $REAL_DB" "vemo-access-token: the repair did not help: $REAL_DB has mode 0750"
    # Where others can still put a journal beside it, no database is made. Nobody knows whose the journal is.
    rm "$DB"
    chmod 0770 "$VEMO_REDIRECT_DIR"
    install -m 0640 /dev/null "$DB-journal"
    LD_PRELOAD=$DIR/no-chmod.so run_tool doctor --repair
    expect 5 "error: $REAL_DIRECTORY has mode 0770
    meaning: $NOT_PRIVATE
    remedy: chmod 0700 $REAL_DIRECTORY
error: $REAL_DB-journal has mode 0640
    meaning: $NOT_PRIVATE
    remedy: chmod 0700 $REAL_DB-journal
error: there is no database $REAL_DB
    meaning: there are no tokens; the first call that needs it makes it
    remedy: vemo-access-token init" "vemo-access-token: the repair did not help: $REAL_DIRECTORY has mode 0770"
    [ ! -e "$DB" ]
    rm "$DB-journal"
    chmod 0700 "$VEMO_REDIRECT_DIR"
    tool init >/dev/null
    install -m 0600 /dev/null "$VEMO_REDIRECT_DIR/backup.part"
    LD_PRELOAD=$DIR/no-chmod.so run_tool doctor --repair
    [ "$status $stderr" = "5 vemo-access-token: cannot repair: backup.part: Operation not permitted" ]
}

@test "what others change in the middle of a repair is not followed" {
    while IFS='|' read -r between reason; do
        rm -rf "$DIR/"s*
        tool init >/dev/null
        chmod 0640 "$DB"
        install -m 0640 /dev/null "$DB-journal" # which is repaired first
        VEMO_TEST_CALLS="fchmod|cd $DIR && $between" run_tool doctor --repair
        [ "$status $stderr" = "5 vemo-access-token: cannot repair: $reason" ]
        [ "$(stat -L -c %a "$DB")" = 640 ]
    done <<TABLE
ln $DB second|$REAL_DB has several hard links
mv $DB second && ln -s $DIR/second $DB|$REAL_DB is a symbolic link; name the place that it leads to
chmod 0750 session|$REAL_DIRECTORY is not root's alone
mv session second && ln -s second session|$REAL_DIRECTORY is a symbolic link; name the place that it leads to
TABLE
    # What an export has left behind: another program takes it, or it is gone.
    while IFS='|' read -r between reason; do
        rm -rf "$DIR/"s*
        tool init >/dev/null
        chmod 0750 "$VEMO_REDIRECT_DIR"
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
    for call in "openat session" "open $REAL_DIRECTORY" fstatvfs; do
        VEMO_TEST_CALLS="$call|24" expect_finding error "$REAL_DIRECTORY: Too many open files" \
            "programs fail in the same way" "mend the cause; or $REPLACE"
    done
    chmod 0750 "$VEMO_REDIRECT_DIR"
    for call in "openat ." fchown fchmod; do
        VEMO_TEST_CALLS="$call|24" run_tool doctor --repair
        [ "$status $stderr" = "5 vemo-access-token: cannot repair: $REAL_DIRECTORY: Too many open files" ]
    done
    rm -r "$VEMO_REDIRECT_DIR"
    ln -s session "$VEMO_REDIRECT_DIR"
    run_tool doctor
    expect 5 "error: $REAL_DIRECTORY is a symbolic link
    meaning: the tokens stand elsewhere, or nowhere
    remedy: find out who made it; move the database to a directory of that name
error: $REAL_DIRECTORY: Too many levels of symbolic links
    meaning: programs fail in the same way
    remedy: mend the cause; or $REPLACE"
}

@test "what an export into the private directory left behind is removed, but not while it is written" {
    row aaaaaaaa
    meaning="an export was cut off; the file can hold whole ids"
    install -m 0600 /dev/null "$VEMO_REDIRECT_DIR/backup.part"
    run flock "$VEMO_REDIRECT_DIR/backup.part" "$TOOL" doctor
    [ "$output" = "no findings" ]
    touch "$VEMO_REDIRECT_DIR/x"
    expect_finding warning "$REAL_DIRECTORY/backup.part was left behind" "$meaning" "remove it"
    chmod 0640 "$DB"
    VEMO_TEST_SYNC=directory run_tool doctor --repair
    undone="vemo-access-token: cannot repair: $REAL_DIRECTORY: Input/output error; the change was made, but a power cut can undo it"
    [ "$status $stderr" = "5 $undone
$undone" ]
    install -m 0600 /dev/null "$VEMO_REDIRECT_DIR/backup.part"
    expect_repair "$REAL_DIRECTORY/backup.part was left behind" "$meaning"
    [ ! -e "$VEMO_REDIRECT_DIR/backup.part" ]
    # However many there are.
    (umask 077 && touch "$VEMO_REDIRECT_DIR/"{1..40}.part)
    run --separate-stderr bash -c 'ulimit -n 32 && "$0" doctor' "$TOOL"
    [ "${#lines[@]}" -eq 120 ]
}

@test "what is left of a file system is enough for a change and for another file, or is not" {
    tool init
    for room in "16 4096 0 0" "65536 1 2 1"; do
        VEMO_TEST_ROOM=$room expect_sound
    done
    VEMO_TEST_ROOM="65535 1 2 1" expect_no_repair error "the file system of $REAL_DIRECTORY has no room for a change" \
        "$NO_CHANGE" "remove what is not needed there: \"df $REAL_DIRECTORY\" tells how full it is"
    VEMO_TEST_ROOM="16 4096 1 0" expect_no_repair error "the file system of $REAL_DIRECTORY has no room for another file" \
        "$NO_CHANGE" "remove what is not needed there: \"df -i $REAL_DIRECTORY\" tells how full it is"
}

# --- the database

@test "a file that is no database is a finding, and left" {
    mkdir -m 0700 "$VEMO_REDIRECT_DIR"
    install -m 0600 /dev/stdin "$DB" <<<"no database, but a text that is long enough to be told from an empty one"
    cp "$DB" "$DIR/text"
    expect_no_repair error "$NO_DATABASE" "programs fail in the same way" "mend the cause; or $REPLACE"
    cmp "$DB" "$DIR/text"
}

@test "an index that does not fit its table is damage" {
    row aaaaaaaa "deadline = 1" # which is not looked at
    row bbbbbbbb
    # Newer versions of the shell protect the schema.
    sqlite3 -cmd '.dbconfig defensive off' "$DB" "
        CREATE INDEX i ON token (deadline); PRAGMA writable_schema = ON;
        UPDATE sqlite_schema SET sql = 'CREATE INDEX i ON token (uid)' WHERE name = 'i'" >"$DIR/defensive"
    expect_no_repair error "the database is damaged: row 1 missing from index i; row 2 missing from index i" \
        "tokens may be lost or wrong" \
        "$SAVE_AND_REPLACE; where export fails, import a backup or what sqlite3 can still read: see vemo-access-token(8)"
    tool export >"$DIR/exported"
    # The check itself can fail.
    sqlite3 -cmd '.dbconfig defensive off' "$DB" "
        PRAGMA writable_schema = ON;
        UPDATE sqlite_schema SET sql = 'CREATE INDEX i ON token (bind_sid COLLATE x)' WHERE name = 'i'" >"$DIR/defensive"
    expect_first error "the database is damaged: no such collation sequence: x"
}

@test "a page that is not one is damage, told on one line and without sending the reader in a circle" {
    many_rows 100
    # The roots of the table and of its index stand on pages 3 and 4; a leaf comes last.
    cp "$DB" "$DIR/sound"
    for page in 3 4 "$(sql "PRAGMA page_count")"; do
        cp "$DIR/sound" "$DB"
        dd if=/dev/zero of="$DB" bs=4096 seek=$((page - 1)) count=1 conv=notrunc status=none
        run_tool doctor
        [ "$status$stderr" = 5 ]
        [[ ${lines[0]} == "error: the database is damaged: "*"age $page: btreeInitPage() returns error code 11"* ]]
        [[ ${lines[0]} != *'\x0a'* ]]
        [ "${lines[1]}" = "    meaning: tokens may be lost or wrong" ]
        [[ $output != *"vemo-access-token doctor"* && $output != *"says how badly"* ]] # that would be itself
    done
}

@test "a table that is not the library's is left to the administrator, and can be replaced" {
    row aaaaaaaa
    row bbbbbbbb
    while IFS='|' read -r old new differences; do
        echo "$new"
        remake "$old" "$new"
        expect_no_repair error "the table of tokens is not the one that the library makes: it $differences" \
            "calls can fail, spend no use, report what did not happen, or take one token for another" "$SAVE_AND_REPLACE"
        [ "$(tool list --sort tid --limit 1 --field tid --show-ids 2>/dev/null)" = "aaaaaaaa$ZEROS" ]
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

@test "the library's table in other words is none of another kind, and what only looks like it is" {
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
    expect_first error "the database says that only a later SQLite can write to it"
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
    [ "${lines[3]}" = "error: several tokens of the same id: 1 token (aaaaaaaa)" ]
    [ "${lines[4]}" = "    meaning: a grant reads one of them and saves another: their uses never end" ]
    [ "${lines[5]}" = "    remedy: revoke them by their whole ids" ]
    [ "${#lines[@]}" -eq 6 ]
    tool revoke "aaaaaaaa$ZEROS"
    save_and_replace
    expect_sound
}

@test "what stands in the place of the table, or lacks columns, is left to the administrator, and can be replaced" {
    row aaaaaaaa
    row bbbbbbbb
    tool export "$DIR/backup"
    made_up="programs read what it makes up, and their changes fail or go elsewhere"
    fails="every call that reads or writes a token fails"
    while IFS='|' read -r statements what meaning; do
        sql "$statements"
        expect_no_repair error "$what" "${!meaning}" "$REPLACE"
        replace_database "$DIR/backup"
        expect_sound
    done <<'TABLE'
ALTER TABLE token RENAME TO other; CREATE VIEW Token AS SELECT * FROM other|a view stands in the place of the table of tokens|made_up
DROP TABLE token; CREATE VIRTUAL TABLE token USING fts4(tid, bind_sid, uid, deadline, count, create_time, function, webapi_allow, extra)|a virtual table stands in the place of the table of tokens|made_up
ALTER TABLE token DROP COLUMN extra; ALTER TABLE token RENAME uid TO owner|the table of tokens lacks columns: uid, extra|fails
TABLE
}

@test "triggers and indexes that take part in changes are left to the administrator, and can be dropped" {
    row aaaaaaaa
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
    run_tool doctor --repair
    [ "$status" -eq 0 ]
}

@test "a large table without an index on the deadline is a finding" {
    many_rows 10001
    expect_no_repair warning "10001 tokens, and no index on their deadline" \
        "every call reads the whole table for expired tokens" "vemo-access-token tune"
    sql "CREATE INDEX of_another_column ON token (function, deadline)"
    expect_first warning "10001 tokens, and no index on their deadline"
    sql "DROP INDEX of_another_column; CREATE INDEX own ON token (deadline)"
    expect_sound
    sql "DROP INDEX own; DELETE FROM token WHERE rowid = 1"
    expect_sound
}

# --- journals

@test "a journal that was left behind is a finding, and undone by looking" {
    kept="SELECT function, count(*) FROM token GROUP BY 1; PRAGMA integrity_check"
    meaning="a program or the machine stopped in the middle of a change"
    half_change
    touch -d "1 hour ago" "$DB-journal"
    expect_finding warning "$REAL_DB-journal was left behind" "$meaning" \
        "none needed: reading the database has just undone the half change"
    [ "$(ls -A "$VEMO_REDIRECT_DIR")" = vemo-access-token.db ]
    [ "$(sql "$kept" | xargs)" = "VPN|40 ok" ]
    expect_sound

    cp "$DIR/half" "$DB"
    cp "$DIR/half-journal" "$DB-journal"
    touch -d "1 hour ago" "$DB-journal"
    expect_repair "$REAL_DB-journal was left behind" "$meaning"
    [ "$(sql "$kept" | xargs)" = "VPN|40 ok" ]

    # A journal of just now can belong to a program that is running.
    cp "$DIR/half" "$DB"
    cp "$DIR/half-journal" "$DB-journal"
    touch -d "1 hour" "$DB-journal"
    expect_sound
    [ "$(sql "$kept" | xargs)" = "VPN|40 ok" ]
}

@test "an old journal that is empty, or that its program has ended, holds no half change" {
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
    expect_sound
    [ "$(sql "SELECT function FROM token")" = changed ]
}

@test "a write-ahead journal that does not belong to the database is left to the administrator, and not mixed into it" {
    row aaaaaaaa
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

    install -m 0700 /dev/stdin "$DB-wal" <<<journal
    printf '\002' | dd of="$DB" bs=1 seek=18 conv=notrunc status=none # which says how it is written to, not read
    expect_no_repair warning "$REAL_DB-wal does not belong to the database" \
        "the database was copied or replaced without it, and may lack changes" \
        "if the database is complete, remove it while no program runs"
    [ "$(cat "$DB-wal")" = journal ]
}

# --- tokens

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
    findings=$(cat <<'END'
error: no whole number where there should be one in 4 tokens (number-1, number-2, number-3, number-4)
    meaning: it is read as another number, 0 for a word: deadline or uses are not what they seem
    remedy: revoke them, or update what is wrong
error: a uid that is no user's in 3 tokens (uid-high, uid-last, uid-less)
    meaning: programs take the lower 32 bits of it for the owner: 4294967296 is root's
    remedy: revoke them
warning: an id of fewer than 127 bytes in 1 token (short---)
    meaning: it was not made by the library, and may be guessed
    remedy: revoke them, and create others
error: a NUL byte in a text of 1 token (nul-byte)
    meaning: programs see what stands before it, and no look-up by that field finds such a token
    remedy: revoke them
warning: an empty purpose in 1 token (empty---)
    meaning: no call deletes such a token by its purpose
    remedy: revoke them, and create others
warning: a deadline of 0 or less in 2 tokens (never--0, never--1)
    meaning: there is no value for "never": the next purge deletes them
    remedy: update --ttl gives them time
error: no JSON object where there should be one in 8 tokens (object-1, object-2, object-3, object-4, object-5, ...)
    meaning: such a token opens nothing, or only what stands before the fault, or cannot be saved with a use less
    remedy: revoke them, or update --allow and --extra
error: lists of methods that hold an array or an object in 2 tokens (nested-1, nested-2)
    meaning: the library throws an exception where it should grant or refuse, which ends a program that does not catch it
    remedy: revoke them, or update --allow
warning: an API without a list of methods in 2 tokens (no-list1, no-list2)
    meaning: it is open to calls that name no method, and to no others
    remedy: revoke them, or update --allow
warning: JSON of more than 100 levels in 2 tokens (deep---1, deep---2)
    meaning: a program that reads such a token in a thread of a small stack crashes: 64 KiB have room for that many levels, 128 KiB for twice as many
    remedy: revoke them, or update --allow and --extra
END
    )
    ends 5 "$findings" doctor
    ends 5 "$findings" doctor --repair
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
    row sound
    condition="typeof(tid) = 'text' AND (tid = '' OR instr(tid, char(0)))"
    remedy="sqlite3 $REAL_DB \"DELETE FROM token WHERE $condition\""
    for value in "''" "char(0)" "'aaaaaaaa' || char(0) || '$ZEROS'"; do
        row aaaaaaaa "tid = $value"
        run_tool doctor --repair
        [ "$status" -eq 5 ]
        [[ ${lines[0]} == "error: an id that is empty or holds a NUL byte in 1 token ("* ]]
        [ "${lines[1]}" = "    meaning: no call can name such a token: it is listed, but cannot be granted or revoked" ]
        [ "${lines[2]}" = "    remedy: $remedy" ]
        eval "${remedy//"$REAL_DB"/"$DB"}"
        expect_left sound
        expect_sound
    done
}

@test "tokens with a NULL are deleted, and each of them is one finding" {
    rows <<'END'
sound
null---0-long|uid = NULL
null---1|count = NULL
null---2|bind_sid = NULL
null---3|deadline = NULL
null---4|create_time = NULL
null---5|extra = NULL
null---6|webapi_allow = '[]', extra = NULL
null---7|webapi_allow = '[]', uid = NULL
END
    what="a NULL in 8 tokens (null---0, null---1, null---2, null---3, null---4, ...)"
    meaning="such a token cannot be read or granted, and every listing that meets it fails"
    expect_finding error "$what" "$meaning" "delete them: vemo-access-token doctor --repair"
    expect_repair "$what" "$meaning"
    expect_left sound
}

@test "texts are made of bytes in place of a text, which no look-up finds" {
    what="bytes where there should be a text in 3 tokens (bytes-1x, bytes-2x, bytes-3x)"
    meaning="no look-up by that field finds such a token"
    rows <<'END'
sound
bytes-1x|tid = tid || 'x'
bytes-2x|bind_sid = bind_sid || 'x'
bytes-3x|function = function || 'x'
END
    sql "SELECT *, typeof(tid), typeof(bind_sid), typeof(function) FROM token" >"$DIR/texts"
    sql "UPDATE token SET tid = CAST(tid AS BLOB) WHERE tid LIKE 'bytes-1%';
         UPDATE token SET bind_sid = CAST(bind_sid AS BLOB) WHERE tid LIKE 'bytes-2%';
         UPDATE token SET function = CAST(function AS BLOB) WHERE tid LIKE 'bytes-3%'"
    expect_finding error "$what" "$meaning" "make texts of them: vemo-access-token doctor --repair"
    expect_repair "$what" "$meaning"
    sql "SELECT *, typeof(tid), typeof(bind_sid), typeof(function) FROM token" | diff "$DIR/texts" -

    # They stay as they are where the text is the id of another token.
    sql "INSERT INTO token SELECT CAST(tid AS BLOB), 's', uid, deadline, count, create_time, function, webapi_allow, extra
         FROM token WHERE tid LIKE 'sound%'"
    sql ".dump" >"$DIR/before"
    run_tool doctor --repair
    [ "$status $stderr" = "5 vemo-access-token: cannot repair: $REAL_DB failed: UNIQUE constraint failed: token.tid" ]
    sql ".dump" | diff "$DIR/before" -
}

@test "a backlog of expired tokens is purged, but not what was meant to last for ever" {
    backlog="expired for more than an hour: 6 tokens (expired1, expired2, expired3, expired4, expired5, ...)
    meaning: no program has called since, or its purges fail"
    never='warning: a deadline of 0 or less in 1 token (meant-to)
    meaning: there is no value for "never": the next purge deletes them
    remedy: update --ttl gives them time'
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
    run_tool doctor
    expect 5 "$never
warning: $backlog
    remedy: vemo-access-token purge"
    run_tool doctor --repair
    expect 5 "repaired: $backlog
$never"
    expect_left meant-to-last sound
}

# --- how it is told

@test "findings come as JSON, and say what was repaired" {
    rows <<'END'
aaaaaaaa|deadline = 1
bbbbbbbb|deadline = 0
END
    never='{"finding":"a deadline of 0 or less in 1 token (bbbbbbbb)","meaning":"there is no value for \"never\": the next purge deletes them","remedy":"update --ttl gives them time","repaired":false,"severity":"warning"}'
    old='{"finding":"expired for more than an hour: 1 token (aaaaaaaa)","meaning":"no program has called since, or its purges fail","remedy":"vemo-access-token purge","repaired":false,"severity":"warning"}'
    mode="{\"finding\":\"$REAL_DB has mode 0750\",\"meaning\":\"$NOT_PRIVATE\",\"remedy\":\"chmod 0700 $REAL_DB\",\"repaired\":false,\"severity\":\"error\"}"
    chmod 0750 "$DB"
    run_tool doctor -o jsonl
    expect 5 "$mode
$never
$old"
    run_tool doctor -o json
    [ "$status$stderr" = 5 ]
    [ "$(sqlite3 :memory: "SELECT json('${output//\'/\'\'}')")" = "[$mode,$never,$old]" ]
    chmod 0700 "$DB"
    run_tool doctor --repair --output jsonl
    expect 5 "${old/false/true}
$never"
    sql "DELETE FROM token"
    row aaaaaaaa "deadline = 1"
    gives "${old/false/true}" doctor --repair -o jsonl
}

@test "control characters of a finding are made visible" {
    row $'a\e[31mb' "deadline = 1"
    expect_first warning 'expired for more than an hour: 1 token (a\x1b[31mb0)'
}
