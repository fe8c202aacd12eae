#!/usr/bin/env bats
# show, and how ids are given

load common

# shows_at NUMBER ARGUMENTS...: this way of giving an id finds the token of that number.
shows_at() {
    gives "$1" show --field create_time "${@:2}"
}

@test "show tells all fields, the whole id too" {
    now=$(date +%s)
    row token--- "bind_sid = 'session-1', deadline = $((now + 9000)), count = 12, extra = '{\"a\": [ 1 ]}'"
    deadline=$(date -d "@$((now + 9000))" '+%Y-%m-%d %H:%M:%S')
    gives "\
FIELD         VALUE
tid           token---$ZEROS
bind_sid      session-1
uid           0 (root)
deadline      $deadline (in 2 h)
count         12
create_time   2001-09-09 03:46:40
function      VPN
webapi_allow  {\"Api\":{\"method\":[\"get\"]}}
extra         {\"a\":[1]}" show "token---$ZEROS"
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

@test "forms, columns and fields are those of a list that shows whole ids" {
    row token--- "bind_sid = ' a,b', extra = '{\"n\":[1,0.5,null,\"ü\"]}', count = -1"
    while read -r arguments; do
        gives "$(tool list --show-ids $arguments)" show token--- $arguments
    done <<'END'
-o jsonl
-o jsonl --no-header --utc
-o csv
-o csv --columns tid,session
-o csv --columns uid --no-header
--columns uid,session,note
--field tid
--field bind_sid
--field uid
--field deadline
--field count
--field create_time
--field function --utc
--field webapi_allow
--field extra
--field uid -o json
END
    # But the JSON is that of the token, and not a list.
    succeeds show token--- --output json
    [ "${#lines[@]}" -gt 10 ]
    printf %s "$output" >"$DIR/json"
    [ "$(sqlite3 :memory: "SELECT json(CAST(readfile('$DIR/json') AS TEXT))")" = "$(tool show token--- -o jsonl)" ]
}

@test "texts are stored as they are given, and come through exactly in JSON and harmless in tables" {
    export LC_ALL=C.UTF-8
    shown='a'\''b"c\d\x5cx41\x0ae\x09f\x1b[31m\xc2\x9bÄ漢\xff;--'
    text=$'a\'b"c\\d\\x41\ne\tf\e[31m\xc2\x9bÄ漢\xff;--'
    # What is not UTF-8 stays as it is stored; whoever reads it decides.
    json=$'a\'b\\"c\\\\d\\\\x41\\ne\\tf\\u001b[31m\\u009bÄ漢\xff;--'
    tool init
    tid=$(tool create --uid 0 --function "$text" --bind-sid "$text" --allow "$text:$text" --extra '{"\u001b[31m":"\n"}')
    [ "$(sql "SELECT lower(hex(function)) FROM token WHERE function = bind_sid")" = \
        "$(printf %s "$text" | od -An -v -tx1 | tr -d ' \n')" ]
    run_tool show "$tid" -o jsonl
    [[ $output == "{\"bind_sid\":\"$json\","*",\"extra\":{\"\\u001b[31m\":\"\\n\"},\"function\":\"$json\","* ]]
    [[ $output == *",\"webapi_allow\":{\"$json\":{\"method\":[\"$json\"]}}}" ]]
    gives "${output/"$tid"/"${tid:0:8}"}" list -o jsonl
    [[ "$(tool show "$tid" -o json)" == *"\"function\" : \"$json\","* ]]
    for field in function bind_sid; do
        gives "$text" show "$tid" --field $field
        gives "$text" list --field $field
    done
    run_tool list --no-header
    for expires in "in 24 h" "in 23 h"; do
        [[ $output != *"$expires"* ]] || [[ $output == "${tid:0:8}  root  $shown  1  "*"  $expires  $shown  $shown:$shown" ]]
    done
    [[ $output == *"  in 2"* ]]
    run_tool show "$tid" --no-header
    [ "${lines[1]}" = "bind_sid      $shown" ]
    [ "${lines[6]}" = "function      $shown" ]
    json=${json//\\\\x41/\\\\x5cx41}
    json=${json//$'\xff'/'\xff'}
    [ "${lines[7]}" = "webapi_allow  {\"$json\":{\"method\":[\"$json\"]}}" ]
    [ "${lines[8]}" = 'extra         {"\u001b[31m":"\n"}' ]
    # In a locale of ASCII alone, all else is escaped.
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
        fails 3 "there is no such token" show "$tid"
    done
}

@test "a prefix that fits several tokens is refused, an id that others begin with is not" {
    row prefix-- "create_time = 1"
    sql "INSERT INTO token SELECT tid || 'x', '', 0, 9999999999, 1, 2, 'VPN', '{}', '{}' FROM token;
         INSERT INTO token SELECT 'prefix-~', '', 0, 9999999999, 1, 3, 'VPN', '{}', '{}' FROM token LIMIT 1"
    fails 2 'TID: several tokens begin with "prefix--"; give more of the id' show prefix--
    # A longer beginning is not repeated: it may be the id but for one character.
    fails 2 'TID: several tokens begin with "prefix--..."; give more of the id' show "prefix--${ZEROS%0}"
    shows_at 1 "prefix--$ZEROS"
    shows_at 2 "prefix--${ZEROS}x"
    shows_at 3 prefix-~
    # It does not matter which bytes follow, UTF-8 or not.
    row another- "tid = CAST(x'616e6f746865722dff' AS TEXT) || tid, create_time = 4"
    shows_at 4 another-
    row another-
    fails 2 'TID: several tokens begin with "another-"; give more of the id' show another-
    row bytes--- "tid = CAST(x'ffffffffffffffffff' AS TEXT) || tid, create_time = 5"
    shows_at 5 $'\xff\xff\xff\xff\xff\xff\xff\xff'
}

@test "a prefix of less than 8 characters is refused, an id as short as that is not" {
    row token---
    for tid in t token-- "'; --"; do
        fails 2 "TID: \"$tid\" is too short: give the id or its first 8 characters, or more" show "$tid"
    done
    row other--- "tid = 't'"
    gives t show t --field tid
}

@test "ids may hold anything" {
    for tid in "' OR 1=1; --" 'percent%_*?[a]' '-dash-in-front' 'two words' 'Ä漢Ä漢Ä漢Ä漢Ä' $'tab\tand\eesc' '"\\" backslash'; do
        row token--- "tid = '${tid//\'/\'\'}-$ZEROS'"
        gives "$tid-$ZEROS" show --field tid -- "$tid"
        gives "$tid-$ZEROS" show --field tid - <<<"$tid"
    done
}

@test "an id comes from standard input for a dash" {
    row first--- "create_time = 1"
    row second-- "create_time = 2"
    shows_at 1 - <<<"first---$ZEROS"
    shows_at 2 - <<<second--
    # Empty lines do not matter, nor does a missing line break.
    shows_at 2 - < <(printf '\n\n%s' "second--$ZEROS")
    shows_at 2 - < <(printf '%s\n\n' "second--$ZEROS")
}

@test "show spends and purges nothing, and says so where there is no such token" {
    row a------- "deadline = -1"
    row b------- "count = 0"
    before=$(state)
    for form in table json jsonl; do
        for tid in a------- b-------; do
            succeeds show "$tid" -o $form
        done
    done
    fails 3 "there is no such token" show c-------
    # Longer than any id, and than a buffer might be.
    fails 3 "there is no such token" show - < <(printf 'a-------%0100000d' 0)
    [ "$(state)" = "$before" ]
}
