#!/usr/bin/env bats
# list

load common

# lists "NAME NAME..." ARGUMENTS...: list gives these tokens, in this order
lists() {
    gives "${1// /$'\n'}" list --field tid "${@:2}"
}

# selects [ARGUMENTS...]: each line "LETTERS|ARGUMENTS" of standard input, with those behind, selects these tokens, of one
# letter each. All of the calls change nothing.
selects() {
    local letters arguments before
    before=$(state)
    while IFS='|' read -r letters arguments; do
        if [ "$letters" ]; then
            letters=${letters//?/&------- }
            eval "lists '${letters% }' $arguments $*"
        else
            eval "none_matches --field tid $arguments $*"
        fi
    done
    [ "$(state)" = "$before" ]
}

# none_matches ARGUMENTS...: there is no such token, and nothing is printed, not even the head of a table
none_matches() {
    fails 0 "no token matches" list "$@"
}

# at SECONDS: as tables show a time
at() {
    date -d "@$1" '+%Y-%m-%d %H:%M:%S'
}

@test "list shows a table, by deadline, ids masked" {
    now=$(date +%s)
    row later--- "deadline = $((now + 200000)), count = -1, uid = 4294967294, bind_sid = 'session-1'"
    row expired- "deadline = $((now - 9000)), count = 0, function = 'File share',
        webapi_allow = '{\"A\":{\"method\":[]},\"B\":{\"method\":[\"m\",\"n\"]}}'"
    row soon---- "deadline = $((now + 9000)), count = 12345, uid = 65534"
    gives "\
TID       USER        FUNCTION         USES  DEADLINE             EXPIRES          SESSION    ALLOWS
expired-  root        File share          0  $(at $((now - 9000)))  expired 2 h ago             A B:m,n
soon----  nobody      VPN             12345  $(at $((now + 9000)))  in 2 h                      Api:get
later---  4294967294  VPN         unlimited  $(at $((now + 200000)))  in 2 d           session-1  Api:get" list
    run_tool list --no-header
    [ "$output" = "$(tool list | tail -n +2)" ]
}

@test "where there are no tokens, list says so and succeeds" {
    tool init
    says "[]" "no token matches" list -o json
    for arguments in "" "-o jsonl" "--field uid"; do
        none_matches $arguments
    done
    gives 0 list --count
    row token---
    none_matches --function Other
}

@test "times are in local time, in UTC or in seconds, and beyond the calendar in seconds" {
    rows <<'END'
earliest|deadline = -9223372036854775808
before--|deadline = -1
winter--|deadline = strftime('%s', '2099-01-25 09:00:00')
summer--|deadline = strftime('%s', '2099-07-23 09:00:00')
latest--|deadline = 9223372036854775807
END
    while IFS='|' read -r zone option before winter summer at; do
        TZ=$zone gives "${at}-9223372036854775808
$before
$winter
$summer
${at}9223372036854775807" list --no-header --columns deadline $option
    done <<'TABLE'
Europe/Berlin||1970-01-01 00:59:59|2099-01-25 10:00:00|2099-07-23 11:00:00|@
America/New_York||1969-12-31 18:59:59|2099-01-25 04:00:00|2099-07-23 05:00:00|@
Europe/Berlin|--utc|1969-12-31 23:59:59Z|2099-01-25 09:00:00Z|2099-07-23 09:00:00Z|@
Europe/Berlin|--epoch|-1|4073014800|4088480400|
TABLE
}

@test "-o json and jsonl give whole records, ids masked" {
    row first--- "deadline = 9000000001, extra = '{\"n\":[1,0.5,null]}', bind_sid = 'session-1', count = -1"
    row second-- "deadline = 9000000002, webapi_allow = '{}', uid = 4294967294"
    first='{"bind_sid":"session-1","count":-1,"create_time":1000000000,"deadline":9000000001,"extra":{"n":[1,0.5,null]},"function":"VPN","tid":"first---","uid":0,"webapi_allow":{"Api":{"method":["get"]}}}'
    second='{"bind_sid":"","count":1,"create_time":1000000000,"deadline":9000000002,"extra":{},"function":"VPN","tid":"second--","uid":4294967294,"webapi_allow":{}}'
    gives "$first
$second" list -o jsonl
    # Options for tables make no difference.
    gives "$first
$second" list --output=jsonl --no-header --utc
    succeeds list -o json
    [ "${#lines[@]}" -gt 10 ]
    printf %s "$output" >"$DIR/json"
    [ "$(sqlite3 :memory: "SELECT json(CAST(readfile('$DIR/json') AS TEXT))")" = "[$first,$second]" ]
}

@test "--field gives one field as it is stored, a line for each token" {
    row first--- "deadline = 9000000001, bind_sid = 'a b'"
    row second-- "deadline = 9000000002, count = -1, extra = '{\"a\":\"ü\"}'"
    while IFS='|' read -r field first second; do
        gives "$first
$second" list --utc --field "$field"
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
    # It overrides the form.
    gives "1
-1" list --field count -o json
}

@test "--show-ids shows whole ids, in every form" {
    row token---
    gives "token---$ZEROS" list --show-ids --field tid
    [[ "$(tool list --show-ids --no-header)" == "token---$ZEROS  root  "* ]]
    [[ "$(tool list --show-ids -o jsonl)" == *"\"tid\":\"token---$ZEROS\""* ]]
    [[ "$(tool list --show-ids -o json)" == *"\"tid\" : \"token---$ZEROS\""* ]]
}

@test "every character is shown or escaped as Unicode classifies it, and none is lost" {
    export LC_ALL=C.UTF-8
    visible=$BATS_TEST_DIRNAME/visible.py
    "$visible" all >"$DIR/all"
    row token---
    sql "UPDATE token SET function = CAST(readfile('$DIR/all') AS TEXT)"
    for arguments in "list --no-header" "list -o jsonl"; do
        tool $arguments 2>"$DIR/errors" | "$visible" compare
    done
    # Output for programs keeps a byte that is not UTF-8.
    sql "UPDATE token SET function = function || CAST(x'9b' AS TEXT)"
    printf '\x9b\n' >>"$DIR/all"
    tool list --field function | cmp - "$DIR/all"
}

@test "list selects by owner, purpose and session, alone and together, and by text that is no SQL" {
    rows <<'END'
a-------
b-------|uid = 65534
c-------|uid = 65534, function = 'Other'
d-------|uid = 65534, function = 'Other', bind_sid = 's1'
e-------|uid = 4294967294, bind_sid = 's1'
f-------|uid = 7, function = 'x'' OR ''1''=''1', bind_sid = '--count'
g-------|uid = 7, function = 'x'' OR ''1''=''1"', bind_sid = '%'
END
    selects <<'END'
abcdefg|
a|--uid 0
a|--user root
bcd|--user nobody
e|--uid 4294967294
cd|--function Other
abc|--bind-sid ''
d|--user nobody --function Other --bind-sid s1
|--function other
f|--function "x' OR '1'='1"
g|--function "x' OR '1'='1\""
g|--bind-sid %
|--bind-sid "x' OR '1'='1"
END
    gives 3 list --bind-sid= --count
}

@test "list selects what has expired and what soon will, alone and together" {
    now=$(date +%s)
    rows <<END
a-------|deadline = -1
b-------|deadline = $((now - 100)), function = 'Other'
c-------|deadline = $((now + 1800)), function = 'Other'
d-------|deadline = $((now + 9000))
e-------
END
    selects <<'END'
ab|--expired
c|--expiring 1h
cd|--expiring 3h
cde|--expiring 365250d
abc|--expired --expiring 3600
b|--expired --function Other
bc|--expired --expiring 3h --function Other --uid 0
|--expiring 60s
END
}

@test "list selects by time of creation, by what a token opens, by its uses and by owners that are gone" {
    rows <<'END'
a-------|uid = 4294967294, create_time = 1999999999, webapi_allow = '{"A":{"method":[]}}'
b-------|create_time = 2000000000, count = -1, webapi_allow = '{"A":{"method":["m","n"]},"B":{"method":["m"]}}'
c-------|create_time = 2000000001, count = -7, webapi_allow = '{"B":{"method":["n"]}}'
d-------|uid = 4294967293, deadline = 1, webapi_allow = '{"A":{"method":["m"]}}'
END
    selects --sort tid <<'END'
ad|--created-before @2000000000
abd|--created-before @2000000001
bc|--created-after @2000000000
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
|--opens a
|--opens A:M
|--opens A:m:n
END
    gives 1 list --count --no-owner --opens A:m
}

@test "tokens without an id, which another program's table can hold, hide no others" {
    row token---
    sql "CREATE TABLE other AS SELECT * FROM token; DROP TABLE token; ALTER TABLE other RENAME TO token;
         WITH RECURSIVE number(n) AS (SELECT 1 UNION ALL SELECT n + 1 FROM number WHERE n < 300)
         INSERT INTO token SELECT NULL, $ROW FROM number"
    gives 301 list --count
    fails 4 "$REAL_DB holds a token that cannot be read; \"vemo-access-token doctor\" finds it" list
    gives "301 tokens revoked" revoke --all --yes
}

@test "no owner counts as gone when users cannot be looked up" {
    row token---
    failed="the user of the number 0 could not be looked up:"
    VEMO_TEST_LOOKUP=5 fails 4 "$failed Input/output error" list --no-owner
    VEMO_TEST_LOOKUP=0 fails 4 "$failed /etc/passwd has it, but the user database does not" list --no-owner
    sql "UPDATE token SET uid = 4000000000"
    VEMO_TEST_LOOKUP=0 gives 1 list --no-owner --count
    in_namespace '(tool init && tool create --uid 0 --function VPN --allow Api) >/dev/null && mount -t tmpfs tmpfs /etc &&
        tool revoke --no-owner --yes'
    expect 4 "" "vemo-access-token: $failed /etc/passwd cannot be read: No such file or directory"
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
    none_matches -o csv --uid 7
}

@test "--columns chooses those of a table" {
    row a------- "extra = '{\"note\":7}'"
    row b------- "extra = '[]', deadline = 99999999999"
    gives "\
USES  NOTE  TID
   1  7     a-------
   1        b-------" list --columns uses,note,tid
    gives $'0  0\n0  0' list --columns uid,uid --no-header
}

@test "--count counts what is selected, however many would be shown, and how" {
    rows <<<$'a-------|deadline = -1\nb-------\nc-------|function = \'Other\''
    gives 3 list --count --limit 1 --sort tid --no-header --show-ids --epoch
    gives 2 list --count --function VPN --uid 0
    gives 0 list --count --function None
}

@test "--sort sorts by any field, as its kind demands, and keeps the order of equals" {
    rows <<'END'
d-------|bind_sid = 'b', uid = 100, deadline = 9000000003, count = 10, create_time = 5, function = 'B', webapi_allow = '{"A":{"method":["m"]}}', extra = '{"n":10}'
c-------|uid = 9, deadline = 9000000001, count = -1, create_time = 40, function = 'a', webapi_allow = '{}'
b-------|bind_sid = 'a', uid = 10, deadline = 9000000004, count = 2, create_time = 300, function = 'Ä', webapi_allow = '{"A":{"method":[]},"B":{"method":[]}}', extra = '{"n":9}'
a-------|bind_sid = 'b', uid = 9, deadline = 9000000002, count = -7, create_time = 6, function = 'b', webapi_allow = '{"A":{"method":[]}}', extra = '{"n":""}'
END
    selects <<'END'
abcd|--sort tid
cbda|--sort bind_sid
cabd|--sort uid
cadb|--sort deadline
bdca|--sort count
dacb|--sort create_time
dcab|--sort function
dbac|--sort webapi_allow
adbc|--sort extra
dcba|--sort tid:desc
dabc|--sort bind_sid:desc
cadb|--sort count:desc
cadb|
END
    # Unlimited uses are more than any number.
    sql "UPDATE token SET count = 9223372036854775806 WHERE tid LIKE 'd%'"
    selects <<<"bdca|--sort count"
}

@test "--limit shows the first, and says on standard error how many there are" {
    row a------- "deadline = 9000000002"
    row b------- "deadline = 9000000001"
    row c------- "deadline = 9000000003, function = 'Other'"
    note="1 of 3 tokens are shown"
    says b------- "$note" list --limit 1 --field tid
    says Other "$note" list --limit 1 --sort deadline:desc --field function
    run_tool list --limit 1 --no-header
    [[ $status = 0 && $output == "b-------  root  VPN "* && ${#lines[@]} -eq 1 && $stderr == *": $note" ]]
    says "$(tool list -o jsonl | head -n 2)" "2 of 3 tokens are shown" list --limit 2 -o jsonl
    says b------- "1 of 2 tokens are shown" list --limit 1 --function VPN --field tid
    # If nothing is left out, there is no note.
    lists "b------- a------- c-------" --limit 3
    lists "b------- a------- c-------" --limit 9223372036854775807
}

@test "an allowance that cannot be read as such is shown as JSON" {
    row token---
    while IFS='|' read -r stored shown; do
        sql "UPDATE token SET webapi_allow = '$stored'"
        gives "$shown" list --no-header --columns allows
    done <<'END'
[]|[]
no JSON|null
{"A":1}|A:1
{"A":{}}|A:{}
{"A":{"method":"m"}}|A:{"method":"m"}
{"A":{"method":[1,{"m":"n"},"o"]},"B":null}|A:1,{"m":"n"},o B:null
END
}

@test "tokens whose rows have no numbers are listed and counted" {
    row token-1-
    row token-2- "function = 'Mail'"
    cp "$DB" "$DIR/sound"
    while read -r change; do
        cp "$DIR/sound" "$DB"
        sql "$change"
        for arguments in "" "--sort function:desc" "--limit 2"; do
            [ "$(tool list --field tid $arguments | sort)" = "token-1-"$'\n'"token-2-" ]
        done
        [[ $(tool stats -o jsonl) == *'"tokens":2,'* ]]
    done <<'TABLE'
ALTER TABLE token RENAME TO other; CREATE VIEW token AS SELECT * FROM other
ALTER TABLE token ADD COLUMN RowId TEXT
TABLE
}
