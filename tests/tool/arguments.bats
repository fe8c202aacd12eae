#!/usr/bin/env bats
# Arguments that a command cannot use: it says which and why, ends with 2, and does nothing.

load common

# three_tokens: two of them begin alike, and one has expired
three_tokens() {
    rows <<'END'
token---
second-1
second-2|tid = 'second-1x'
expired-|deadline = 1
END
}

@test "the first mistake is reported, and nothing is done" {
    three_tokens
    which="say which tokens: by TID, by options that select, or --all"
    alone="repeat with --yes: there is nobody to ask"
    expired="the token has expired; \"vemo-access-token update\" can give it time"
    refuses <<TABLE
|say what to do; "vemo-access-token --help" lists the commands
bogus|unknown command "bogus"
lsit|unknown command "lsit"; did you mean "list"?
hel list|unknown command "hel"; did you mean "help"?
help craete|unknown command "craete"; did you mean "create"?
help list show|unexpected argument "show"
--bogus|unknown option "--bogus"
-x|unknown option "-x"
--|unknown option "--"
--hlep|unknown option "--hlep"; did you mean "--help"?
list --=|unknown option "--"
list --help=1|--help: takes no value
list --uid|--uid: needs a value
list -o|--output: needs a value
list --uid 0 --uid 0|--uid: can be given once only
list --funct TAG|unknown option "--funct"; did you mean "--function"?
list --limit x --uid y --bogus|--limit: "x" is not a number from 1 to 9223372036854775807
list --help --bogus|unknown option "--bogus"
list --uid 0 --user root|--uid excludes --user
list --utc --epoch|--utc excludes --epoch
list --columns uid -o json|--columns is for tables and CSV
list -o xml|--output: "xml" is not a form: table, json, jsonl or csv
list --sort \$'a\e[31m\nb\x7f'|--sort: "a\x1b[31m\x0ab\x7f" is not a field of a token
list --sort \$'Ä\xc2\x9b31m'|--sort: "Ä\xc2\x9b31m" is not a field of a token
purge -x|unknown option "-x"
generate more|unexpected argument "more"
create|--function is required
create --function VPN|--uid or --user is required
create --function= --uid 0|--function: must not be empty
create --uid 0 --function VPN --uses 2 --unlimited|--uses excludes --unlimited
create --uid 0 --function VPN --tid token--|--tid: an id needs 127 characters at least, this one has 7
create --uid 0 --function VPN --tid "${ZEROS%0}12345678"|--tid: an id needs 127 characters at least, this one has 126
create --uid 0 --function VPN --tid "token---$ZEROS"|--tid: there is a token with this id already
create --uid 0 --function VPN --tid=|--tid: the id is empty
show|TID is required
show -o xml --utc|TID is required
show token--- --columns uid -o json|--columns is for tables and CSV
check token---|API is required
check token--- ''|API: must not be empty
check token--- Api -o xml|--output: "xml" is not a form: table, json or jsonl
update token---|say what to change; "update --help" lists the fields
update token--- --ttl 1h --deadline 2060-01-01|--ttl excludes --deadline
update token--- --allow A --add-allow B|--allow excludes --add-allow
update token--- --allow A --remove-allow B|--allow excludes --remove-allow
rotate expired-|$expired
revoke --all|$alone
revoke --uid 0|$alone
revoke|$which
revoke token--- --all|$which
revoke token--- --uid 0|$which
revoke --all --function VPN --yes|$which
revoke --yes --bind-sid ""|--bind-sid: must not be empty
revoke --yes --user root --uid 0|--user excludes --uid
revoke token--- second-1|TID: several tokens begin with "second-1"; give more of the id
revoke token--- second-|TID: "second-" is too short: give the id or its first 8 characters, or more
revoke token--- ""|TID: the id is empty
stats -o xml|--output: "xml" is not a form: table, json, jsonl or metrics
stats --prometheus -o metrics|--prometheus excludes --output
tune --wal --undo|--wal excludes --undo
tune --undo --deadline-only|--undo excludes --deadline-only
TABLE
    LC_ALL=C fails 2 'unknown command "café"' café # only of a terminal anything is known
}

# An unknown option follows the bad value, so that the bad value is the first mistake of a command that needs more.
@test "an option refuses the same values in every command that has it" {
    a_number='"VALUE" is not a number from 1 to 9223372036854775807'
    a_time='"VALUE" is not a time: write 2026-12-31, "2026-12-31 23:59", 2026-12-31T23:59:59Z or @1798761599'
    columns="tid, user, function, uses, deadline, expires, session, allows, uid, created, note, extra"
    syntax="is not JSON: Column 1 Syntax error: value, object or array expected."
    tool init
    before=$(state)
    cd "$DIR"
    printf '[1]' >array
    printf '{"a":' >broken
    printf '{}\0' >nul
    : >empty
    for command in $(commands_of_tool); do
        options_of "$command" >"$command.options"
    done
    while IFS='|' read -r names values sentence; do
        eval "values=($values)"
        for name in $names; do
            commands=$(grep -lxe "$name" -- *.options)
            for command in $commands; do
                for value in "${values[@]}"; do
                    fails 2 "$name: ${sentence/VALUE/"$value"}" "${command%.options}" "$name" "$value" --none
                done
            done
        done
    done <<TABLE
--uid|'' x -1 4294967295 '0 or 1=1'|"VALUE" is not a number from 0 to 4294967294
--user|'' no-such-user|there is no user "VALUE"
--uses --limit|'' 0 -1 1.5 ten 9223372036854775808|$a_number
--ttl --grace --expiring|'' 0 -1 soon|"VALUE" is not a duration: write 90s, 15m, 8h, 2d12h or 1w
--deadline --created-before --created-after|'' soon 26-12-31|$a_time
--allow --add-allow --remove-allow --opens|'' : :m|"VALUE" names no API: write API or API:METHOD,METHOD
--allow --add-allow --remove-allow --opens|A: A:, A:m, A:,m A:m,,n|"VALUE" has an empty method: write API or API:METHOD,METHOD
--sort|'' colour tid:asc :desc|"VALUE" is not a field of a token
--field|'' name TID|"VALUE" is not a field of a token
--columns|'' name|"VALUE" is not a column: $columns
--columns|tid,|"" is not a column: $columns
--extra|'[]' '[{"a":1}]' @array|is not a JSON object
--extra|'' @empty|$syntax
--extra|@broken|is not JSON: Column 6 Syntax error: value, object or array expected.
--extra|@|"@" names no file
--extra|@missing|missing: No such file or directory
--extra|@$DIR|$DIR: Is a directory
--extra|@/proc/$$/mem|/proc/$$/mem: Input/output error
--extra|@nul|nul holds a NUL byte
TABLE
    gives 0 list --uid 4294967294 --count
    [ "$(state)" = "$before" ]
}

# Two of the commands take other ids, and one takes none from standard input.
@test "an id that can be none is refused by every command that takes one" {
    three_tokens
    for call in "create --uid 0 --function VPN --tid ID" "check ID Api" "grant ID Api" "show ID" "update ID --uses 2" \
        "rotate ID" "revoke ID"; do
        [[ $call == create* ]] && name=--tid || name=TID
        while IFS='|' read -r id sentence; do
            [[ $call != revoke* || $sentence != *" id on"* ]] || continue
            [[ $call != @(create|grant)* || $sentence != *@(short|several)* ]] || continue
            echo "${call/ID/"$id"}|${sentence/NAME/$name}"
        done <<'TABLE'
''|NAME: the id is empty
-|NAME: there is no id on standard input
- <&-|NAME: there is no id on standard input
- <"$DIR"|standard input: Is a directory
- < <(printf '\n\n')|NAME: there is no id on standard input
- < <(printf 'token---\ntoken---\n')|NAME: there is more than one id on standard input
- < <(printf 'token---\0\n')|NAME: an id on standard input holds a NUL byte
- < <(printf '\0')|NAME: an id on standard input holds a NUL byte
token--|NAME: "token--" is too short: give the id or its first 8 characters, or more
- <<<token--|NAME: "token--" is too short: give the id or its first 8 characters, or more
second-1|NAME: several tokens begin with "second-1"; give more of the id
TABLE
    done >"$DIR/calls"
    refuses <"$DIR/calls"
}
