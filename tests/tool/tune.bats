#!/usr/bin/env bats
# tune

load common

CREATED='would run: BEGIN IMMEDIATE
would run: CREATE INDEX IF NOT EXISTS token_deadline ON token (deadline)
would run: CREATE INDEX IF NOT EXISTS token_bind_sid ON token (bind_sid)
would run: CREATE INDEX IF NOT EXISTS token_function ON token (function)
would run: COMMIT'

a_store() {
    rows <<'END'
aaaaaaaa|bind_sid = 's'
bbbbbbbb|uid = 1000, deadline = 1, count = -1, function = 'Mail'
END
    EXPECTED_TOKENS=$(sql "SELECT * FROM token ORDER BY tid")
}

# indexes: those that were made, and what they are of
indexes() {
    sql "SELECT list.name || ':' || group_concat(info.name) FROM pragma_index_list('token') AS list,
         pragma_index_info(list.name) AS info WHERE list.origin = 'c' GROUP BY list.name ORDER BY list.name"
}

# without_times: the result, with "T" for each time and one "|" between columns
without_times() {
    sed -E 's/[0-9]+\.[0-9][0-9] ms/T/g; s/  +/|/g; s/\|$//' <<<"$output"
}

# expect_change INDEX INDEX JOURNAL JOURNAL [OTHERS [OTHERS]]: the last run told whether there was an index on the
# deadline (and OTHERS, if they differ) and what the journal was, before and after
expect_change() {
    [ "$status$stderr" = 0 ]
    [ "$(without_times)" = "WHAT|BEFORE|AFTER
look for expired tokens, as every call does|T|T
look for a session's tokens|T|T
look for a purpose's tokens|T|T
journal|$3|$4
index token_deadline|$1|$2
index token_bind_sid|${5-$1}|${6-$2}
index token_function|${5-$1}|${6-$2}
write a small change|T|T" ]
}

# The tokens are as they were.
expect_tokens() {
    [ "$(sql "SELECT * FROM token ORDER BY tid; PRAGMA integrity_check")" = "$EXPECTED_TOKENS
ok" ]
}

@test "tune makes three indexes, and measures before and after" {
    a_store
    run_tool tune
    expect_change no yes delete delete
    [ "$(indexes | xargs)" = "token_bind_sid:bind_sid token_deadline:deadline token_function:function" ]
    expect_tokens
    run_tool doctor
    [[ $output != *index* ]]
}

@test "tune can be run twice" {
    a_store
    sql "PRAGMA user_version = 7" # the file's own
    tool tune --wal
    run_tool tune
    expect_change yes yes wal wal
    run_tool tune --wal
    expect_change yes yes wal wal
    tool tune --undo
    run_tool tune --undo
    expect_change no no delete delete
    expect_tokens
    [ "$(sql "PRAGMA user_version")" -eq 7 ]
}

@test "tune --deadline-only makes the index that grants need, and drops the others" {
    a_store
    for before in no yes; do
        run_tool tune --deadline-only
        expect_change $before yes delete delete $before no
        [ "$(indexes)" = token_deadline:deadline ]
        tool tune
    done
    expect_tokens
}

@test "tune --wal sets the write-ahead journal, too" {
    a_store
    run_tool tune --wal
    expect_change no yes delete wal
    [ "$(sql "PRAGMA journal_mode")" = wal ]
    [ "$(stat -c %a "$DB")" = 700 ]
    expect_tokens
    gives "1 token revoked" revoke aaaaaaaa
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
    while IFS='|' read -r arguments journal made; do
        a_store
        VEMO_TEST_SYNC=directory run_tool tune $arguments
        expect 4 "" "vemo-access-token: $REAL_DIRECTORY: Input/output error; the change was made, but a power cut can undo it"
        [ "$(sql "PRAGMA journal_mode") $(indexes | wc -l)" = "$journal $made" ]
        rm -r "$VEMO_REDIRECT_DIR"
    done <<'TABLE'
|delete|3
--wal|wal|0
TABLE
    a_store
    VEMO_TEST_SYNC=file fails 4 "$REAL_DB failed: disk I/O error" tune
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

@test "tune keeps an index that is there already" {
    a_store
    sql "CREATE INDEX token_deadline ON token (deadline)"
    run_tool tune
    expect_change yes yes delete delete no
    expect_tokens
}

@test "tune --no-header leaves the titles out" {
    a_store
    succeeds tune --no-header
    [ "$(without_times | head -n 1)" = "look for expired tokens, as every call does|T|T" ]
    [ "${#lines[@]}" -eq 8 ]
    run_tool tune --no-header --dry-run
    [ "$(without_times | head -n 1)" = "look for expired tokens, as every call does|T" ]
}

@test "tune --dry-run tells what it would do, and changes nothing at all" {
    a_store
    for mode in delete wal; do
        sql "PRAGMA journal_mode = $mode" >/dev/null
        cp "$DB" "$DIR/before"
        changed=$(stat -c %y "$DB")
        while IFS='|' read -r arguments statements; do
            succeeds tune --dry-run $arguments
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
--deadline-only|would run: BEGIN IMMEDIATE\\nwould run: CREATE INDEX IF NOT EXISTS token_deadline ON token (deadline)\\nwould run: DROP INDEX IF EXISTS token_bind_sid\\nwould run: DROP INDEX IF EXISTS token_function\\nwould run: COMMIT
--wal|would run: PRAGMA journal_mode = wal\\n${CREATED//$'\n'/\\n}
--undo|would run: PRAGMA journal_mode = delete\\nwould run: BEGIN IMMEDIATE\\nwould run: DROP INDEX IF EXISTS token_deadline\\nwould run: DROP INDEX IF EXISTS token_bind_sid\\nwould run: DROP INDEX IF EXISTS token_function\\nwould run: COMMIT
TABLE
    done
}

@test "what every call looks for is found by an index" {
    a_store
    tool tune
    [[ $(sql "EXPLAIN QUERY PLAN DELETE FROM token where deadline < strftime('%s', 'now');") == *"USING "*"INDEX token_deadline (deadline<?)"* ]]
    for column in bind_sid function; do
        [[ $(sql "EXPLAIN QUERY PLAN SELECT * FROM token WHERE $column='x';") == *"USING INDEX token_$column ($column=?)"* ]]
    done
}
