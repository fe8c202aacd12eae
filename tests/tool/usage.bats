#!/usr/bin/env bats
# What all commands share: help, arguments, the allowed users, and the streams

load common

# plain ARGUMENTS...: the tool as it ships, without the redirection, as a user who is not root. If root runs the test,
# only the effective uid changes, as for a program of mode 4755. The real uid changes, too, for AddressSanitizer, which
# must trace the process to find leaks, and for a script in the tool's place, whose shell would go back to the real uid.
plain() {
    local plain drop=()
    plain=$(dirname "$TOOL")/../../tools/vemo-access-token
    if [ "$(id -u)" -eq 0 ]; then
        drop=(setpriv --euid=65534 --regid=65534 --clear-groups)
        if grep -q __asan_init "$plain" || [[ $(ldd "$plain" 2>&1) == *"not a dynamic executable"* ]]; then
            drop[1]=--reuid=65534
        fi
        "${drop[@]}" test -x "$plain" || skip "uid 65534 cannot reach the build directory"
    fi
    run --separate-stderr env -u VEMO_REDIRECT_DIR "${drop[@]}" "$plain" "$@"
}

# cannot_print REASON REDIRECTION ARGUMENTS...: the tool fails for that reason when its standard output is redirected so
cannot_print() {
    status=0 output=
    stderr=$(eval '"$TOOL" "${@:3}" 2>&1' "$2") || status=$?
    expect 4 "" "vemo-access-token: cannot write the result: $1"
}

# into_closed_pipe ARGUMENTS...: standard output is a pipe whose reader has ended. The shell may ignore SIGPIPE; the
# tool is started as if it did not.
into_closed_pipe() {
    run --separate-stderr bash -c 'exec 9> >(:); wait $!; exec env --default-signal=PIPE "$@" >&9' - "$TOOL" "$@"
}

@test "--help lists commands, options and exit statuses, and --version is the same everywhere" {
    succeeds --help
    help=$output
    [[ $help == "Usage: vemo-access-token [OPTIONS] COMMAND"* ]]
    [[ $help == *"Exit status: 0 done or granted, 1 refused (grant, check), 2 usage,
3 no such token, 4 store or permission failure, 5 doctor has findings."* ]]
    for arguments in -h help; do
        gives "$help" $arguments
    done
    succeeds --version
    [[ $output =~ ^vemo-access-token\ [0-9]+\.[0-9]+\.[0-9]+$ ]]
    version=$output
    gives "$version" -V
    gives "$version" list -V
    for command in $(commands_of_tool); do
        gives "$version" "$command" --version
        succeeds "$command" --help
        [[ $output == "Usage: vemo-access-token $command [OPTIONS]"* ]]
        gives "$output" help "$command"
        help+=$'\n'$output
    done
    [ "$(grep -E '.{81}' <<<"$help")" = "" ]
}

@test "--help of a command says how each argument and option is given" {
    run_tool update --help
    expect 0 'Usage: vemo-access-token update [OPTIONS] TID
change fields of a token

Arguments:
  TID                         the id; "-" reads it from standard input

Options:
  -h,--help                   print this help and exit
  -V,--version                print the version and exit
  -v,--verbose                show the library'"'"'s log lines on standard error
  --uses N                    how many times it can be granted
  --unlimited                 any number of times
  --deadline TIME             expiry: 2026-12-31, "2026-12-31 23:59",
                              2026-12-31T23:59:59Z or @SECONDS
  --ttl DURATION              lifetime from now: 45s, 90m, 8h, 2d12h, 1w, or
                              seconds
  --allow API[:METHOD,...]    all that it opens from now on (repeatable)
  --add-allow API[:METHOD,...]
                              what it opens in addition (repeatable)
  --remove-allow API[:METHOD,...]
                              what it no longer opens (repeatable)
  --bind-sid SID              bind it to this login session; "" unbinds it
  --extra JSON|@FILE          your data, a JSON object or a file that holds one
  --note TEXT                 your note, kept in the data; "" for none

Examples:
  vemo-access-token update - --ttl 30d --uses 5 <id
  vemo-access-token update - --add-allow Backup:list,get <id'
    run_tool create --help
    [[ $output == *"
  --function TAG              its purpose (required)
"* ]]
    [[ $(tool check --help) == "Usage: vemo-access-token check [OPTIONS] TID API [METHOD]
"* ]]
    [[ $(tool revoke --help) == "Usage: vemo-access-token revoke [OPTIONS] [TID...]
"* ]]
    [[ $(tool init --help) != *Arguments* ]]
}

@test "the two examples of each command's help do what they should" {
    tool_on_path
    cd "$DIR"
    tool init
    for command in $(commands_of_tool); do
        tool help "$command" | sed -n '/^Examples:$/,$s/^  //p' >examples
        [ "$(grep -c "^vemo-access-token $command\( \|\$\)" examples)" -eq 2 ]
        [ "$(wc -l <examples)" -eq 2 ]
        while IFS= read -r example <&4; do
            echo "$example"
            sql "DELETE FROM token"
            row token--- "count = 10, webapi_allow = '{\"Backup\":{\"method\":[\"put\"]}}'"
            echo "token---$ZEROS" >id
            [ "$command" != import ] || { tool export tokens.jsonl; sql "DELETE FROM token"; }
            (eval "set -o pipefail; $example")
        done 4<examples
    done
}

@test "arguments may come before, between and after options, also with POSIXLY_CORRECT" {
    id=$(a_token --allow Api:get)
    for arguments in "$id Api get -o json" "-o json $id Api get" "$id -ojson Api get" "$id Api --output=json get" \
        "-vvo json -- $id Api get"; do
        POSIXLY_CORRECT=1 gives '{"allowed":true,"reason":""}' check $arguments
    done
}

# Brackets, quotes, equals signs and the like have no meaning here: there are neither lists nor escapes.
@test "arguments reach the commands byte for byte" {
    tool init
    for text in '[a,b]' '[]' '"x"' "'x'" '{a}' 'a=b' '=' '-' '--' '--all' '-v' '%%' '\\n' ' ' $'a\nb' $'\x9b' '!#:+'; do
        id=$(tool create --uid 0 --function "$text" --bind-sid="$text" --allow "Api" --extra "{\"x\": 1}")
        [ "$(sql "SELECT function || char(9) || bind_sid FROM token")" = "$text"$'\t'"$text" ]
        fails 1 "refused: API not listed" grant "$id" -- "$text"
        gives "1 token would be revoked" revoke --dry-run --function "$text" --bind-sid="$text"
        sql "DELETE FROM token"
    done
    tool create --uid 0 --function VPN --bind-sid=
    [ "$(tool list --field bind_sid)" = "" ]
}

# At each limit the program ends in the loader (1, 127), for lack of memory (4), or as usual (2). The loader itself crashes
# where it has no memory for a table of its own, and does so when it only lists the libraries.
@test "a lack of memory from the start is reported, and causes no crash" {
    ! grep -q __asan_init "$TOOL" || skip "AddressSanitizer takes more memory"
    [[ $(ldd "$TOOL" 2>&1) != *"not a dynamic executable"* ]] || skip "valgrind takes more memory"
    [ -z "${LLVM_PROFILE_FILE-}" ] || skip "clang's counters take memory of their own"
    as_usual=0
    for ((limit = 5000; limit < 12000 && as_usual < 20; limit += 16)); do
        status=0
        stderr=$( (ulimit -v "$limit" && exec "$TOOL" generate more) 2>&1) || status=$?
        case $status in
            1 | 127) ;;
            2) as_usual=$((as_usual + 1)) ;;
            4) [ "$stderr" = "vemo-access-token: out of memory" ] ;;
            139)
                run bash -c "ulimit -v $limit && LD_TRACE_LOADED_OBJECTS=1 exec '$TOOL' >/dev/null 2>&1"
                [ "$status" -eq 139 ]
                ;;
            *) false ;;
        esac
        [ "$status" -eq 2 ] || as_usual=0
    done
    [ "$as_usual" -eq 20 ]
    [ "$stderr" = 'vemo-access-token: unexpected argument "more"' ]
}

@test "a user who is not root gets a sentence, and nothing is tried" {
    uid=65534
    [ "$(id -u)" -eq 0 ] || uid=$(id -u)
    while read -r arguments; do
        plain $arguments </dev/null
        expect 4 "" "vemo-access-token: only root may do this: the token database belongs to root, and the effective uid is $uid"
    done < <(ID=- calls)
    diff <(ID=- calls | cut -d ' ' -f 1 | sort -u) <(commands_of_tool | grep -vxE 'doctor|generate|help' | sort)
    plain doctor --repair
    expect 5 "error: not run as root: the effective uid is $uid
    meaning: the database belongs to root and cannot be looked at
    remedy: run doctor as root"
    plain generate
    [ "$status$stderr" = 0 ]
    [[ $output =~ ^[0-9A-Za-z]{127,255}$ ]]
    for arguments in --help --version "list --help"; do
        plain $arguments
        [ "$status$stderr" = 0 ]
        [ "$output" != "" ]
    done
}

@test "--verbose shows the library's log lines, on standard error only" {
    id=$(a_token --allow Api:get)
    sql "UPDATE token SET webapi_allow = '[]'"
    ends 1 "refused: malformed token" check "$id" Api get
    run_tool check -v "$id" Api get
    [ "$status $output" = "1 refused: malformed token" ]
    [ "$(grep -vE '^[A-Za-z]+\.cpp:[0-9]+ ' <<<"$stderr")" = "" ]
    [[ $stderr == *'Failed [jToken["webapi_allow"].type() != Json::objectValue]'* ]]
    gives 1 list --verbose --count # nothing fails: nothing is logged

    echo "no database" >"$DB"
    fails 4 "$NO_DATABASE" list
    run_tool list --verbose
    [ "$status$output" = 4 ]
    [ "$(grep -vE '^[A-Za-z]+\.cpp:[0-9]+ ' <<<"$stderr")" = "vemo-access-token: $NO_DATABASE" ]
    [[ $stderr == *"run sql failed, error=file is not a database"*$'\n'"vemo-access-token: "* ]]
}

@test "a result that cannot be written is a failure" {
    id=$(a_token --allow Api --uses 100)
    while IFS='|' read -r redirection reason; do
        for arguments in --help --version "list --help" generate list "list -o json" "list --field uid" \
            "list --count" "show $id" "check $id Api" "grant $id Api" "grant $id Api --print-user" \
            "update $id --bind-sid x" "revoke --dry-run --all" "purge --dry-run" "purge" stats \
            "stats --prometheus" export doctor "doctor -o json" init "tune --dry-run"; do
            made=
            [[ $arguments != grant\ * && $arguments != update\ * ]] || made="; the change was made"
            cannot_print "$reason$made" "$redirection" $arguments
        done
        # A token whose id could not be printed does not stay.
        cannot_print "$reason; the token was taken back" "$redirection" create --uid 0 --function VPN
        for grace in "" "--grace 1m" "--grace 365250d"; do
            cannot_print "$reason; the change was taken back" "$redirection" rotate "$id" $grace
        done
    done <<'TABLE'
>/dev/full|No space left on device
>&-|Bad file descriptor
TABLE
    cannot_print "No space left on device; the token was taken back" ">/dev/full" create --verbose --uid 0 --function VPN
    run cannot_print "" ">&-" create --verbose --uid 0 --function VPN
    [[ $output == *"got:      status 4"* ]]
    [ "$(sql "SELECT tid FROM token")" = "$id" ]
    # A result that is larger than all buffers.
    many_rows 300
    for arguments in "list --show-ids" "list -o json --show-ids" "list --field tid --show-ids"; do
        cannot_print "No space left on device" ">/dev/full" $arguments
    done
}

@test "a token whose id went into a closed pipe does not stay, and a listing into one ends quietly" {
    tool init
    into_closed_pipe create --uid 0 --function VPN
    expect 4 "" "vemo-access-token: cannot write the result: Broken pipe; the token was taken back"
    [ "$(sql "SELECT count(*) FROM token")" -eq 0 ]
    row token---
    into_closed_pipe list
    expect 141 ""
}

@test "neither the database nor the lock takes the place of a stream that is closed at the start" {
    id=$(a_token)
    cp "$DB" "$DIR/before"
    while IFS='|' read -r closed listing listed complaint; do
        run bash -c '"$@" '"$closed" - "$TOOL" list --field uid
        [ "$status" -eq "$listing" ]
        [ "$output" = "$listed" ]
        run bash -c '"$@" '"$closed" - "$TOOL" show unknown-token
        [ "$status" -eq 3 ]
        [ "$output" = "$complaint" ]
        cmp "$DB" "$DIR/before"
        [ ! -s "$VEMO_REDIRECT_DIR.lock" ]
    done <<'TABLE'
<&-|0|0|vemo-access-token: there is no such token
>&-|4|vemo-access-token: cannot write the result: Bad file descriptor|vemo-access-token: there is no such token
2>&-|0|0|
<&- >&-|4|vemo-access-token: cannot write the result: Bad file descriptor|vemo-access-token: there is no such token
<&- 2>&-|0|0|
>&- 2>&-|4||
<&- >&- 2>&-|4||
TABLE
    run bash -c '"$@" <&- >&-' - "$TOOL" show -
    [ "$status" -eq 2 ]
    [ "$output" = "vemo-access-token: TID: there is no id on standard input" ]
}

# SQLite's temporary files would hold purposes and sessions, on a file system that may not even be root's alone.
@test "what is sorted does not get into temporary files" {
    many_rows 2500 "bind_sid = printf('%03000d', rowid), function = printf('%03000d', rowid), uid = rowid, deadline = deadline - rowid"
    mkdir "$DIR/tmp"
    for arguments in stats "list --sort function --limit 1" "tune --dry-run" "tune" doctor "revoke --all --yes"; do
        touch -d @1 "$DIR/tmp"
        TMPDIR=$DIR/tmp run_tool $arguments
        [ "$(stat -c %Y "$DIR/tmp")" = 1 ] # nothing was made in it, not even for a time
    done
}

# wrong_places ID: calls that fail with a sentence, which must not hold the id: it is the value of each option that has
# one, in front of a mistake, and stands where it does not belong
wrong_places() {
    for command in $(commands_of_tool); do
        tool "$command" --help | sed -nE "s|^  (-o,)?(--[a-z-]+) [A-Z].*|$command \2=$1 --none\n$command \2 $1 --none|p"
    done
    cat <<TABLE
$1
list $1
show $1 $1
check $1 Api get $1
update $1 $1 --uses 1
rotate $1 $1
import $1
import $DIR/$1
import $DIR/repeated
import $DIR/unknown
import $DIR/number
grant --id=$1 Api
list --$1=x
-$1
list -o$1
list --sort $1:desc
create --uid 0 --function TAG --allow=:$1
create --uid 0 --function TAG --allow=A:,$1
create --uid 0 --function TAG --extra @$1
create --uid 0 --function TAG --extra @$DIR/$1
create --uid 0 --function TAG --extra {"$1":1,"$1":2}
create --uid 0 --function TAG --extra ["$1"]
create --uid 0 --function TAG --extra {"a":$1}
update TID --deadline @$1
update token--- --remove-allow $1
update token--- --remove-allow Api:$1
TABLE
}

# Superfluous arguments are named, but this one may be an id that got there by mistake. An id that a caller chose can
# contain slashes, as Base64 does.
@test "no id appears on standard error when it was given in a wrong place" {
    row token---
    for id in "$(printf 'Own+id-%08d/' {1..8})==" "$(a_token)"; do
        mkdir -p "$(dirname "$DIR/$id")"
        printf '\0' >"$DIR/$id"
        echo "{\"$id\":1,\"$id\":2}" >"$DIR/repeated"
        tool export 2>/dev/null | sed "s|^{|{\"$id\":1,|" >"$DIR/unknown"
        tool export 2>/dev/null | sed "s|\"uid\":0|\"uid\":${id//[^0-9]/}e|" >"$DIR/number"
        while read -r arguments; do
            run_tool $arguments
            [ "$status$output" = 2 ]
            [[ $stderr == "vemo-access-token: "* && $stderr != *"${id:8:20}"* ]]
        done < <(wrong_places "$id")
    done
    fails 2 "unknown command \"${ZEROS}0000000\"" "${ZEROS}0000000" # one byte less than an id has
    fails 2 "unknown command \"00000000...\"" "${ZEROS}00000000"
    fails 4 "$DIR/${id:0:8}.../x: Not a directory" export "$DIR/$id/x"
    fails 4 "$DIR/x/${id:0:8}...: No such file or directory" export "$DIR/x/$id"
    mkdir -p "$DIR/x/$id"
    fails 2 "$DIR/x/${id:0:8}... is not a regular file; to write to a pipe, write to standard output" \
        export "$DIR/x/$id"
}

@test "no id appears on standard error when SQLite's reason holds it" {
    id=$(a_token)
    sql "CREATE TRIGGER refuse BEFORE INSERT ON token BEGIN SELECT RAISE(ABORT, 'no (not $id)'); END"
    fails 4 "$REAL_DB failed: no (not ${id:0:4}...)" create --uid 0 --function VPN
}
