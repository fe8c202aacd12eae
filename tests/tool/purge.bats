#!/usr/bin/env bats
# purge

load common

# [deadline=SQL] a_row TID: a token, written behind the tool's back
a_row()
{
    [ -e "$DB" ] || tool init >/dev/null
    sql "INSERT INTO token VALUES ('$1', '', 0, ${deadline-9999999999}, 1, 0, 'VPN', '{}', '{}')"
}

# expect_left TID...: the tokens that are there still, in order
expect_left()
{
    [ "$(sql "SELECT tid FROM token ORDER BY tid" | xargs)" = "$*" ]
}

@test "purge deletes the tokens whose deadline has passed, and says how many" {
    a_row kept
    deadline="strftime('%s', 'now') + 60" a_row kept-for-a-minute
    run_tool purge
    expect 0 "0 tokens purged"
    deadline=-1 a_row minus-one
    run_tool purge
    expect 0 "1 token purged"
    deadline=0 a_row zero
    deadline=-9223372036854775808 a_row least
    deadline="strftime('%s', 'now') - 1" a_row just-passed
    run_tool purge
    expect 0 "3 tokens purged"
    expect_left kept kept-for-a-minute
    run_tool purge
    expect 0 "0 tokens purged"
}

@test "purge takes tokens with uses left and without limit alike" {
    deadline=1 a_row many
    deadline=1 a_row unlimited
    sql "UPDATE token SET count = iif(tid = 'many', 5, -1)"
    run_tool purge
    expect 0 "2 tokens purged"
}

@test "purge --dry-run tells how many and changes nothing" {
    a_row kept
    run_tool purge --dry-run
    expect 0 "0 tokens would be purged"
    deadline=1 a_row one
    run_tool purge --dry-run
    expect 0 "1 token would be purged"
    deadline=-1 a_row two
    cp "$DB" "$DIR/before"
    run_tool purge --dry-run
    expect 0 "2 tokens would be purged"
    cmp "$DB" "$DIR/before"
}

# Where it cannot be made sure of: all that is told of the store must be.
@test "what is told outlasts a power cut, that others changed it too" {
    row token---
    local arguments
    while read -r arguments; do
        # shellcheck disable=SC2086 # several arguments
        VEMO_TEST_SYNC=directory run_tool $arguments
        expect 4 "" "vemo-access-token: ${REAL_DB%/*}: Input/output error; a power cut can undo what others changed last"
    done <<'TABLE'
list
show token---
check token--- Api get
stats
export
purge --dry-run
purge
revoke --dry-run token---
revoke --dry-run --all
revoke unknown-
update unknown- --uses 2
tune --dry-run
TABLE
}

@test "purge gives the space of what it deletes back" {
    tool init
    local size
    size=$(stat -c %s "$DB")
    sql "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 100)
         INSERT INTO token SELECT 'expired' || i, '', 0, 1, 1, 0, 'VPN', '{}', hex(zeroblob(1000)) FROM n"
    [ "$(stat -c %s "$DB")" -gt 200000 ]
    run_tool purge
    expect 0 "100 tokens purged"
    [ "$(stat -c %s "$DB")" -eq "$size" ]
}

@test "bad arguments of purge end in a sentence that names them" {
    deadline=1 a_row expired
    local argument
    for argument in --yes --all; do
        run_tool purge "$argument"
        expect 2 "" "vemo-access-token: unknown option \"$argument\""
    done
    run_tool purge 12345678
    expect 2 "" "vemo-access-token: unexpected argument \"12345678\""
    expect_left expired
}

@test "purge never takes an unusable store for an empty one" {
    local arguments
    for arguments in "" "--dry-run"; do
        run_tool purge $arguments
        expect 4 "" "vemo-access-token: there is no directory ${REAL_DB%/*}; \"vemo-access-token init\" makes it"
        mkdir -m 0700 "$VEMO_REDIRECT_DIR"
        run_tool purge $arguments
        expect 4 "" "vemo-access-token: there is no database $REAL_DB; \"vemo-access-token init\" makes it"
        [ ! -e "$DB" ]
        : >"$DB"
        run_tool purge $arguments
        expect 4 "" "vemo-access-token: $REAL_DB has no table of tokens; \"vemo-access-token doctor --repair\" makes it"
        [ ! -s "$DB" ]
        echo "no database, but a text that is long enough to be told from an empty one" >"$DB"
        cp "$DB" "$DIR/text"
        run_tool purge $arguments
        expect 4 "" "vemo-access-token: $REAL_DB is not a token database, or is damaged (file is not a database)"
        cmp "$DB" "$DIR/text"
        rm -r "$VEMO_REDIRECT_DIR"
    done
}
