#!/usr/bin/env bats
# show, and how ids are given

load common

# shows_at NUMBER ARGUMENTS...: this way of giving an id finds the token of that number.
shows_at()
{
    run_tool show --field create_time "${@:2}"
    expect 0 "$1"
}

@test "show tells all fields, the whole id too" {
    now=$(date +%s)
    row token--- "bind_sid = 'session-1', deadline = $((now + 9000)), count = 12, extra = '{\"a\": [ 1 ]}'"
    deadline=$(date -d "@$((now + 9000))" '+%Y-%m-%d %H:%M:%S')
    run_tool show "token---$ZEROS"
    expect 0 "\
FIELD         VALUE
tid           token---$ZEROS
bind_sid      session-1
uid           0 (root)
deadline      $deadline (in 2 h)
count         12
create_time   2001-09-09 03:46:40
function      VPN
webapi_allow  {\"Api\":{\"method\":[\"get\"]}}
extra         {\"a\":[1]}"
    run_tool show --no-header "token---$ZEROS"
    [ "$output" = "$(tool show "token---$ZEROS" | tail -n +2)" ]
}

@test "show tells expired and unlimited tokens, and owners that have no name" {
    row token--- "uid = 4294967294, deadline = strftime('%s') - 9000, count = -3, webapi_allow = '[1', extra = 'x'"
    deadline=$(date -d "@$(sql "SELECT deadline FROM token")" '+%Y-%m-%d %H:%M:%S')
    # The empty session leaves its column's width behind.
    [ "$(tool show token--- --no-header | sed 's/ *$//')" = "\
tid           token---$ZEROS
bind_sid
uid           4294967294
deadline      $deadline (expired 2 h ago)
count         unlimited
create_time   2001-09-09 03:46:40
function      VPN
webapi_allow  [1]
extra         null" ]
}

@test "times are in local time, in UTC or in seconds" {
    row token--- "deadline = strftime('%s') + 9000"
    deadline=$(sql "SELECT deadline FROM token")
    while IFS='|' read -r option created expires; do
        [ "$(tool show token--- --no-header $option | grep -E 'deadline|create_time')" = "\
deadline      $expires (in 2 h)
create_time   $created" ]
    done <<END
|2001-09-09 03:46:40|$(date -d "@$deadline" '+%Y-%m-%d %H:%M:%S')
--utc|2001-09-09 01:46:40Z|$(date -u -d "@$deadline" '+%Y-%m-%d %H:%M:%SZ')
--epoch|1000000000|$deadline
END
}

@test "-o json and jsonl give the record, the whole id too" {
    row token--- "extra = '{\"n\":[1,0.5,null]}', bind_sid = 'session-1', count = -1"
    record='{"bind_sid":"session-1","count":-1,"create_time":1000000000,"deadline":9999999999,"extra":{"n":[1,0.5,null]},"function":"VPN","tid":"token---'$ZEROS'","uid":0,"webapi_allow":{"Api":{"method":["get"]}}}'
    run_tool show token--- -o jsonl
    expect 0 "$record"
    # Nothing of a table's makes a difference.
    run_tool show token--- -o jsonl --no-header --utc
    expect 0 "$record"
    run_tool show token--- --output json
    [ "$status" -eq 0 ]
    [ "$stderr" = "" ]
    [ "${#lines[@]}" -gt 10 ]
    printf %s "$output" >"$DIR/json"
    [ "$(sqlite3 :memory: "SELECT json(CAST(readfile('$DIR/json') AS TEXT))")" = "$record" ]
}

@test "CSV and chosen columns are as in a list, with the whole id" {
    row token--- "bind_sid = 'a,b'"
    run_tool show token--- -o csv --columns tid,session
    expect 0 "tid,session
token---$ZEROS,\"a,b\""
    run_tool show token--- -o csv --columns uid --no-header
    expect 0 0
    run_tool show token--- --columns uid,session
    expect 0 $'UID  SESSION\n  0  a,b'
    refuses show token--- --columns uid <<<"-o json|--columns is for tables and CSV"
}

@test "--field gives one field as it is stored" {
    row token--- "bind_sid = ' a', extra = '{\"a\":\"ü\"}', count = -1"
    while IFS='|' read -r field value; do
        run_tool show token--- --utc --field "$field"
        expect 0 "$value"
    done <<END
tid|token---$ZEROS
bind_sid| a
uid|0
deadline|9999999999
count|-1
create_time|1000000000
function|VPN
webapi_allow|{"Api":{"method":["get"]}}
extra|{"a":"ü"}
END
    # It is stronger than a form.
    run_tool show token--- --field uid -o json
    expect 0 0
}

@test "texts come through exactly in JSON, and harmless in the table" {
    export LC_ALL=C.UTF-8
    text=$'a\'b"c\\d\ne\tf\e[31m\xc2\x9bÄ漢\xff'
    tool init
    tid=$(tool create --uid 0 --function "$text" --bind-sid "$text" --allow "$text:$text" --extra '{"\u001b[31m":"\n"}')
    # What is not UTF-8 stays as it is stored, for what reads it to decide.
    json=$'a\'b\\"c\\\\d\\ne\\tf\\u001b[31m\\u009bÄ漢\xff'
    run_tool show "$tid" -o jsonl
    [[ $output == "{\"bind_sid\":\"$json\","*",\"extra\":{\"\\u001b[31m\":\"\\n\"},\"function\":\"$json\","* ]]
    [[ $output == *",\"webapi_allow\":{\"$json\":{\"method\":[\"$json\"]}}}" ]]
    [[ "$(tool show "$tid" -o json)" == *"\"function\" : \"$json\","* ]]
    for field in function bind_sid; do
        tool show "$tid" --field $field >"$DIR/field"
        cmp "$DIR/field" <(printf '%s\n' "$text")
    done
    shown='a'\''b"c\d\x0ae\x09f\x1b[31m\xc2\x9bÄ漢\xff'
    shown_json=${json//$'\xff'/'\xff'}
    run_tool show "$tid" --no-header
    [ "$status" -eq 0 ]
    [ "${lines[1]}" = "bind_sid      $shown" ]
    [ "${lines[6]}" = "function      $shown" ]
    [ "${lines[7]}" = "webapi_allow  {\"$shown_json\":{\"method\":[\"$shown_json\"]}}" ]
    [ "${lines[8]}" = 'extra         {"\u001b[31m":"\n"}' ]
    # Where the locale knows ASCII alone, nothing else is trusted.
    [[ "$(LC_ALL=C tool show "$tid" --no-header)" == *'\xc2\x9b\xc3\x84\xe6\xbc\xa2\xff'* ]]
}

@test "an id is found whole or by its first 8 characters or more" {
    row first--- "create_time = 1"
    row second-- "create_time = 2"
    shows_at 1 "first---$ZEROS"
    shows_at 1 first---
    shows_at 2 second--0
    shows_at 2 "second--${ZEROS%0}"
    for tid in "second--${ZEROS}0" "second--1" secondly SECOND-- second_- 'second%%' "second--'" Äcond--; do
        run_tool show "$tid"
        expect 3 "" "vemo-access-token: there is no such token"
    done
}

@test "a prefix that fits several tokens is refused, an id that others begin with is not" {
    row prefix-- "create_time = 1"
    sql "INSERT INTO token SELECT tid || 'x', '', 0, 9999999999, 1, 2, 'VPN', '{}', '{}' FROM token;
         INSERT INTO token SELECT 'prefix-~', '', 0, 9999999999, 1, 3, 'VPN', '{}', '{}' FROM token LIMIT 1"
    run_tool show prefix--
    expect 2 "" 'vemo-access-token: TID: several tokens begin with "prefix--"; give more of the id'
    # More of it is not repeated: it may be all but a character of the id.
    run_tool show "prefix--${ZEROS%0}"
    expect 2 "" 'vemo-access-token: TID: several tokens begin with "prefix--..."; give more of the id'
    shows_at 1 "prefix--$ZEROS"
    shows_at 2 "prefix--${ZEROS}x"
    shows_at 3 prefix-~
    # Nor does it matter which bytes follow, UTF-8 or not.
    row another- "tid = CAST(x'616e6f746865722dff' AS TEXT) || tid, create_time = 4"
    shows_at 4 another-
    row another-
    run_tool show another-
    expect 2 "" 'vemo-access-token: TID: several tokens begin with "another-"; give more of the id'
    row bytes--- "tid = CAST(x'ffffffffffffffffff' AS TEXT) || tid, create_time = 5"
    shows_at 5 $'\xff\xff\xff\xff\xff\xff\xff\xff'
}

@test "a prefix of less than 8 characters is refused, an id as short as that is not" {
    row token---
    for tid in t token-- "'; --"; do
        run_tool show "$tid"
        expect 2 "" "vemo-access-token: TID: \"$tid\" is too short: give the id or its first 8 characters, or more"
    done
    row other--- "tid = 't'"
    run_tool show t --field tid
    expect 0 t
}

@test "ids may hold anything" {
    for tid in "' OR 1=1; --" 'percent%_*?[a]' '-dash-in-front' 'two words' 'Ä漢Ä漢Ä漢Ä漢Ä' $'tab\tand\eesc' '"\\" backslash'; do
        row token--- "tid = '${tid//\'/\'\'}-$ZEROS'"
        run_tool show --field tid -- "$tid"
        expect 0 "$tid-$ZEROS"
        run_tool show --field tid - <<<"$tid"
        expect 0 "$tid-$ZEROS"
    done
}

@test "an id comes from standard input for a dash" {
    row first--- "create_time = 1"
    row second-- "create_time = 2"
    shows_at 1 - <<<"first---$ZEROS"
    shows_at 2 - <<<second--
    # Lines that hold nothing count for nothing; neither does a missing line break.
    shows_at 2 - < <(printf '\n\n%s' "second--$ZEROS")
    shows_at 2 - < <(printf '%s\n\n' "second--$ZEROS")
}

@test "what is not one id on standard input is refused" {
    row first---
    run_tool show - <"$DIR"
    expect 2 "" "vemo-access-token: standard input: Is a directory"
    while IFS='|' read -r input sentence; do
        echo "$input"
        run_tool show - < <(printf "$input")
        expect 2 "" "vemo-access-token: TID: $sentence"
    done <<END
|there is no id on standard input
\n\n|there is no id on standard input
first---\nfirst---\n|there is more than one id on standard input
first---\0\n|an id on standard input holds a NUL byte
\0|an id on standard input holds a NUL byte
first\n|"first" is too short: give the id or its first 8 characters, or more
END
    run --separate-stderr bash -c '"$0" show - <&-' "$TOOL"
    expect 2 "" "vemo-access-token: TID: there is no id on standard input"
    # Longer than any id, and than a buffer might be.
    run_tool show - < <(printf '%0100000d' 0)
    expect 3 "" "vemo-access-token: there is no such token"
    run_tool show - < <(printf 'first---%0100000d' 0)
    expect 3 "" "vemo-access-token: there is no such token"
}

@test "show refuses arguments that it cannot use" {
    tool init
    refuses show <<'END'
|TID is required
''|TID: the id is empty
token---0 token---1|unexpected argument "token---1"
token---0 --show-ids|unknown option "--show-ids"
token---0 -o yaml|--output: "yaml" is not a form: table, json, jsonl or csv
token---0 --field TID|--field: "TID" is not a field of a token
token---0 --epoch --utc|--epoch excludes --utc
END
}

@test "show spends and purges nothing: the file's bytes stay" {
    row a------- "deadline = -1"
    row b------- "count = 0"
    before=$(state)
    for form in table json jsonl; do
        run_tool show a------- -o $form
        [ "$status" -eq 0 ]
        run_tool show b------- -o $form
        [ "$status" -eq 0 ]
    done
    run_tool show c-------
    expect 3 "" "vemo-access-token: there is no such token"
    [ "$(state)" = "$before" ]
}
