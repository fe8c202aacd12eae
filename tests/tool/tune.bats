#!/usr/bin/env bats
# tune

load common

CREATED='would run: BEGIN IMMEDIATE
would run: CREATE INDEX IF NOT EXISTS token_deadline ON token (deadline)
would run: CREATE INDEX IF NOT EXISTS token_bind_sid ON token (bind_sid)
would run: CREATE INDEX IF NOT EXISTS token_function ON token (function)
would run: COMMIT'
FULL_BAR='[########################################] 100 %'

a_store()
{
    tool init >/dev/null
    sql "INSERT INTO token VALUES ('aaaaaaaa', 's', 0, 9999999999, 1, 0, 'VPN', '{}', '{}'),
                                  ('bbbbbbbb', '', 1000, 1, -1, 0, 'Mail', '{}', '{}')"
}

# indexes: those that were made, and what they are of
indexes()
{
    sql "SELECT list.name || ':' || group_concat(info.name) FROM pragma_index_list('token') AS list,
         pragma_index_info(list.name) AS info WHERE list.origin = 'c' GROUP BY list.name ORDER BY list.name"
}

# without_times: the result, with "T" for each time and one "|" between columns
without_times()
{
    sed -E 's/[0-9]+\.[0-9][0-9] ms/T/g; s/  +/|/g; s/\|$//' <<<"$output"
}

# expect_change INDEX INDEX JOURNAL JOURNAL [OTHERS]: the last run told whether there was an index on the
# deadline (and OTHERS, if they differ) and what the journal was, before and after
expect_change()
{
    [ "$status" -eq 0 ]
    [ "$stderr" = "" ]
    [ "$(without_times)" = "WHAT|BEFORE|AFTER
look for expired tokens, as every call does|T|T
look for a session's tokens|T|T
look for a purpose's tokens|T|T
journal|$3|$4
index token_deadline|$1|$2
index token_bind_sid|${5-$1}|$2
index token_function|${5-$1}|$2
write a small change|T|T" ]
}

# The tokens are as they were.
expect_tokens()
{
    [ "$(sql "SELECT * FROM token ORDER BY tid; PRAGMA integrity_check" | xargs)" = \
        "aaaaaaaa|s|0|9999999999|1|0|VPN|{}|{} bbbbbbbb||1000|1|-1|0|Mail|{}|{} ok" ]
}

@test "tune makes three indexes and says before and after, measured" {
    a_store
    run_tool tune
    expect_change no yes delete delete
    [ "$(indexes | xargs)" = "token_bind_sid:bind_sid token_deadline:deadline token_function:function" ]
    expect_tokens
    run_tool doctor
    [[ $output != *index* ]]
}

@test "what is sorted stays in memory, and goes into no file beside the store" {
    a_store
    sql "INSERT INTO token SELECT hex(randomblob(8)), hex(randomblob(500000)), 0, 9999999999, 1, 0, 'VPN', '{}', '{}'
         FROM (VALUES (1), (2), (3))"
    mkdir "$DIR/temporary"
    touch -d @0 "$DIR/temporary"
    SQLITE_TMPDIR=$DIR/temporary run_tool tune
    expect_change no yes delete delete
    [ "$(stat -c %Y "$DIR/temporary")" -eq 0 ]
}

@test "tune can be run twice" {
    a_store
    tool tune --wal
    run_tool tune
    expect_change yes yes wal wal
    run_tool tune --wal
    expect_change yes yes wal wal
    tool tune --undo
    run_tool tune --undo
    expect_change no no delete delete
    expect_tokens
}

@test "tune --wal sets the write-ahead journal, too" {
    a_store
    run_tool tune --wal
    expect_change no yes delete wal
    [ "$(sql "PRAGMA journal_mode")" = wal ]
    [ "$(stat -c %a "$DB")" = 700 ]
    expect_tokens
    run_tool revoke aaaaaaaa
    expect 0 "1 token revoked"
}

@test "where there can be no write-ahead journal, tune says so and makes no indexes" {
    a_store
    VEMO_TEST_VFS=unix-dotfile run_tool tune --wal # which has no memory that processes share
    expect 4 "" 'vemo-access-token: the journal cannot be made "wal" here'
    [ "$(indexes)" = "" ]
    [ "$(sql "PRAGMA journal_mode")" = delete ]
    expect_tokens
}

@test "what tune has changed when it fails is told" {
    local arguments journal made
    while IFS='|' read -r arguments journal made; do
        a_store
        VEMO_TEST_SYNC=directory run_tool tune $arguments
        expect 4 "" "vemo-access-token: ${REAL_DB%/*}: Input/output error; the change was made, but a power cut can undo it"
        [ "$(sql "PRAGMA journal_mode") $(indexes | wc -l)" = "$journal $made" ]
        rm -r "$VEMO_REDIRECT_DIR"
    done <<'TABLE'
|delete|3
--wal|wal|0
TABLE
    a_store
    VEMO_TEST_SYNC=file run_tool tune
    expect 4 "" "vemo-access-token: $REAL_DB failed: disk I/O error"
    [ "$(indexes)" = "" ]
}

@test "tune --undo takes back what tune did, and nothing else" {
    a_store
    sql "CREATE INDEX own ON token (uid)"
    tool tune --wal
    run_tool tune --undo
    expect_change yes no wal delete
    [ "$(indexes)" = own:uid ]
    [ "$(sql "PRAGMA journal_mode")" = delete ]
    [ "$(ls -A "$VEMO_REDIRECT_DIR")" = vemo-access-token.db ]
    expect_tokens
}

@test "tune keeps what is there of it already" {
    a_store
    sql "CREATE INDEX token_deadline ON token (deadline)"
    run_tool tune
    expect_change yes yes delete delete no
    expect_tokens
}

@test "tune --no-header leaves the titles out" {
    a_store
    run_tool tune --no-header
    [ "$status" -eq 0 ]
    [ "$(without_times | head -n 1)" = "look for expired tokens, as every call does|T|T" ]
    [ "${#lines[@]}" -eq 8 ]
    run_tool tune --no-header --dry-run
    [ "$(without_times | head -n 1)" = "look for expired tokens, as every call does|T" ]
}

@test "tune --dry-run tells what it would do, and changes nothing at all" {
    local mode arguments statements
    a_store
    for mode in delete wal; do
        sql "PRAGMA journal_mode = $mode" >/dev/null
        cp "$DB" "$DIR/before"
        local changed
        changed=$(stat -c %y "$DB")
        while IFS='|' read -r arguments statements; do
            run_tool tune --dry-run $arguments
            [ "$status" -eq 0 ]
            [ "$stderr" = "" ]
            [ "$(without_times)" = "WHAT|NOW
look for expired tokens, as every call does|T
look for a session's tokens|T
look for a purpose's tokens|T
journal|$mode
index token_deadline|no
index token_bind_sid|no
index token_function|no
$(echo -e "$statements")" ]
            cmp "$DB" "$DIR/before"
            [ "$(stat -c %y "$DB")" = "$changed" ]
            [ "$(ls -A "$VEMO_REDIRECT_DIR")" = vemo-access-token.db ]
        done <<TABLE
|${CREATED//$'\n'/\\n}
--wal|would run: PRAGMA journal_mode = wal\\n${CREATED//$'\n'/\\n}
--undo|would run: PRAGMA journal_mode = delete\\nwould run: BEGIN IMMEDIATE\\nwould run: DROP INDEX IF EXISTS token_deadline\\nwould run: DROP INDEX IF EXISTS token_bind_sid\\nwould run: DROP INDEX IF EXISTS token_function\\nwould run: COMMIT
TABLE
    done
}

@test "tune leaves the file's own version number as it is" {
    a_store
    sql "PRAGMA user_version = 7"
    tool tune
    [ "$(sql "PRAGMA user_version")" -eq 7 ]
}

@test "in a large store, what every call looks for is found many times faster" {
    tool init
    sql "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 20000)
         INSERT INTO token SELECT printf('%0127d', i), 's' || i, 0, 9999999999, 1, 0, 'F' || i, '{}', '{}' FROM n"
    run_tool tune --no-header
    [ "$status" -eq 0 ]
    local line before after
    for line in 0 1 2; do
        read -r before after < <(grep -oE '[0-9]+\.[0-9]+' <<<"${lines[line]}" | xargs)
        awk "BEGIN { exit !($before >= 5 * $after) }"
    done
    # What the purge itself does.
    [[ $(sql "EXPLAIN QUERY PLAN DELETE FROM token where deadline < strftime('%s', 'now');") == *"USING "*"INDEX token_deadline (deadline<?)"* ]]
}

# The words of the table are as where there is room.
@test "tune shows a bar on a terminal, however narrow, and only there" {
    a_store
    local on_terminal='
import pexpect, sys
child = pexpect.spawn(sys.argv[1], sys.argv[2:], timeout=30, dimensions=(24, 20))
child.expect(pexpect.EOF)
child.wait()
child.ptyproc.delayafterclose = 0.001
sys.stdout.buffer.write(child.before.replace(b"\r\n", b"\n"))'
    run /usr/bin/python3 -c "$on_terminal" "$TOOL" tune
    [[ $output == $'\rTuning ['*$'\rTuning '"$FULL_BAR"$'\nWHAT '* ]]
    output=WHAT${output#*$'\nWHAT'}
    expect_change no yes delete delete
    run /usr/bin/python3 -c "$on_terminal" "$TOOL" tune --dry-run
    [ "$(without_times | head -n 3)" = "WHAT|NOW
look for expired tokens, as every call does|T
look for a session's tokens|T" ]
    run /usr/bin/python3 -c "$on_terminal" bash -c '"$0" tune 2>"$1" >/dev/null' "$TOOL" "$DIR/stderr"
    [ "$output" = "" ]
    [ ! -s "$DIR/stderr" ]
}

@test "bad arguments of tune end in a sentence that names them" {
    a_store
    cp "$DB" "$DIR/before"
    local arguments sentence
    while IFS='|' read -r arguments sentence; do
        run_tool tune $arguments
        expect 2 "" "vemo-access-token: $sentence"
    done <<'TABLE'
--wal --undo|--wal excludes --undo
--undo --wal --dry-run|--undo excludes --wal
deadline|unexpected argument "deadline"
-o|unknown option "-o"
TABLE
    cmp "$DB" "$DIR/before"
}

@test "tune never takes an unusable store for an empty one, and changes none" {
    local arguments
    for arguments in "" "--dry-run" "--wal" "--undo"; do
        run_tool tune $arguments
        expect 4 "" "vemo-access-token: there is no directory ${REAL_DB%/*}; \"vemo-access-token init\" makes it"
        mkdir -m 0700 "$VEMO_REDIRECT_DIR"
        run_tool tune $arguments
        expect 4 "" "vemo-access-token: there is no database $REAL_DB; \"vemo-access-token init\" makes it"
        [ ! -e "$DB" ]
        : >"$DB"
        run_tool tune $arguments
        expect 4 "" "vemo-access-token: $REAL_DB has no table of tokens; \"vemo-access-token doctor --repair\" makes it"
        [ ! -s "$DB" ]
        echo "no database, but a text that is long enough to be told from an empty one" >"$DB"
        cp "$DB" "$DIR/text"
        run_tool tune $arguments
        expect 4 "" "vemo-access-token: $REAL_DB is not a token database, or is damaged (file is not a database)"
        cmp "$DB" "$DIR/text"
        rm -r "$VEMO_REDIRECT_DIR"
    done
}
