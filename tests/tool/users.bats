#!/usr/bin/env bats
# Users by name: the user database does not have the name, or it fails.

load common

# with_lookup ERRNO ARGUMENTS...: run_tool, where each look-up of a user ends with that
with_lookup() {
    VEMO_TEST_LOOKUP=$1 run_tool "${@:2}"
}

@test "a user database that fails is told from one without the user" {
    row token---
    before=$(state)
    while IFS='|' read -r errno status sentence; do
        for command in "create --function VPN" list "revoke --yes"; do
            with_lookup "$errno" $command --user root
            expect "$status" "" "vemo-access-token: $sentence"
        done
    done <<'END'
0|2|--user: there is no user "root"
2|2|--user: there is no user "root"
3|2|--user: there is no user "root"
1|4|the user "root" could not be looked up: Operation not permitted
5|4|the user "root" could not be looked up: Input/output error
END
    [ "$(state)" = "$before" ]
}

@test "grant spends the use, and tells a user database that fails from an owner without a name" {
    for errno in 0 2 3; do
        row "none---$errno" "count = 2"
        with_lookup $errno grant "none---$errno$ZEROS" Api --print-user
        expect 4 "" "vemo-access-token: granted, but there is no user of the number 0"
    done
    row failing- "count = 2"
    with_lookup 5 grant "failing-$ZEROS" Api --print-user
    expect 4 "" "vemo-access-token: granted, but the user of the number 0 could not be looked up: Input/output error"
    [ "$(sql "SELECT DISTINCT count FROM token")" = 1 ]
}

@test "the entry of a user may be long" {
    row token---
    with_lookup 34 list --user root --count # ERANGE, while the buffer is short
    expect 0 1
}

@test "listings show the number of a user who cannot be looked up" {
    row token--- "uid = 65534"
    with_lookup 5 list --no-header
    [[ $status = 0 && -z $stderr && $output == "token---  65534  VPN "* ]]
    with_lookup 5 show token---
    [[ $status = 0 && -z $stderr && $output == *$'\nuid           65534\n'* ]]
    with_lookup 5 stats
    [[ $status = 0 && -z $stderr && $output == *$'\n65534             1' ]]
}
