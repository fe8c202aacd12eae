#!/usr/bin/env bats
# rotate

load common

ROW="'s ''1''', 4294967294, 9999999999, 5, 1000000000, 'File' || char(10) || 'share', '{ \"Api\":1,\"Api\":2', '[1e400'"

# kept: what a copy keeps of each token, and its own id
kept() {
    sql "SELECT quote(tid), hex(bind_sid), uid, deadline, count, hex(function), hex(webapi_allow), hex(extra) FROM token
         ORDER BY tid" | sed "${1-}"
}

@test "rotate gives a token a fresh id, changes nothing else of it, and prints the id" {
    row token---
    row another-
    before=$(kept "s/^'token---$ZEROS'/'fresh'/")
    now=$(date +%s)
    VEMO_TEST_SYSLOG=$DIR/log succeeds rotate token---
    [[ $output =~ ^[0-9A-Za-z]{127,255}$ ]]
    [[ $(<"$DIR/log") == *" rotate: 1 token created (${output:0:8}...), 1 token deleted (token---...); "* ]]
    [ "$(kept "s/^'$output'/'fresh'/" | sort)" = "$(sort <<<"$before")" ]
    [ "$(sql "SELECT create_time BETWEEN $now AND $(date +%s) FROM token WHERE tid = '$output'")" = 1 ]
    # A whole id, from standard input.
    first=$output
    fails 3 "there is no such token" rotate token---
    succeeds rotate - <<<"$first"
    [ "$(sql "SELECT group_concat(tid, ' ') FROM (SELECT tid FROM token ORDER BY rowid)")" = "another-$ZEROS $output" ]
}

@test "--grace leaves the old token for a time, and never prolongs it" {
    while IFS='|' read -r grace left; do
        rm -rf "$VEMO_REDIRECT_DIR"
        row token--- "deadline = strftime('%s', 'now') + 7200"
        succeeds rotate token--- --grace "$grace"
        [ "$(sql "SELECT round((deadline - strftime('%s', 'now')) / 100.0) FROM token ORDER BY tid = '$output'" | xargs)" = "$left 72.0" ]
        [ "$(sql "SELECT count(DISTINCT hex(webapi_allow) || hex(extra) || count || uid), count(*) FROM token")" = "1|2" ]
        [ "$(sql "SELECT create_time FROM token WHERE tid = 'token---$ZEROS'")" = 1000000000 ]
    done <<'TABLE'
1h|36.0
10m|6.0
2h1m|72.0
365250d|72.0
TABLE
}

# interrupted SQL ARGUMENTS...: rotate, whose result has no room in its pipe; once the change is made, another
# program runs the SQL, and rotate gets a signal
interrupted() {
    local pid change=$1
    shift
    mkfifo "$DIR/pipe"
    exec 9<>"$DIR/pipe"
    head -c 65536 /dev/zero >&9
    "$TOOL" rotate "$@" >&9 2>"$DIR/err" 9>&- 3>&- &
    pid=$!
    until [ "$(sql "SELECT count(*) FROM token WHERE create_time > 1000000000" 2>/dev/null)" = 1 ]; do :; done
    sqlite3 -cmd ".timeout 5000" "$DB" "$change"
    kill "$pid"
    status=0
    wait "$pid" || status=$?
    exec 9>&-
    rm "$DIR/pipe"
    output=
    stderr=$(<"$DIR/err")
    expect 143 "" "vemo-access-token: interrupted; the change was taken back"
}

@test "an interrupt takes the rotation back, but no use that was spent meanwhile" {
    row token---
    before=$(sql "SELECT * FROM token")
    interrupted "" token---
    [ "$(sql "SELECT * FROM token")" = "$before" ]
    interrupted "UPDATE token SET count = count - 1 WHERE tid LIKE 'token%'" token--- --grace 1m
    [ "$(sql "SELECT * FROM token")" = "${before/|5|/|4|}" ]
    # A call that has read the old token writes it back.
    interrupted "INSERT INTO token SELECT 'token---$ZEROS', bind_sid, uid, deadline, 3, 7, function, webapi_allow, extra FROM token" \
        token---
    [ "$(sql "SELECT count, create_time FROM token")" = "3|7" ]
    # The last use of the old token is spent.
    interrupted "DELETE FROM token WHERE tid LIKE 'token%'" token--- --grace 1m
    [ "$(sql "SELECT count(*) FROM token")" = 0 ]
}
