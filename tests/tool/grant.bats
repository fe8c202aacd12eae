#!/usr/bin/env bats
# grant

load common

ROW="'session-1', 0, 9999999999, 5, 1000000000, 'VPN',
     '{\"Api\":{\"method\":[\"get\",\"list\"]},\"Bare\":{\"method\":[]}}', '{\"n\":[0.5,\"ü\"]}'"

# rows: what there is, but for the order that a saved token loses
rows()
{
    sql "SELECT * FROM token ORDER BY tid"
}

# count NAME: the uses left of a token, or nothing if it is gone
count()
{
    sql "SELECT count FROM token WHERE tid = '$1$ZEROS'"
}

@test "a grant spends one use, and changes nothing else" {
    row token---
    row most---- "count = 9223372036854775807"
    row another-
    before=$(rows)
    run_tool grant "token---$ZEROS" Api get
    expect 0 granted
    run_tool grant "most----$ZEROS" Api list
    expect 0 granted
    sql "UPDATE token SET count = count + 1 WHERE tid NOT LIKE 'another%'"
    [ "$(rows)" = "$before" ]
    # Without a method, too, and down to the last use.
    for arguments in Bare Api "Api ''" "Api get"; do
        eval "run_tool grant 'token---$ZEROS' $arguments"
        expect 0 granted
    done
    [ "$(count token---)" = 1 ]
}

@test "the last use deletes the token, and 0 is a last use like 1" {
    row last---- "count = 1"
    row none---- "count = 0"
    row another-
    for name in last---- none----; do
        run_tool grant "$name$ZEROS" Api get
        expect 0 granted
        run_tool grant "$name$ZEROS" Api get
        expect 1 "" "vemo-access-token: refused: unknown token"
    done
    [ "$(sql "SELECT tid FROM token")" = "another-$ZEROS" ]
}

@test "a grant leaves a token without limit as it is" {
    row endless- "count = -1"
    row lower--- "count = -9223372036854775808"
    before=$(rows)
    for name in endless- lower---; do
        run_tool grant "$name$ZEROS" Api get
        expect 0 granted
    done
    [ "$(rows)" = "$before" ]
}

@test "a refused grant says why, as check does, and spends nothing" {
    row token---
    row no-text- "webapi_allow = ''"
    row entry--- "webapi_allow = '{\"Api\":1}'"
    row method-- "webapi_allow = '{\"Api\":{\"method\":[{}]}}'"
    row extra--- "extra = '[]'"
    row last---- "count = 1"
    before=$(rows)
    while IFS='|' read -r arguments reason; do
        run_tool check $arguments
        expect 1 "refused: $reason"
        run_tool grant $arguments
        expect 1 "" "vemo-access-token: refused: $reason"
        run_tool grant --print-user $arguments
        expect 1 "" "vemo-access-token: refused: $reason"
    done <<END
token---$ZEROS Api put|method not listed
token---$ZEROS Bare get|method not listed
token---$ZEROS Other get|API not listed
token---$ZEROS Other|API not listed
last----$ZEROS api get|API not listed
unknown-$ZEROS Api get|unknown token
no-text-$ZEROS Api get|malformed token
entry---$ZEROS Api get|malformed token
method--$ZEROS Api get|malformed token
extra---$ZEROS Api get|malformed token
END
    [ "$(rows)" = "$before" ]
}

@test "a malformed token can be granted where the library grants it" {
    # Neither is saved, so nothing looks at the extra data.
    row endless- "count = -1, extra = '[]'"
    row last---- "count = 1, extra = ''"
    row entry--- "webapi_allow = '{\"Api\":1}'"
    for name in endless- last---- entry---; do
        run_tool grant "$name$ZEROS" Api
        expect 0 granted
    done
    [ "$(sql "SELECT tid, count, extra FROM token ORDER BY tid")" = "endless-$ZEROS|-1|[]
entry---$ZEROS|4|{\"n\":[0.5,\"ü\"]}" ]
}

@test "a grant needs the whole id" {
    row token---
    before=$(rows)
    local tid hint
    while IFS='|' read -r tid hint; do
        run_tool grant "$tid" Api get
        expect 1 "" "vemo-access-token: refused: unknown token$hint"
        run_tool grant - Api get <<<"$tid"
        expect 1 "" "vemo-access-token: refused: unknown token$hint"
    done <<END
token---|; a grant needs the whole id
token---${ZEROS%0}|; a grant needs the whole id
token---${ZEROS}0|
t|; a grant needs the whole id
TOKEN---$ZEROS|
token---%|; a grant needs the whole id
END
    [ "$(rows)" = "$before" ]
}

@test "a grant purges expired tokens, also when it refuses" {
    row token---
    row past---- "deadline = strftime('%s') - 5, count = -1"
    row never--- "deadline = -1"
    row soon---- "deadline = strftime('%s') + 600"
    run_tool grant "token---$ZEROS" Api get
    expect 0 granted
    [ "$(sql "SELECT substr(tid, 1, 8), count FROM token ORDER BY tid")" = "soon----|5
token---|4" ]

    row zero---- "deadline = 0"
    run_tool grant "token---$ZEROS" Api put
    expect 1 "" "vemo-access-token: refused: method not listed"
    [ "$(sql "SELECT substr(tid, 1, 8), count FROM token ORDER BY tid")" = "soon----|5
token---|4" ]
}

@test "of an expired token, grant says that it has expired, as check does" {
    row expired- "deadline = strftime('%s') - 5"
    run_tool check "expired-$ZEROS" Api get
    expect 1 "refused: expired"
    run_tool grant "expired-$ZEROS" Api get
    expect 1 "" "vemo-access-token: refused: expired"
    # It was purged by that.
    [ "$(rows)" = "" ]
    run_tool grant "expired-$ZEROS" Api get
    expect 1 "" "vemo-access-token: refused: unknown token"
}

@test "--print-user prints the owner's name" {
    row root----
    row nobody-- "uid = 65534, count = 1"
    run_tool grant "root----$ZEROS" Api get --print-user
    expect 0 root
    run_tool grant --print-user "nobody--$ZEROS" Api
    expect 0 nobody
    [ "$(sql "SELECT tid, count FROM token")" = "root----$ZEROS|4" ]
}

@test "an owner without a name is a failure after the use was spent, as for programs" {
    row token--- "uid = 4294967294"
    run_tool grant "token---$ZEROS" Api get --print-user
    expect 4 "" "vemo-access-token: granted, but there is no user of the number 4294967294"
    [ "$(count token---)" = 4 ]
    run_tool grant "token---$ZEROS" Api get
    expect 0 granted
    [ "$(count token---)" = 3 ]
}

@test "grant takes an id from standard input" {
    row token---
    run_tool grant - Api get <<<"token---$ZEROS"
    expect 0 granted
    run_tool grant - Api get --print-user < <(printf '\n%s' "token---$ZEROS")
    expect 0 root
    [ "$(count token---)" = 3 ]
    run_tool grant - Api get < <(printf '%0100000d' 0)
    expect 1 "" "vemo-access-token: refused: unknown token"
}

@test "ids, APIs and methods may hold anything" {
    odd=$'\' OR 1=1; --"\\\n\e\xc3\xa4\xff'
    tid=$odd$ZEROS
    tool init
    tool create --uid 0 --function VPN --tid "$tid" --uses 3 --allow "$odd:$odd" --allow list:create >"$DIR/tid"
    run_tool grant "$tid" "$odd" "$odd"
    expect 0 granted
    run_tool grant "$tid" "$odd"
    expect 0 granted
    run_tool grant "$tid" "$odd" "$odd "
    expect 1 "" "vemo-access-token: refused: method not listed"
    [ "$(sql "SELECT count FROM token")" = 1 ]
    # Names of commands are names like others.
    run_tool grant "$tid" list create
    expect 0 granted
    [ "$(rows)" = "" ]
}

@test "grant refuses arguments that it cannot use, and purges nothing then" {
    row token---
    row expired- "deadline = -1"
    before=$(rows)
    while IFS='|' read -r arguments input sentence; do
        eval "run_tool grant $arguments" < <(printf "$input")
        expect 2 "" "vemo-access-token: $sentence"
    done <<END
||TID is required
token---$ZEROS||API is required
token---$ZEROS ''||API: must not be empty
'' Api||TID: the id is empty
token---$ZEROS Api get put||unexpected argument "put"
token---$ZEROS Api --field||unknown option "--field"
- Api||TID: there is no id on standard input
- Api|\n\n|TID: there is no id on standard input
- Api|token---$ZEROS\ntoken---$ZEROS\n|TID: there is more than one id on standard input
- Api|token---$ZEROS\0|TID: an id on standard input holds a NUL byte
END
    [ "$(rows)" = "$before" ]
}

@test "a grant gives JSON, with the token as it was, but for its id" {
    local form record
    row token---
    for form in json jsonl; do
        record=$(tool show token--- -o jsonl | sed "s/\"tid\":\"[^\"]*\",//")
        run_tool grant "token---$ZEROS" Api get -o $form
        expect 0 "{\"granted\":true,\"reason\":\"\",\"token\":$record}"
    done
    [ "$(count token---)" = 3 ]
    record=${record/:4,/:3,}
    run_tool grant "token---$ZEROS" Api get -o json --print-user
    expect 0 "{\"granted\":true,\"reason\":\"\",\"token\":$record,\"user\":\"root\"}"
    run_tool grant "token---$ZEROS" Api put -o json --print-user
    expect 1 '{"granted":false,"reason":"method not listed"}'
    run_tool grant token--- Api get -o json
    expect 1 '{"granted":false,"reason":"unknown token"}'
    [ "$(count token---)" = 2 ]
    VEMO_TEST_LOOKUP=0 run_tool grant "token---$ZEROS" Api -o json --print-user
    expect 4 "" "vemo-access-token: granted, but there is no user of the number 0"
    # The last one is told as it was, too.
    run_tool grant "token---$ZEROS" Api get -o json
    expect 0 "{\"granted\":true,\"reason\":\"\",\"token\":${record/:3,/:1,}}"
    [ "$(count token---)" = "" ]
}
