#!/usr/bin/env bats
# tune

load common

CREATED='would run: BEGIN IMMEDIATE
would run: CREATE INDEX IF NOT EXISTS token_deadline ON token (deadline)
would run: CREATE INDEX IF NOT EXISTS token_bind_sid ON token (bind_sid)
would run: CREATE INDEX IF NOT EXISTS token_function ON token (function)
would run: COMMIT'

# a_store: of two tokens
a_store() {
    rows <<'END'
aaaaaaaa|bind_sid = 's'
bbbbbbbb|uid = 1000, deadline = 1, count = -1, function = 'Mail'
END
    TOKENS=$(sql "SELECT * FROM token ORDER BY tid")
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

# figures TIMES JOURNAL DEADLINE OTHERS: the lines about the searches, the journal, the index on the deadline and the
# other two indexes, with these columns
figures() {
    printf '%s\n' "look for expired tokens, as every call does|$1" "look for a session's tokens|$1" \
        "look for a purpose's tokens|$1" "journal|$2" "index token_deadline|$3" "index token_bind_sid|$4" \
        "index token_function|$4"
}

# expect_tokens: they are as they were
expect_tokens() {
    [ "$(sql "SELECT * FROM token ORDER BY tid; PRAGMA integrity_check")" = "$TOKENS
ok" ]
}

@test "tune makes the indexes and the journal that it is asked for, and measures before and after" {
    a_store
    sql "PRAGMA user_version = 7; CREATE INDEX own ON token (uid)"
    cp "$DB" "$DIR/store"
    all=token_bind_sid:bind_sid,token_deadline:deadline,token_function:function
    while IFS=/ read -r prepare arguments journal deadline others indexes_then; do
        echo "$prepare, tune $arguments"
        cp "$DIR/store" "$DB"
        eval "$prepare" >"$DIR/prepared"
        succeeds tune $arguments
        [ "$(without_times)" = "WHAT|BEFORE|AFTER
$(figures "T|T" "$journal" "$deadline" "$others")
write a small change|T|T" ]
        [ "$(indexes | paste -sd ,)" = "own:uid${indexes_then:+,$indexes_then}" ]
        [ "$(sql "PRAGMA journal_mode; PRAGMA user_version" | xargs) $(stat -c %a "$DB")" = "${journal#*|} 7 700" ]
        [ "$(ls -A "$VEMO_REDIRECT_DIR")" = vemo-access-token.db ]
        expect_tokens
    done <<TABLE
//delete|delete/no|yes/no|yes/$all
tool tune/--wal/delete|wal/yes|yes/yes|yes/$all
tool tune --wal//wal|wal/yes|yes/yes|yes/$all
tool tune --wal/--wal/wal|wal/yes|yes/yes|yes/$all
tool tune --wal/--undo/wal|delete/yes|no/yes|no/
/--undo/delete|delete/no|no/no|no/
/--deadline-only/delete|delete/no|yes/no|no/token_deadline:deadline
tool tune/--deadline-only/delete|delete/yes|yes/yes|no/token_deadline:deadline
sql "CREATE INDEX token_deadline ON token (deadline)"//delete|delete/yes|yes/no|yes/$all
TABLE
    run_tool doctor
    [[ $output != *index* ]]
    # Five small changes are measured before, and five after. SQLite counts changes.
    count=$(od -An -j27 -N1 -tu1 "$DB")
    succeeds tune --no-header
    [ $((($(od -An -j27 -N1 -tu1 "$DB") - count + 256) % 256)) -eq 10 ]
    [ "$(without_times)" = "$(figures "T|T" "delete|delete" "yes|yes" "yes|yes")
write a small change|T|T" ]
}

@test "tune says why it fails, and what it has changed" {
    a_store
    # This way to work on files has no memory that processes share.
    VEMO_TEST_VFS=unix-dotfile fails 4 'the journal cannot be made "wal" here' tune --wal
    VEMO_TEST_SYNC=file fails 4 "$REAL_DB failed: disk I/O error" tune
    [ "$(indexes)" = "" ]
    [ "$(sql "PRAGMA journal_mode")" = delete ]
    expect_tokens
    cp "$DB" "$DIR/store"
    while IFS='|' read -r arguments journal made; do
        cp "$DIR/store" "$DB"
        VEMO_TEST_SYNC=directory fails 4 \
            "$REAL_DIRECTORY: Input/output error; the change was made, but a power cut can undo it" tune $arguments
        [ "$(sql "PRAGMA journal_mode") $(indexes | wc -l)" = "$journal $made" ]
    done <<'TABLE'
|delete|3
--wal|wal|0
TABLE
}

@test "tune --dry-run prints what it would do, and changes nothing at all" {
    a_store
    for mode in delete wal; do
        sql "PRAGMA journal_mode = $mode" >/dev/null
        cp "$DB" "$DIR/before"
        changed=$(stat -c %y "$DB")
        while IFS='|' read -r arguments statements; do
            succeeds tune --dry-run $arguments
            [ "$(without_times)" = "WHAT|NOW
$(figures T $mode no no)
$(echo -e "$statements")" ]
            cmp "$DB" "$DIR/before"
            [ "$(stat -c %y "$DB")" = "$changed" ]
            [ "$(ls -A "$VEMO_REDIRECT_DIR")" = vemo-access-token.db ]
            tool tune --dry-run --no-header $arguments >"$DIR/bare"
            [ "$(wc -l <"$DIR/bare")" -eq $((${#lines[@]} - 1)) ]
        done <<TABLE
|${CREATED//$'\n'/\\n}
--deadline-only|would run: BEGIN IMMEDIATE\\nwould run: CREATE INDEX IF NOT EXISTS token_deadline ON token (deadline)\\nwould run: DROP INDEX IF EXISTS token_bind_sid\\nwould run: DROP INDEX IF EXISTS token_function\\nwould run: COMMIT
--wal|would run: PRAGMA journal_mode = wal\\n${CREATED//$'\n'/\\n}
--undo|would run: PRAGMA journal_mode = delete\\nwould run: BEGIN IMMEDIATE\\nwould run: DROP INDEX IF EXISTS token_deadline\\nwould run: DROP INDEX IF EXISTS token_bind_sid\\nwould run: DROP INDEX IF EXISTS token_function\\nwould run: COMMIT
TABLE
    done
}
