#!/usr/bin/env bats
# How the gate is started, and what it finds then.

setup()
{
    [ "$(id -u)" -eq 0 ] || skip "only root can start the gate as another user"
    command -v curl >/dev/null || skip "there is no curl"
    dir=$BATS_TEST_TMPDIR
    chmod 0755 "$dir"
    export VEMO_REDIRECT_DIR=$dir/session
    "$VEMO_TEST_TOOL" init >/dev/null
    id=$("$VEMO_TEST_TOOL" create --user root --function web --ttl 1h --uses 2 --allow Example.File:get)
    gate=("$VEMO_TEST_GATE" --socket "$dir/calls" --user nobody)
}

teardown()
{
    if [ -n "${pid:-}" ]; then
        kill -KILL "$pid"
        wait "$pid" || true
    fi
}

# status [OPTION...]: of the answer to a call; 000 where there is none
status()
{
    curl -s -o /dev/null -w '%{http_code}' --retry 20 --retry-connrefused --retry-delay 0 --retry-max-time 3 "$@" \
        --unix-socket "$dir/calls" -H "Authorization: Bearer $id" http://gate/grant/Example.File/get || true
}

wait_for_socket()
{
    for ((i = 0; i < 200; ++i)); do
        [ ! -S "$dir/calls" ] || return 0
        sleep 0.01
    done
}

# end: the exit status after SIGTERM
end()
{
    kill "$pid"
    code=0
    for ((i = 0; i < 300; ++i)); do
        kill -0 "$pid" 2>/dev/null || break
        sleep 0.01
    done
    if kill -0 "$pid" 2>/dev/null; then
        echo still there
        return
    fi
    wait "$pid" || code=$?
    echo $code
}

@test "it serves and ends without standard streams" {
    (exec "${gate[@]}" 3>&- 0<&- 1>&- 2>&-) &
    pid=$!
    wait_for_socket
    [ "$(status)" = 200 ]
    chmod 0666 "$dir/session.lock" # which it logs
    [ "$(status --retry 0)" = 503 ]
    chmod 0600 "$dir/session.lock"
    [ "$(status)" = 200 ]
    ended=$(end)
    [ "$ended" != "still there" ]
    pid=
}

@test "a log that nobody reads does not end it" {
    mkfifo "$dir/log"
    exec {reader}<>"$dir/log"
    (exec "${gate[@]}" 3>&- 2>"$dir/log" {reader}<&-) &
    pid=$!
    wait_for_socket
    exec {reader}<&-
    chmod 0666 "$dir/session.lock"
    [ "$(status --retry 0)" = 503 ]
    chmod 0600 "$dir/session.lock"
    [ "$(status)" = 200 ]
}

@test "the time that it waits for locks ends with the last call that waits" {
    (exec "${gate[@]}" 3>&- --status-socket "$dir/status") &
    pid=$!
    wait_for_socket
    [ "$(status)" = 200 ]
    exec {lock}<>"$dir/session.lock"
    flock "$lock"
    [ "$(status --retry 0 -m 0.2)" = 000 ] # and takes the call back
    flock -u "$lock"
    sleep 1
    [ "$(status)" = 200 ]
    sleep 1.2 # figures are as old as that
    waited=$(curl -s --unix-socket "$dir/status" http://gate/metrics | sed -n 's/^vemo_gate_wait_seconds_total //p')
    awk -v waited="$waited" 'BEGIN { exit !(0.1 < waited && waited < 0.9) }'
}

@test "what cannot be a header's name is refused" {
    for name in '' 'X-Once:' 'X Once' 'Xé'; do
        run timeout 5 "${gate[@]}" --once-header "$name"
        [ "$status" -eq 2 ]
        [ "$output" = "vemo-access-token-gate: \"$name\" is no name of a header" ]
    done
}

@test "calls and status cannot share a socket" {
    run timeout 5 "${gate[@]}" --status-socket "$dir/calls"
    [ "$status" -eq 2 ]
    [ "$output" = "vemo-access-token-gate: --socket and --status-socket name the same path" ]
}
