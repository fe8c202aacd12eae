#!/usr/bin/env bats
# create and generate

load common

# column COLUMN TID: of the token of that id
column() {
    sql "SELECT $1 FROM token WHERE tid = '$2'"
}

# An id that the caller chooses, as short as allowed.
OWN=own-$(printf '%0123d' 0)

@test "create prints the id alone, and uses the library's defaults" {
    tool init
    succeeds create --uid 1000 --function VPN --allow Api
    [[ $output =~ ^[0-9A-Za-z]{127,255}$ ]]
    [ "$(sql "SELECT bind_sid, uid, deadline - create_time, count, function, webapi_allow, extra FROM token
              WHERE tid = '$output'")" = '|1000|86400|1|VPN|{"Api":{"method":[]}}|{}' ]
}

@test "create stores what its options say" {
    tool init
    # As many levels as the library reads back; and line breaks, also at the end, as in files that people write.
    nested=$(printf '{"a":%.0s' {2..1000}){}$(printf '}%.0s' {2..1000})
    printf '{\n  "file": [1,\n2]\n}\n' >"$DIR/extra file"
    while IFS='|' read -r arguments column stored; do
        echo "$arguments"
        [ "$(column "$column" "$(eval "a_token $arguments")")" = "$stored" ]
    done <<'TABLE'
--uses 9223372036854775807|count|9223372036854775807
--unlimited|count|-1
--ttl 1w2d3h4m5s|deadline - create_time|788645
--bind-sid session-1|bind_sid|session-1
--note 'it is "mine"'|extra|{"note":"it is \"mine\""}
--note a --extra '{"b":1,"note":2}'|extra|{"b":1,"note":"a"}
--note '' --extra '{"b":1,"note":2}'|extra|{"b":1}
--note ''|extra|{}
--extra ' { "b" : [ ] , "a" : { "c" : null } } '|extra|{"a":{"c":null},"b":[]}
--extra '{"n":[-1,9223372036854775807,18446744073709551615,0.5,2e3]}'|extra|{"n":[-1,9223372036854775807,18446744073709551615,0.5,2000.0]}
--extra '{"ü":"\u00fc\n\"\\\u0000\u001b"}'|extra|{"ü":"ü\n\"\\\u0000\u001b"}
--extra "@$DIR/extra file"|extra|{"file":[1,2]}
--allow A|webapi_allow|{"A":{"method":[]}}
--allow A:n,m,n|webapi_allow|{"A":{"method":["n","m"]}}
--allow A:m --allow B --allow A:n,m|webapi_allow|{"A":{"method":["m","n"]},"B":{"method":[]}}
--allow A --allow A:m --allow A|webapi_allow|{"A":{"method":["m"]}}
--allow A:m:n|webapi_allow|{"A":{"method":["m:n"]}}
TABLE
    [ "$(column extra "$(a_token --extra "$nested")")" = "$nested" ]
    [ "$(column "uid, function" "$(tool create --user root --function 'File share')")" = "0|File share" ]
    [ "$(column uid "$(tool create --uid 4294967294 --function VPN)")" = 4294967294 ]
}

@test "create prints its record as JSON, as show does" {
    tool init
    for form in json jsonl; do
        succeeds create --uid 0 --function VPN --allow A:m --note ü -o $form
        [ "$output" = "$(tool show "$(sql "SELECT tid FROM token")" -o $form)" ]
        sql "DELETE FROM token"
    done
    run_tool create --uid 0 --function VPN -o table
    [ "$output" = "$(sql "SELECT tid FROM token")" ]
}

@test "create warns of what is seldom meant, and does it" {
    tool init
    while IFS='|' read -r arguments doubt; do
        eval "run_tool create --uid 0 --function VPN $arguments"
        [ "$status" -eq 0 ]
        [[ $output =~ ^[0-9A-Za-z]{127,255}$ ]]
        [ "$stderr" = "${doubt:+vemo-access-token: $doubt}" ]
    done <<'END'
|the token opens nothing: there is no --allow
--allow Api|
--allow Api:get --allow '*'|--allow: "*" stands for this name alone: "*" is no wildcard
--allow 'Api:get,put*'|--allow: "put*" stands for this name alone: "*" is no wildcard
--allow 'Api:get, put'|--allow: " put" holds a blank, which is part of the name
--allow $'A\tB'|--allow: "A\x09B" holds a blank, which is part of the name
END
    run_tool create --uid 0 --function VPN --allow 'A *:b,c d'
    [ "$stderr" = 'vemo-access-token: --allow: "A *" stands for this name alone: "*" is no wildcard
vemo-access-token: --allow: "A *" holds a blank, which is part of the name
vemo-access-token: --allow: "c d" holds a blank, which is part of the name' ]
    # A creation that fails does not print these warnings.
    run_tool create --uid 0 --function VPN --tid "$(sql "SELECT tid FROM token LIMIT 1")"
    expect 2 "" "vemo-access-token: --tid: there is a token with this id already"
}

@test "create takes an id that the caller chooses" {
    tool init
    gives "$OWN" create --uid 0 --function VPN --allow Api --tid "$OWN"
    gives "${OWN/own/two}" create --uid 0 --function VPN --allow Api --tid - <<<"${OWN/own/two}"
    # It may contain any character, and be of any greater length.
    odd="' \"Ä\\$(printf '%010000d' 0)"
    gives "$odd" create --uid 0 --function VPN --allow Api --tid - <<<"$odd"
    tool generate | tool create --uid 0 --function VPN --tid - >"$DIR/tid"
    [ "$(sql "SELECT tid FROM token ORDER BY rowid")" = "$OWN
${OWN/own/two}
$odd
$(cat "$DIR/tid")" ]
}

@test "create purges expired tokens, and can use the id of one again" {
    a_token --tid "$OWN" --uses 5
    expired=$(a_token)
    lasting=$(a_token)
    sql "UPDATE token SET deadline = 1 WHERE tid IN ('$OWN', '$expired')"
    gives "$OWN" create --uid 0 --function VPN --allow Api --tid "$OWN"
    [ "$(sql "SELECT tid, count FROM token ORDER BY rowid")" = "$lasting|1
$OWN|1" ]
}

@test "create makes the file and the table where they are missing or half made" {
    mkdir -m 0700 "$VEMO_REDIRECT_DIR"
    succeeds create --uid 0 --function VPN --allow Api
    [ "$(sql "SELECT tid FROM token")" = "$output" ]
    [ "$(stat -c %a "$DB")" = 700 ]
    # An interrupted creation leaves an empty file.
    : >"$DB"
    succeeds create --uid 0 --function VPN --allow Api
    [ "$(sql "SELECT tid FROM token; PRAGMA auto_vacuum" | xargs)" = "$output 1" ]
    # The path to an existing one may be a link.
    ln -s session "$DIR/links"
    VEMO_REDIRECT_DIR=$DIR/links succeeds create --uid 0 --function VPN --allow Api
}

@test "generate prints a new id each time, and touches no database" {
    succeeds generate
    [[ $output =~ ^[0-9A-Za-z]{127,255}$ ]]
    [ "$output" != "$(tool generate)" ]
    [ ! -e "$VEMO_REDIRECT_DIR" ]
}

@test "create says what became of a token that was to be taken back" {
    tool init
    VEMO_TEST_SYNC=file fails 4 "$REAL_DB failed: disk I/O error" create --uid 0 --function VPN
    VEMO_TEST_SYNC=directory run_tool create --uid 0 --function VPN
    expect 4 "" "vemo-access-token: $REAL_DIRECTORY: Input/output error; the change was made, and cannot be taken back: $REAL_DIRECTORY: Input/output error"
    [ "$(sql "SELECT count(*) FROM token")" -eq 0 ]
}
