#!/usr/bin/env bats
# init

load common

@test "init makes the directory, the file and the table, and finds them the next time" {
    gives "made the directory $REAL_DIRECTORY
made the file $REAL_DB
made the table of tokens" init
    expect_made
    cp "$DB" "$DIR/made"
    gives "all was there already" init
    cmp "$DB" "$DIR/made"
    gives "no findings" doctor
}

@test "the modes are those of private files whatever the umask" {
    for mask in 0000 0077 0277 0777; do
        rm -rf "$VEMO_REDIRECT_DIR"
        run --separate-stderr bash -c 'umask "$1" && "$0" init' "$TOOL" "$mask"
        [ "$status" -eq 0 ]
        expect_made
    done
}

@test "init makes the file or the table where only they are missing, and leaves all else as it is" {
    mkdir -m 0750 "$VEMO_REDIRECT_DIR"
    gives "made the file $REAL_DB
made the table of tokens" init
    [ "$(stat -c %a "$VEMO_REDIRECT_DIR")" = 750 ]
    chmod 0700 "$VEMO_REDIRECT_DIR"
    expect_made
    install -m 0700 /dev/null "$DB"
    gives "made the table of tokens" init
    expect_made
    rm "$DB"
    sql "CREATE TABLE other (a); INSERT INTO other VALUES (1)"
    gives "made the table of tokens" init
    [ "$(sql "SELECT a FROM other")" -eq 1 ]
    row expired- "deadline = 1"
    gives "all was there already" init
    expect_left expired-
}

@test "init and create leave a database alone that a link leads to, and say so where it has no table" {
    mkdir -m 0700 "$VEMO_REDIRECT_DIR"
    sqlite3 "$DIR/other" "CREATE TABLE other (a)"
    cp "$DIR/other" "$DIR/untouched"
    ln -s "$DIR/other" "$DB"
    for arguments in init "create --uid 0 --function f"; do
        run_tool $arguments
        [ "$status" -eq 4 ]
        cmp "$DIR/other" "$DIR/untouched"
    done
    : >"$DIR/other"
    fails 4 "$REAL_DB is a symbolic link, and what it leads to has no table of tokens; find out who made it" init
    [ ! -s "$DIR/other" ]
}

@test "init says why it cannot make what is missing, and what a power cut can undo" {
    while IFS='|' read -r call act sentence; do
        rm -rf "$VEMO_REDIRECT_DIR"
        VEMO_TEST_CALLS="$call|$act" run_tool init
        [ "$status $stderr" = "4 vemo-access-token: $sentence" ]
        [ ! -e "$DB" ]
    done <<TABLE
open /|24|/: Too many open files
mkdirat session|30|$REAL_DIRECTORY: Read-only file system
mkdirat session|touch $VEMO_REDIRECT_DIR|$REAL_DIRECTORY: Not a directory
openat .|24|$REAL_DIRECTORY: Too many open files; the change was made, but a power cut can undo it
fsync|5|$REAL_DIRECTORY: Input/output error; the change was made, but a power cut can undo it
openat vemo-access-token.db|28|$REAL_DB: No space left on device
TABLE
}

@test "init does not say that it made what another program makes in the same moment" {
    tool init
    cp -p "$DB" "$DIR/made"
    while IFS='|' read -r call command output_then; do
        rm -r "$VEMO_REDIRECT_DIR"
        VEMO_TEST_CALLS="$call|$command" gives "$(printf '%b' "$output_then")" init
    done <<TABLE
mkdirat session|mkdir -m 0700 $VEMO_REDIRECT_DIR|made the file $REAL_DB\nmade the table of tokens
openat vemo-access-token.db|cp -p $DIR/made $DB|made the directory $REAL_DIRECTORY
TABLE
    expect_made
}

@test "init says what has the name of the table, and makes no table" {
    while IFS='|' read -r statement sentence; do
        rm -rf "$VEMO_REDIRECT_DIR"
        tool init
        sql "DROP TABLE token; $statement"
        sql .schema >"$DIR/before"
        fails 4 "$REAL_DB $sentence" init
        [ "$(sql .schema)" = "$(cat "$DIR/before")" ]
    done <<'TABLE'
CREATE TABLE other (tid); CREATE VIEW token AS SELECT * FROM other|has a view in the place of the table of tokens; "vemo-access-token doctor" tells what helps
CREATE VIRTUAL TABLE Token USING fts4(tid)|has a virtual table in the place of the table of tokens; "vemo-access-token doctor" tells what helps
CREATE TABLE other (tid); CREATE INDEX token ON other (tid)|failed: there is already an index named token
TABLE
}

@test "init says what it made although the rest fails" {
    install -m 0644 /dev/null "$VEMO_REDIRECT_DIR.lock"
    run_tool init
    expect 4 "made the directory $REAL_DIRECTORY" "vemo-access-token: /run/vemo-access-token.lock is not root's alone, and others could hold the lock for ever; remove it while no program that uses tokens runs"
    rm -r "$VEMO_REDIRECT_DIR"
    chmod 0600 "$VEMO_REDIRECT_DIR.lock"
    VEMO_TEST_HASTE=1 run --separate-stderr flock "$VEMO_REDIRECT_DIR.lock" "$TOOL" init
    [ "$status" -eq 4 ]
    [ "$output" = "made the directory $REAL_DIRECTORY" ]
    [[ $stderr == *" stayed locked by flock (process "*") for 5 seconds" ]] # and not that nothing was changed
}

@test "init makes no table before the file is on the disk, and says what a power cut can undo" {
    sentence="$REAL_DIRECTORY: Input/output error; the change was made, but a power cut can undo it"
    mkdir -m 0700 "$VEMO_REDIRECT_DIR"
    VEMO_TEST_SYNC=directory fails 4 "$sentence" init
    [ -f "$DB" ]
    [ ! -s "$DB" ]
    VEMO_TEST_SYNC=directory fails 4 "$sentence" init
    [ -s "$DB" ]
}
