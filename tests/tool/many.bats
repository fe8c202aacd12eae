#!/usr/bin/env bats
# Many tokens: how much memory the commands take, and how long they delay other programs

load common

TOKENS=30000

setup_file() {
    export VEMO_REDIRECT_DIR=$BATS_FILE_TMPDIR/many
    "$VEMO_TEST_TOOL" init >/dev/null
    sqlite3 "$VEMO_REDIRECT_DIR/vemo-access-token.db" "PRAGMA journal_mode = OFF; PRAGMA synchronous = OFF;
        WITH RECURSIVE number(n) AS (SELECT 1 UNION ALL SELECT n + 1 FROM number WHERE n < $TOKENS)
        INSERT INTO token SELECT printf('%08d%0192d', n * 7919 % 99999989, n), iif(n % 3, '', 'session-' || (n % 100)), n % 50,
            9999999999 - n % 1000, n % 10, 1000000000 + n, 'purpose ' || (n % 20),
            '{\"Example.File\":{\"method\":[\"get\",\"list\"]},\"Example.Page\":{\"method\":[\"get\"]}}', '{}' FROM number;
        PRAGMA journal_mode = DELETE" >/dev/null
    "$VEMO_TEST_TOOL" export "$BATS_FILE_TMPDIR/exported" 2>/dev/null
}

# beside ARGUMENTS...: runs the tool, with 64 MB in all, beside a program that creates a token each 20 ms. Each creation
# is made, and none waits for a second.
beside() {
    local creations calls longest there
    coproc creations { exec "$VEMO_TEST_CREATIONS"; }
    local pid=$!
    exec 4<&"${creations[0]}"
    status=0
    (ulimit -v 64000 && exec "$TOOL" "$@") >"$DIR/output" 2>"$DIR/stderr" 3>&- 4<&- || status=$?
    eval "exec ${creations[1]}>&-"
    read -r calls longest <&4
    exec 4<&-
    there=$(sql "SELECT count(*) FROM token WHERE function = 'beside-$pid'")
    echo "$*: status $status; $calls creations, $there there, the longest $longest ms; $(head -3 "$DIR/stderr")"
    [ "$there" = "$calls" ]
    [ "$longest" -lt 1000 ]
}

@test "reading many tokens takes little memory and holds nobody up" {
    cp -a --sparse=never "$BATS_FILE_TMPDIR/many" "$VEMO_REDIRECT_DIR"
    while read -r lines arguments; do
        # shellcheck disable=SC2086 # several arguments
        beside $arguments
        [ $status -eq 0 ] || [ "$arguments $status" = "doctor 5" ]
        # Each token that is there throughout, once.
        [ "$lines" = - ] || [ "$(grep -v beside- "$DIR/output" | sort | uniq | wc -l)" = "$lines" ]
        [ "$lines" = - ] || [ "$(grep -vc beside- "$DIR/output")" = "$lines" ]
    done <<END
1 list --count
$TOKENS list -o jsonl --show-ids
11 list --limit 10 --sort create_time:desc --created-before @1100000000
$((TOKENS + 1)) list --columns tid,uses,function
- stats
$((TOKENS + 1)) export
- doctor
END
}

@test "changing many tokens goes in steps, which can be repeated" {
    cp -a --sparse=never "$BATS_FILE_TMPDIR/many" "$VEMO_REDIRECT_DIR"
    beside revoke --created-before @1000010000 --yes
    [ "$(cat "$DIR/output")" = "9999 tokens revoked" ]
    [ "$(sql "SELECT count(*) FROM token WHERE create_time < 1000010000")" = 0 ]
    sql "SELECT tid FROM token WHERE function LIKE 'purpose %' LIMIT 5000" >"$DIR/ids"
    beside revoke - < <(cat "$DIR/ids" && echo 0none-such && head -n 1 "$DIR/ids" | cut -c 1-20)
    [ "$(cat "$DIR/output" "$DIR/stderr")" = "5000 tokens revoked
vemo-access-token: 1 id is unknown" ]
    fails 2 "TID: there are more than 100000 ids; revoke them some at a time, or by what they have in \
common" revoke - < <(yes none-such | head -n 100001)
    fails 2 "$BATS_FILE_TMPDIR/exported: more than 10000 tokens would hold all programs up; nothing of \
this file was imported; --in-steps lets them through" import "$BATS_FILE_TMPDIR/exported"
    beside import --in-steps "$BATS_FILE_TMPDIR/exported"
    [ "$(cat "$DIR/output")" = "14999 tokens imported; 15001 tokens there already" ]
    sql "DELETE FROM token"
    VEMO_TEST_SYNC=directory run_tool import --in-steps - < <(head -n 4500 "$BATS_FILE_TMPDIR/exported" && echo none)
    expect 4 "" "vemo-access-token: /usr/vemo/etc/private/session: Input/output error; the change was made, but a power cut can \
undo it; 0 tokens imported before that; the command can be repeated without harm"
    [ "$(sql "SELECT count(*) FROM token")" = 4000 ]
    sql "DELETE FROM token"
    run_tool import --in-steps - < <(head -n 4500 "$BATS_FILE_TMPDIR/exported" && echo none)
    [[ "$status $stderr" == "2 vemo-access-token: standard input: line 4501 is not "*"; 4000 tokens imported before that; the \
command can be repeated without harm" && $stderr != *nothing* ]]
    gives "26000 tokens imported; 4000 tokens there already" import --in-steps "$BATS_FILE_TMPDIR/exported"
    [ "$(sql "SELECT count(*) FROM token WHERE function LIKE 'purpose %'")" = $TOKENS ]
    sql "UPDATE token SET deadline = 5 WHERE create_time < 1000015000"
    beside doctor --repair
    [ $status -eq 5 ]
    [ "$(sql "SELECT count(*) FROM token WHERE create_time < 1000015000")" = 0 ]
    beside purge
    [ "$(cat "$DIR/output")" = "0 tokens purged" ]
}

@test "large tokens take little memory, too" {
    many_rows 900 "extra = '{\"a\":\"' || rowid || printf('%0100000d', 1) || '\"}'" # 90 MB
    [ "$(ulimit -v 80000 && "$TOOL" export 2>/dev/null | wc -l)" = 901 ]
    (ulimit -v 80000 && "$TOOL" doctor >/dev/null)
}
