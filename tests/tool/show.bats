#!/usr/bin/env bats
# show, and how ids are given

load common

@test "show prints all fields, the whole id too; times are in local time, in UTC or in seconds" {
    in_2_h=$(($(date +%s) + 9000))
    row token--- "bind_sid = 'session-1', deadline = $in_2_h, count = 12, extra = '{\"a\": [ 1 ]}'"
    while IFS='|' read -r option created deadline; do
        gives "\
FIELD         VALUE
tid           token---$ZEROS
bind_sid      session-1
uid           0 (root)
deadline      $deadline (in 2 h)
count         12
create_time   $created
function      VPN
webapi_allow  {\"Api\":{\"method\":[\"get\"]}}
extra         {\"a\":[1]}" show $option token---
    done <<END
|2001-09-09 03:46:40|$(date -d "@$in_2_h" '+%Y-%m-%d %H:%M:%S')
--utc|2001-09-09 01:46:40Z|$(date -u -d "@$in_2_h" '+%Y-%m-%d %H:%M:%SZ')
--epoch|1000000000|$in_2_h
END
    gives "$(tool show token--- | tail -n +2)" show --no-header token---
}

@test "show marks expired and unlimited tokens, and owners that have no name" {
    row token--- "uid = 4294967294, deadline = strftime('%s') - 9000, count = -3, webapi_allow = '[1', extra = 'x'"
    deadline=$(date -d "@$(sql "SELECT deadline FROM token")" '+%Y-%m-%d %H:%M:%S')
    # The empty session still takes the width of its column.
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

@test "forms, columns and fields are those of a list that shows whole ids" {
    row token--- "bind_sid = ' a,b, and more', extra = '{\"n\":[1,0.5,null,\"ü\"]}', count = -1"
    while read -r arguments; do
        gives "$(tool list --show-ids $arguments)" show token--- $arguments
    done <<'END'
-o jsonl
-o jsonl --no-header --utc
-o csv --columns tid,session
-o csv --columns uid --no-header
--columns uid,session,note
--field tid
--field uid
--field function --utc
--field webapi_allow
--field uid -o json
END
    # But the JSON is that of the token, and not a list.
    succeeds show token--- --output json
    [ "${#lines[@]}" -gt 10 ]
    printf %s "$output" >"$DIR/json"
    [ "$(sqlite3 :memory: "SELECT json(CAST(readfile('$DIR/json') AS TEXT))")" = "$(tool show token--- -o jsonl)" ]
}

@test "texts come through exactly in JSON, and harmless in tables" {
    export LC_ALL=C.UTF-8
    text=$'a\'b"c\\d\\x41\ne\tf\e[31m\xc2\x9bÄ漢\xff;--'
    shown='a'\''b"c\d\x5cx41\x0ae\x09f\x1b[31m\xc2\x9bÄ漢\xff;--'
    # Bytes that are not UTF-8 stay as they are stored; the reader decides.
    json=$'a\'b\\"c\\\\d\\\\x41\\ne\\tf\\u001b[31m\\u009bÄ漢\xff;--'
    tid=$(a_token --bind-sid "$text" --allow "$text:$text")
    run_tool show "$tid" -o jsonl
    [[ $output == "{\"bind_sid\":\"$json\","*",\"webapi_allow\":{\"$json\":{\"method\":[\"$json\"]}}}" ]]
    gives "$shown  $shown:$shown" list --no-header --columns session,allows
    run_tool show "$tid" --no-header
    [ "${lines[1]}" = "bind_sid      $shown" ]
    json=${json//\\\\x41/\\\\x5cx41}
    json=${json//$'\xff'/'\xff'}
    [ "${lines[7]}" = "webapi_allow  {\"$json\":{\"method\":[\"$json\"]}}" ]
    # In a locale of ASCII only, all other characters are escaped.
    [[ "$(LC_ALL=C tool show "$tid" --no-header)" == *'\xc2\x9b\xc3\x84\xe6\xbc\xa2\xff'* ]]
}

@test "an id is found whole, or by its first 8 characters or more where they fit one token, and nothing is changed" {
    odd=("' OR 1=1; --" 'percent%_*?[a]' '-dash-in-front' 'two words' 'Ä漢Ä漢Ä漢Ä漢Ä' $'tab\tand\eesc' '"\\" backslash')
    {
        cat <<END
first---|create_time = 1, deadline = -1
second--|create_time = 2, count = 0
t|tid = 't', create_time = 3
prefix--|create_time = 4
prefix-1|tid = 'prefix--${ZEROS}x', create_time = 5
prefix-~|tid = 'prefix-~', create_time = 6
another-|tid = CAST(x'616e6f746865722dff' AS TEXT) || tid, create_time = 7
bytes---|tid = CAST(x'ffffffffffffffffff' AS TEXT) || tid, create_time = 8
bytes---|tid = 'twice---' || char(255), create_time = 1
twice---|create_time = 1
END
        for tid in "${odd[@]}"; do
            echo "odd-----|tid = '${tid//\'/\'\'}-$ZEROS', create_time = 9"
        done
    } | rows
    before=$(state)
    while IFS='|' read -r id result; do
        eval "id=$id"
        for given in "$id" -; do
            case $result in
                [1-9]) gives "$result" show --field create_time -- "$given" <<<"$id" ;;
                unknown) fails 3 "there is no such token" show -- "$given" <<<"$id" ;;
                *) fails 2 "TID: $result" show -- "$given" <<<"$id" ;;
            esac
        done
    done <<END
"first---$ZEROS"|1
first---|1
second--0|2
"second--${ZEROS%0}"|2
"second--${ZEROS}0"|unknown
"second--1"|unknown
secondly|unknown
SECOND--|unknown
second_-|unknown
second%%|unknown
"second--'"|unknown
Äcond--|unknown
t|3
"'; --"|"'; --" is too short: give the id or its first 8 characters, or more
second-|"second-" is too short: give the id or its first 8 characters, or more
prefix--|several tokens begin with "prefix--"; give more of the id
"prefix--${ZEROS%0}"|several tokens begin with "prefix--..."; give more of the id
"prefix--$ZEROS"|4
"prefix--${ZEROS}x"|5
prefix-~|6
another-|7
\$'\xff\xff\xff\xff\xff\xff\xff\xff'|8
twice---|several tokens begin with "twice---"; give more of the id
$(printf '%q|9\n' "${odd[@]}")
END
    # Empty lines do not matter, nor does a missing line break, and it may be longer than a buffer might be.
    gives 2 show --field create_time - < <(printf '\n\n%s' "second--$ZEROS")
    fails 3 "there is no such token" show - < <(printf 'first---%0100000d' 0)
    [ "$(state)" = "$before" ]
}
