#!/usr/bin/env bats
# create and generate

load common

@test "create prints the id alone, and the library's defaults hold" {
    tool init
    run_tool create --uid 1000 --function VPN
    [ "$status" -eq 0 ]
    [ "$stderr" = "" ]
    [[ $output =~ ^[0-9A-Za-z]{127,255}$ ]]
    [ "$(sql "SELECT bind_sid, uid, deadline - create_time, count, function, webapi_allow, extra FROM token
              WHERE tid = '$output'")" = "|1000|86400|1|VPN|{}|{}" ]
}

@test "create needs an owner" {
    run_tool create --function VPN
    expect 2 "" "vemo-access-token: --uid or --user is required"
}
