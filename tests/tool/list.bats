#!/usr/bin/env bats
# list, and what the commands on tokens say of a store that they cannot use

load common

# lists "NAME NAME..." ARGUMENTS...: these tokens, in this order
lists()
{
    run_tool list --field tid "${@:2}"
    expect 0 "${1// /$'\n'}"
}

# at SECONDS: as tables show a time
at()
{
    date -d "@$1" '+%Y-%m-%d %H:%M:%S'
}

@test "list shows a table, by deadline, ids masked" {
    now=$(date +%s)
    row later--- "deadline = $((now + 200000)), count = -1, uid = 4294967294, bind_sid = 'session-1'"
    row expired- "deadline = $((now - 9000)), count = 0, function = 'File share',
        webapi_allow = '{\"A\":{\"method\":[]},\"B\":{\"method\":[\"m\",\"n\"]}}'"
    row soon---- "deadline = $((now + 9000)), count = 12345, uid = 65534"
    run_tool list
    expect 0 "\
TID       USER        FUNCTION         USES  DEADLINE             EXPIRES          SESSION    ALLOWS
expired-  root        File share          0  $(at $((now - 9000)))  expired 2 h ago             A B:m,n
soon----  nobody      VPN             12345  $(at $((now + 9000)))  in 2 h                      Api:get
later---  4294967294  VPN         unlimited  $(at $((now + 200000)))  in 2 d           session-1  Api:get"
    run_tool list --no-header
    [ "$output" = "$(tool list | tail -n +2)" ]
}

@test "where there are no tokens, list says so and succeeds" {
    tool init
    run_tool list
    expect 0 "" "vemo-access-token: no token matches"
    run_tool list -o json
    expect 0 "[]" "vemo-access-token: no token matches"
    run_tool list -o jsonl
    expect 0 "" "vemo-access-token: no token matches"
    run_tool list --field uid
    expect 0 "" "vemo-access-token: no token matches"
    run_tool list --count
    expect 0 0
    row token---
    run_tool list --function Other
    expect 0 "" "vemo-access-token: no token matches"
}

@test "times are in local time, in UTC or in seconds" {
    row winter-- "deadline = strftime('%s', '2099-01-25 09:00:00')"
    row summer-- "deadline = strftime('%s', '2099-07-23 09:00:00')"
    row before-- "deadline = -1"
    columns='s/.* 1  (.*)  (in|expired) .*/\1/'
    [ "$(tool list --no-header | sed -E "$columns")" = "\
1970-01-01 00:59:59
2099-01-25 10:00:00
2099-07-23 11:00:00" ]
    [ "$(TZ=America/New_York tool list --no-header | sed -E "$columns")" = "\
1969-12-31 18:59:59
2099-01-25 04:00:00
2099-07-23 05:00:00" ]
    [ "$(tool list --no-header --utc | sed -E "$columns")" = "\
1969-12-31 23:59:59Z
2099-01-25 09:00:00Z
2099-07-23 09:00:00Z" ]
    [ "$(tool list --no-header --epoch | sed -E "$columns; s/ *\$//")" = "\
-1
4073014800
4088480400" ]
}

@test "deadlines beyond the calendar are shown too" {
    row latest-- "deadline = 9223372036854775807"
    row earliest "deadline = -9223372036854775808"
    run --separate-stderr bash -c '"$0" list --no-header | sed -E "s/[0-9]{5} d/NNNNN d/"' "$TOOL"
    expect 0 "\
earliest  root  VPN  1  @-9223372036854775808  expired                 Api:get
latest--  root  VPN  1  @9223372036854775807   in 1067519911NNNNN d    Api:get"
}

@test "-o json and jsonl give whole records, ids masked" {
    row first--- "deadline = 9000000001, extra = '{\"n\":[1,0.5,null]}', bind_sid = 'session-1', count = -1"
    row second-- "deadline = 9000000002, webapi_allow = '{}', uid = 4294967294"
    first='{"bind_sid":"session-1","count":-1,"create_time":1000000000,"deadline":9000000001,"extra":{"n":[1,0.5,null]},"function":"VPN","tid":"first---","uid":0,"webapi_allow":{"Api":{"method":["get"]}}}'
    second='{"bind_sid":"","count":1,"create_time":1000000000,"deadline":9000000002,"extra":{},"function":"VPN","tid":"second--","uid":4294967294,"webapi_allow":{}}'
    run_tool list -o jsonl
    expect 0 "$first
$second"
    # Nothing of a table's makes a difference.
    run_tool list --output=jsonl --no-header --utc
    expect 0 "$first
$second"
    run_tool list -o json
    [ "$status" -eq 0 ]
    [ "$stderr" = "" ]
    [ "${#lines[@]}" -gt 10 ]
    printf %s "$output" >"$DIR/json"
    [ "$(sqlite3 :memory: "SELECT json(CAST(readfile('$DIR/json') AS TEXT))")" = "[$first,$second]" ]
}

@test "--field gives one field as it is stored, a line for each token" {
    row first--- "deadline = 9000000001, bind_sid = 'a b'"
    row second-- "deadline = 9000000002, count = -1, extra = '{\"a\":\"ü\"}'"
    while IFS='|' read -r field first second; do
        run_tool list --utc --field "$field"
        expect 0 "$first
$second"
    done <<'END'
tid|first---|second--
uid|0|0
deadline|9000000001|9000000002
count|1|-1
create_time|1000000000|1000000000
function|VPN|VPN
webapi_allow|{"Api":{"method":["get"]}}|{"Api":{"method":["get"]}}
extra|{}|{"a":"ü"}
END
    run --keep-empty-lines --separate-stderr tool list --field bind_sid
    [ "$output" = $'a b\n\n' ]
    # It is stronger than a form.
    run_tool list --field count -o json
    expect 0 "1
-1"
}

@test "--show-ids shows whole ids, in every form" {
    row token---
    run_tool list --show-ids --field tid
    expect 0 "token---$ZEROS"
    [[ "$(tool list --show-ids --no-header)" == "token---$ZEROS  root  "* ]]
    [[ "$(tool list --show-ids -o jsonl)" == *"\"tid\":\"token---$ZEROS\""* ]]
    [[ "$(tool list --show-ids -o json)" == *"\"tid\" : \"token---$ZEROS\""* ]]
}

@test "a masked id is 8 characters, not bytes" {
    row aÄÄÄÄÄÄÄÄ
    run_tool list --field tid
    expect 0 "aÄÄÄÄÄÄÄ"
    export LC_ALL=C.UTF-8
    [[ "$(tool list --no-header)" == "aÄÄÄÄÄÄÄ  root  "* ]]
    [[ "$(tool list -o jsonl)" == *'"tid":"aÄÄÄÄÄÄÄ"'* ]]
}

@test "list selects by owner, purpose and session, alone and together" {
    row a------- "uid = 0"
    row b------- "uid = 65534"
    row c------- "uid = 65534, function = 'Other'"
    row d------- "uid = 65534, function = 'Other', bind_sid = 's1'"
    row e------- "uid = 4294967294, bind_sid = 's1'"
    lists "a------- b------- c------- d------- e-------"
    lists a------- --uid 0
    lists a------- --user root
    lists "b------- c------- d-------" --user nobody
    lists e------- --uid 4294967294
    lists "c------- d-------" --function Other
    lists "d------- e-------" --bind-sid s1
    lists "a------- b------- c-------" --bind-sid ''
    lists "c------- d-------" --uid 65534 --function Other
    lists d------- --user nobody --function Other --bind-sid s1
    lists b------- --uid 65534 --function VPN --bind-sid ''
    run_tool list --function '' --field tid
    expect 0 "" "vemo-access-token: no token matches"
    run_tool list --function other --field tid
    expect 0 "" "vemo-access-token: no token matches"
}

@test "an option with nothing behind its equals sign is given the empty text, not the next argument" {
    row a------- "bind_sid = '--count'"
    row b-------
    run_tool list --bind-sid= --count
    expect 0 1
    lists b------- --bind-sid=
}

@test "what is selected by is text, not SQL" {
    odd="x' OR '1'='1"
    row a------- "function = '${odd//\'/\'\'}'"
    row b------- "bind_sid = '%', function = '${odd//\'/\'\'}\"'"
    lists a------- --function "$odd"
    lists b------- --function "$odd\""
    lists b------- --bind-sid %
    run_tool list --bind-sid "$odd" --field tid
    expect 0 "" "vemo-access-token: no token matches"
}

@test "list selects what has expired and what soon will, alone and together" {
    now=$(date +%s)
    row a------- "deadline = -1"
    row b------- "deadline = $((now - 100)), function = 'Other'"
    row c------- "deadline = $((now + 1800)), function = 'Other'"
    row d------- "deadline = $((now + 9000))"
    row e-------
    lists "a------- b-------" --expired
    lists c------- --expiring 1h
    lists "c------- d-------" --expiring 3h
    lists "c------- d------- e-------" --expiring 365250d
    lists "a------- b------- c-------" --expired --expiring 3600
    lists b------- --expired --function Other
    lists "b------- c-------" --expired --expiring 3h --function Other --uid 0
    run_tool list --expiring 60s
    expect 0 "" "vemo-access-token: no token matches"
}

@test "list selects by time of creation, by what a token opens, by its uses and by owners that are gone" {
    row a------- "uid = 4294967294, create_time = 1999999999, webapi_allow = '{\"A\":{\"method\":[]}}'"
    row b------- "create_time = 2000000000, count = -1,
        webapi_allow = '{\"A\":{\"method\":[\"m\",\"n\"]},\"B\":{\"method\":[\"m\"]}}'"
    row c------- "create_time = 2000000001, count = -7, webapi_allow = '{\"B\":{\"method\":[\"n\"]}}'"
    row d------- "uid = 4294967293, deadline = 1, webapi_allow = '{\"A\":{\"method\":[\"m\"]}}'"
    while IFS='|' read -r names arguments; do
        names=${names//?/&------- }
        echo "$arguments"
        eval "lists '${names% }' --sort tid $arguments"
    done <<'END'
ad|--created-before @2000000000
abd|--created-before @2000000001
abd|--created-before '2033-05-18 03:33:21Z'
abd|--created-before '2033-05-18 05:33:21'
bc|--created-after @2000000000
c|--created-after 2033-05-18T03:33:21Z
b|--created-after @2000000000 --created-before @2000000001
abd|--opens A
bd|--opens A:m
b|--opens A:m,n
b|--opens A:n --opens B:m
bc|--opens B
ad|--no-owner
bc|--unlimited
d|--no-owner --expired
b|--unlimited --opens A:m
c|--unlimited --created-after @2000000001 --opens B:n --uid 0 --function VPN --bind-sid ''
END
    for arguments in "--opens a" "--opens A:M" "--opens A:m:n" "--no-owner --unlimited" \
        "--created-after @2000000000 --created-before @2000000000"; do
        run_tool list --field tid $arguments
        expect 0 "" "vemo-access-token: no token matches"
    done
    run_tool list --count --no-owner --opens A:m
    expect 0 1
}

@test "a token opens nothing where that cannot be read" {
    for stored in '' 'no JSON' '[]' 'null' '"A"' '{"A":1}' '{"A":{}}' '{"A":{"method":"m"}}' '{"A":{"method":[["m"]]}}' \
        "$(printf '{"A":%.0s' {1..1001})1$(printf '}%.0s' {1..1001})"; do
        n=$((n + 1))
        row "$(printf 'at%06d' $n)" "webapi_allow = '$stored'"
    done
    run_tool list --count --opens A:m
    expect 0 0
    # The API alone, whatever stands there: as for a grant.
    lists "at000006 at000007 at000008 at000009 at000010" --opens A --sort tid
    local tid allowed=
    for tid in at0000{01..10}; do
        [ "$(tool check $tid A m)" = "refused: malformed token" ]
        [ "$(tool check $tid A)" != allowed ] || allowed+=" $tid"
    done
    [ "$allowed" = " at000006 at000007 at000008 at000009 at000010" ]
}

@test "no owner is taken for gone when users cannot be looked up" {
    row token---
    VEMO_TEST_LOOKUP=5 run_tool list --no-owner
    expect 4 "" "vemo-access-token: the user of the number 0 could not be looked up: Input/output error"
}

@test "CSV holds every value as it is" {
    row a------- "deadline = 4073014800, create_time = 4073014801, function = 'a \"b\", c', bind_sid = 'x' || char(10) || 'y',
        extra = '{\"note\":\"of mine\"}'"
    row b------- "uid = 4294967294, deadline = 4073014802, count = -1, webapi_allow = '{}'"
    run_tool list -o csv --utc --columns tid,user,function,uses,deadline,session,allows
    expect 0 'tid,user,function,uses,deadline,session,allows
a-------,root,"a ""b"", c",1,2099-01-25 09:00:00Z,"x
y",Api:get
b-------,4294967294,VPN,unlimited,2099-01-25 09:00:02Z,"",""'
    run_tool list -o csv --no-header --epoch --columns created,note,extra,uid --limit 1
    expect 0 '4073014801,of mine,"{""note"":""of mine""}",0' "vemo-access-token: 1 of 2 tokens are shown"
    run_tool list -o csv --show-ids
    [ "${lines[0]}" = "tid,user,function,uses,deadline,expires,session,allows" ]
    [[ ${lines[1]} == "a-------$ZEROS,root,"* ]]
    run_tool list -o csv --uid 7
    expect 0 "" "vemo-access-token: no token matches"
}

@test "--columns chooses those of a table" {
    row a------- "extra = '{\"note\":7}'"
    row b------- "extra = '[]', deadline = 99999999999"
    run_tool list --columns uses,note,tid
    expect 0 "\
USES  NOTE  TID
   1  7     a-------
   1        b-------"
    run_tool list --columns uid,uid --no-header
    expect 0 $'0  0\n0  0'
    refuses list --columns uid <<END
-o json|--columns is for tables and CSV
--field function|--columns is for tables and CSV
END
}

@test "--count counts what is selected, and says no more" {
    row a------- "deadline = -1"
    row b-------
    row c------- "function = 'Other'"
    run_tool list --count
    expect 0 3
    run_tool list --count --expired
    expect 0 1
    run_tool list --count --function VPN --uid 0
    expect 0 2
    run_tool list --count --function None
    expect 0 0
    # All there are, whatever would be shown of them.
    run_tool list --count --limit 1 --sort tid --no-header --show-ids --epoch
    expect 0 3
}

@test "--sort sorts by any field, as its kind demands, and keeps the order of equals" {
    row d------- "bind_sid = 'b', uid = 100, deadline = 9000000003, count = 10, create_time = 5, function = 'B',
        webapi_allow = '{\"A\":{\"method\":[\"m\"]}}', extra = '{\"n\":10}'"
    row c------- "uid = 9, deadline = 9000000001, count = -1, create_time = 40, function = 'a',
        webapi_allow = '{}', extra = '{}'"
    row b------- "bind_sid = 'a', uid = 10, deadline = 9000000004, count = 2, create_time = 300, function = 'Ä',
        webapi_allow = '{\"A\":{\"method\":[]},\"B\":{\"method\":[]}}', extra = '{\"n\":9}'"
    row a------- "bind_sid = 'b', uid = 9, deadline = 9000000002, count = -7, create_time = 6, function = 'b',
        webapi_allow = '{\"A\":{\"method\":[]}}', extra = '{\"n\":\"\"}'"
    while read -r field order; do
        order=${order//?/&------- }
        lists "${order% }" --sort "$field"
    done <<'END'
tid abcd
bind_sid cbda
uid cabd
deadline cadb
count bdca
create_time dacb
function dcab
webapi_allow dbac
extra adbc
tid:desc dcba
bind_sid:desc dabc
uid:desc dbca
deadline:desc bdac
count:desc cadb
create_time:desc bcad
function:desc bacd
END
    lists "c------- a------- d------- b-------"
}

@test "a count without limit sorts behind the largest number" {
    row a------- "count = -1"
    row b------- "count = 9223372036854775806"
    row c------- "count = 0"
    lists "c------- b------- a-------" --sort count
    lists "a------- b------- c-------" --sort count:desc
}

@test "--limit shows the first, and says on standard error how many there are" {
    row a------- "deadline = 9000000002"
    row b------- "deadline = 9000000001"
    row c------- "deadline = 9000000003, function = 'Other'"
    note="vemo-access-token: 1 of 3 tokens are shown"
    run_tool list --limit 1 --field tid
    expect 0 b------- "$note"
    run_tool list --limit 1 --sort deadline:desc --field function
    expect 0 Other "$note"
    run_tool list --limit 1 --no-header
    [ "$status" -eq 0 ]
    [ "${#lines[@]}" -eq 1 ]
    [[ $output == "b-------  root  VPN "* ]]
    [ "$stderr" = "$note" ]
    run_tool list --limit 2 -o jsonl
    [ "${#lines[@]}" -eq 2 ]
    [ "$stderr" = "vemo-access-token: 2 of 3 tokens are shown" ]
    run_tool list --limit 1 --function VPN --field tid
    expect 0 b------- "vemo-access-token: 1 of 2 tokens are shown"
    # Nothing is left out, nothing is said.
    lists "b------- a------- c-------" --limit 3
    lists "b------- a------- c-------" --limit 9223372036854775807
}

@test "list refuses options that it cannot use" {
    refuses list <<'END'
more|unexpected argument "more"
--unknown|unknown option "--unknown"
--uid 0 --user root|--uid excludes --user
--uid root|--uid: "root" is not a number from 0 to 4294967294
--uid '0 or 1=1'|--uid: "0 or 1=1" is not a number from 0 to 4294967294
--uid 4294967295|--uid: "4294967295" is not a number from 0 to 4294967294
--user no-such-user|--user: there is no user "no-such-user"
--limit ''|--limit: "" is not a number from 1 to 9223372036854775807
--expiring 0|--expiring: "0" is not a duration: write 90s, 15m, 8h, 2d12h or 1w
--expiring soon|--expiring: "soon" is not a duration: write 90s, 15m, 8h, 2d12h or 1w
--sort colour|--sort: "colour" is not a field of a token
--sort tid:asc|--sort: "tid:asc" is not a field of a token
--sort :desc|--sort: ":desc" is not a field of a token
--sort ''|--sort: "" is not a field of a token
--limit 0|--limit: "0" is not a number from 1 to 9223372036854775807
--limit -1|--limit: "-1" is not a number from 1 to 9223372036854775807
--limit ten|--limit: "ten" is not a number from 1 to 9223372036854775807
--limit 9223372036854775808|--limit: "9223372036854775808" is not a number from 1 to 9223372036854775807
--created-before soon|--created-before: "soon" is not a time: write 2026-12-31, "2026-12-31 23:59", 2026-12-31T23:59:59Z or @1798761599
--created-after ''|--created-after: "" is not a time: write 2026-12-31, "2026-12-31 23:59", 2026-12-31T23:59:59Z or @1798761599
--opens :m|--opens: ":m" names no API: write API or API:METHOD,METHOD
--opens A:|--opens: "A:" has an empty method: write API or API:METHOD,METHOD
--columns ''|--columns: "" is not a column: tid, user, function, uses, deadline, expires, session, allows, uid, created, note, extra
--columns tid,|--columns: "" is not a column: tid, user, function, uses, deadline, expires, session, allows, uid, created, note, extra
--columns name|--columns: "name" is not a column: tid, user, function, uses, deadline, expires, session, allows, uid, created, note, extra
-o xml|--output: "xml" is not a form: table, json, jsonl or csv
-o JSON|--output: "JSON" is not a form: table, json, jsonl or csv
--field name|--field: "name" is not a field of a token
--sort tid --sort uid|--sort: can be given once only
--limit|--limit: needs a value
--utc --epoch|--utc excludes --epoch
END
}

@test "texts come through exactly in JSON, and harmless in tables" {
    export LC_ALL=C.UTF-8
    text=$'a\'b"c\\d\\x41\ne\tf\e[31m\xc2\x9bÄ漢\xff'
    tool init
    tool create --uid 0 --function "$text" --bind-sid "$text" --allow "$text:$text" >"$DIR/tid"
    # What is not UTF-8 stays as it is stored, for what reads it to decide.
    json=$'a\'b\\"c\\\\d\\\\x41\\ne\\tf\\u001b[31m\\u009bÄ漢\xff'
    run_tool list -o jsonl
    [[ $output == "{\"bind_sid\":\"$json\","*",\"function\":\"$json\","*",\"webapi_allow\":{\"$json\":{\"method\":[\"$json\"]}}}" ]]
    run_tool list --field function
    expect 0 "$text"
    shown='a'\''b"c\d\x5cx41\x0ae\x09f\x1b[31m\xc2\x9bÄ漢\xff'
    run_tool list --no-header
    [ "$status" -eq 0 ]
    [[ $output == *"  root  $shown  1  "*"  in 24 h  $shown  $shown:$shown" ||
        $output == *"  root  $shown  1  "*"  in 23 h  $shown  $shown:$shown" ]]
}

@test "an allowance that cannot be read as such is shown as JSON" {
    while IFS='|' read -r stored shown; do
        n=$((n + 1))
        row "$(printf 'at%06d' $n)" "webapi_allow = '$stored'"
        [ "$(tool list --no-header | tail -n 1 | sed -E 's/.* d  +//')" = "$shown" ]
    done <<'END'
[]|[]
no JSON|null
{"A":1}|A:1
{"A":{}}|A:{}
{"A":{"method":"m"}}|A:{"method":"m"}
{"A":{"method":[1,{"m":"n"},"o"]},"B":null}|A:1,{"m":"n"},o B:null
END
}

@test "what an error sentence repeats of an argument commands no terminal" {
    tool init
    run_tool list --sort $'a\e[31m\nb\x7f'
    expect 2 "" 'vemo-access-token: --sort: "a\x1b[31m\x0ab\x7f" is not a field of a token'
    # Terminals take the other control characters as commands too: this one like ESC [.
    run_tool list --sort $'Ä\xc2\x9b31m'
    expect 2 "" 'vemo-access-token: --sort: "Ä\xc2\x9b31m" is not a field of a token'
}

@test "list changes nothing: expired tokens stay, the file's bytes too" {
    row a------- "deadline = -1"
    row b------- "deadline = 5, count = 0"
    row c-------
    before=$(state)
    run_tool list
    [ "${#lines[@]}" -eq 4 ]
    lists "a------- b------- c-------"
    run_tool list --expired --count
    expect 0 2
    [ "$(state)" = "$before" ]
}

# all_say SENTENCE: each command that looks for tokens fails with that sentence, and changes nothing.
all_say()
{
    local arguments before
    before=$(state)
    for arguments in list "list --count" "list -o json" "show token---$ZEROS" "show token---" \
        "check token---$ZEROS Api" "grant token---$ZEROS Api" "update token---$ZEROS --uses 2"; do
        run_tool $arguments
        echo "$arguments"
        expect 4 "" "vemo-access-token: $1"
        [ "$(state)" = "$before" ]
    done
}

@test "a missing directory or file is never taken for an empty store, nor made" {
    all_say "there is no directory ${REAL_DB%/*}; \"vemo-access-token init\" makes it"
    mkdir -m 0700 "$VEMO_REDIRECT_DIR"
    all_say "there is no database $REAL_DB; \"vemo-access-token init\" makes it"
}

@test "a file without the table is never taken for an empty store, nor given one" {
    mkdir -m 0700 "$VEMO_REDIRECT_DIR"
    : >"$DB"
    all_say "$REAL_DB has no table of tokens; \"vemo-access-token doctor --repair\" makes it"
    sql "CREATE TABLE other (tid)"
    all_say "$REAL_DB has no table of tokens; \"vemo-access-token doctor --repair\" makes it"
}
