#!/usr/bin/env bats
# check

load common

ROW="'', 0, 9999999999, 1, 1000000000, 'VPN',
     '{\"Api\":{\"method\":[\"get\",\"list\"]},\"Bare\":{\"method\":[]}}', '{}'"

# checks: each line "ARGUMENTS|RESULT" of standard input is what check answers for a call; all of them
# change nothing.
checks()
{
    local arguments result before
    before=$(state)
    while IFS='|' read -r arguments result; do
        eval "run_tool check $arguments" </dev/null
        if [ "$result" = allowed ]; then
            expect 0 allowed
        else
            expect 1 "refused: $result"
        fi
    done
    [ "$(state)" = "$before" ]
}

@test "check tells whether a call would be granted, and why not" {
    row token---
    row expired- "deadline = strftime('%s') - 5"
    checks <<END
token---$ZEROS Api get|allowed
token---$ZEROS Api list|allowed
token---$ZEROS Api|allowed
token---$ZEROS Api ''|allowed
token---$ZEROS Bare|allowed
token---$ZEROS Api put|method not listed
token---$ZEROS Bare get|method not listed
token---$ZEROS Other get|API not listed
token---$ZEROS Other|API not listed
expired-$ZEROS Api get|expired
expired-$ZEROS Other|expired
unknown-$ZEROS Api get|unknown token
END
}

@test "names of APIs and methods are compared byte by byte, whatever they are called" {
    row token--- "webapi_allow = '{\"Äpi\":{\"method\":[\"list\",\"-x\",\"a b\",\"\\u001b\\n\"]},\"create\":{\"method\":[]},\"++\":{\"method\":[\"--\"]}}'"
    checks <<'END'
token--- Äpi list|allowed
token--- Äpi 'a b'|allowed
token--- Äpi $'\e\n'|allowed
token--- create|allowed
-- token--- Äpi -x|allowed
-- token--- ++ --|allowed
token--- äpi list|API not listed
token--- A$'\xcc\x88'pi list|API not listed
token--- Äp list|API not listed
token--- 'Äpi ' list|API not listed
token--- Äpi List|method not listed
token--- Äpi lis|method not listed
token--- Äpi list,a|method not listed
token--- create create|method not listed
END
}

@test "the number of uses left refuses nothing" {
    row none---- "count = 0"
    row last---- "count = 1"
    row many---- "count = 9223372036854775807"
    row endless- "count = -1"
    checks <<'END'
none---- Api get|allowed
last---- Api get|allowed
many---- Api get|allowed
endless- Api get|allowed
END
}

@test "a malformed token is told, as far as the call touches what is wrong with it" {
    row no-text- "webapi_allow = ''"
    row array--- "webapi_allow = '[\"Api\"]'"
    row entry--- "webapi_allow = '{\"Api\":1,\"Bare\":{\"method\":[\"get\"]}}'"
    row methods- "webapi_allow = '{\"Api\":{\"method\":\"get\"}}'"
    row method-- "webapi_allow = '{\"Api\":{\"method\":[\"get\",{},\"list\"]}}'"
    # A grant would save it with its uses lowered, the others would not.
    row extra--- "extra = '[]', count = 2"
    row endless- "extra = '[]', count = -1"
    row last---- "extra = '[]', count = 1"
    checks <<'END'
no-text- Api get|malformed token
array--- Api get|malformed token
array--- Api|malformed token
entry--- Api get|malformed token
entry--- Api|allowed
entry--- Bare get|allowed
entry--- Other|API not listed
methods- Api get|malformed token
methods- Api|allowed
method-- Api get|allowed
method-- Api list|malformed token
extra--- Api get|malformed token
extra--- Other get|API not listed
endless- Api get|allowed
last---- Api get|allowed
END
}

@test "-o json and jsonl give the answer as an object" {
    row token---
    for form in json jsonl; do
        run_tool check token--- Api get -o $form
        expect 0 '{"allowed":true,"reason":""}'
        run_tool check token--- Api put --output=$form
        expect 1 '{"allowed":false,"reason":"method not listed"}'
        run_tool check unknown-token Api -o $form
        expect 1 '{"allowed":false,"reason":"unknown token"}'
    done
    run_tool check token--- Api get -o table
    expect 0 allowed
}

@test "check takes an id from standard input, or the beginning of one" {
    row first--- "webapi_allow = '{\"First\":{}}'"
    row second-- "webapi_allow = '{\"Second\":{}}'"
    row second-~
    checks <<END
first--- First|allowed
second--0 Second|allowed
second-~ Api get|allowed
first---1 First|unknown token
END
    run_tool check - First <<<"first---$ZEROS"
    expect 0 allowed
    run_tool check - Second < <(printf '\n%s' second--)
    expect 0 allowed
    run_tool check - Second <<<first---
    expect 1 "refused: API not listed"
    run_tool check - First < <(printf '%0100000d' 0)
    expect 1 "refused: unknown token"
}

@test "check refuses arguments that it cannot use" {
    row second-1
    row second-2 "tid = 'second-1' || 'x'"
    before=$(state)
    while IFS='|' read -r arguments input sentence; do
        eval "run_tool check $arguments" < <(printf "$input")
        expect 2 "" "vemo-access-token: $sentence"
    done <<'END'
||TID is required
second-1||API is required
second-1 ''||API: must not be empty
second-1 '' get||API: must not be empty
'' Api||TID: the id is empty
second Api||TID: "second" is too short: give the id or its first 8 characters, or more
second-1 Api||TID: several tokens begin with "second-1"; give more of the id
second-1 Api get put||unexpected argument "put"
second-1 Api -o xml||--output: "xml" is not a form: table, json or jsonl
second-1 Api --utc||unknown option "--utc"
- Api||TID: there is no id on standard input
- Api|\n|TID: there is no id on standard input
- Api|a\nb\n|TID: there is more than one id on standard input
- Api|second-1\0|TID: an id on standard input holds a NUL byte
END
    [ "$(state)" = "$before" ]
}

@test "check spends and purges nothing" {
    row token--- "count = 1"
    row expired- "deadline = -1"
    row another- "deadline = 0, count = 0"
    before=$(state)
    for arguments in "token--- Api get" "token--- Api" "token--- Other" "expired- Api" "unknown- Api"; do
        run_tool check $arguments
        [ "$(state)" = "$before" ]
    done
}
