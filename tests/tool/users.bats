#!/usr/bin/env bats
# Users by name: the user database does not have the name, or it fails.

load common

@test "a user database that fails is not the same as one without the user" {
    row token---
    before=$(state)
    while IFS='|' read -r errno status sentence; do
        for command in "create --function VPN" list "revoke --yes"; do
            VEMO_TEST_LOOKUP=$errno fails "$status" "$sentence" $command --user root
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

@test "grant spends the use, and says whether the user database failed or the owner has no name" {
    for errno in 0 2 3; do
        row "none---$errno" "count = 2, uid = 4000000000"
        VEMO_TEST_LOOKUP=$errno fails 4 "granted, but there is no user of the number 4000000000" \
            grant "none---$errno$ZEROS" Api --print-user
    done
    row failing- "count = 2"
    VEMO_TEST_LOOKUP=5 fails 4 "granted, but the user of the number 0 could not be looked up: Input/output error" \
        grant "failing-$ZEROS" Api --print-user
    [ "$(sql "SELECT DISTINCT count FROM token")" = 1 ]
}

@test "the entry of a user may be long" {
    row token---
    VEMO_TEST_LOOKUP=34 gives 1 list --user root --count # ERANGE, while the buffer is short
}

@test "listings show the number of a user who cannot be looked up" {
    row token--- "uid = 65534"
    VEMO_TEST_LOOKUP=5 succeeds list --no-header
    [[ $output == "token---  65534  VPN "* ]]
    VEMO_TEST_LOOKUP=5 succeeds show token---
    [[ $output == *$'\nuid           65534\n'* ]]
    VEMO_TEST_LOOKUP=5 succeeds stats
    [[ $output == *$'\n65534             1' ]]
}
