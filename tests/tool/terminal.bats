#!/usr/bin/env bats
# The differences on a terminal: hidden prompts, questions, colours, the width of tables, progress bars

load common

ESC=$'\e'

setup_file() {
    export LC_ALL=C.UTF-8
}

# shows STATUS OUTPUT [OPTIONS] -- ARGUMENTS...: on a terminal, the tool ends with that status and shows that
shows() {
    on_terminal "${@:3}"
    expect "$1" "$2"
}

# below TITLE: all that stands below a title of the table in $output, joined, without blanks
below() {
    awk -v title="$1" '
        NR == 1 {
            start = index($0, title)
            next_title = substr($0, start + length(title))
            match(next_title, /^ */)
            width = RLENGTH < length(next_title) ? length(title) + RLENGTH : 10000
            next
        }
        { cells = cells substr($0, start, width) }
        END { gsub(/ /, "", cells); print cells }' <<<"$output"
}

@test "an id is asked for, and not shown" {
    id=$(a_token --allow Api --unlimited)
    while IFS='|' read -r arguments shown; do
        VEMO_TEST_WIPED=$DIR/wiped shows 0 "Token id: 
$shown" --answer "Token id: " "$id"$'\r' -- $arguments
        [ "$(cat "$DIR/wiped")" = "4096 $id" ] # the whole buffer that it was read into
        rm "$DIR/wiped"
        [ "$(cat "$DIR/modes")" = "typed: hidden
modes: as before" ]
    done <<TABLE
show - --field function|VPN
grant - Api|granted
revoke -|1 token revoked
create --uid 0 --function TAG --allow Api --tid -|$id
TABLE
    [ "$(sql "SELECT tid, function FROM token")" = "$id|TAG" ]
}

@test "a prompt can be answered with nothing" {
    row token---
    for reply in $'\r' $'\x04'; do
        shows 2 "Token id: 
vemo-access-token: TID: there is no id on standard input" --answer "Token id: " "$reply" -- show -
        [ "$(tail -n 1 "$DIR/modes")" = "modes: as before" ]
    done
    shows 0 "Token id: 
0 tokens revoked
vemo-access-token: no token matches" --answer "Token id: " $'\r' -- revoke -
}

@test "Ctrl-C at a prompt or a question leaves the terminal and the tokens as they were" {
    row token---
    on_terminal --answer "Token id: " $'token---00\x03' -- revoke -
    [ "$status $output" = "130 Token id: " ]
    [ "$(cat "$DIR/modes")" = "typed: hidden
modes: as before" ]
    on_terminal --answer "[y/N] " $'\x03' -- revoke --all
    [ "$status" -eq 130 ]
    [ "$(tail -n 1 "$DIR/modes")" = "modes: as before" ]
    expect_left token---
    # The same after a bar, which goes on while the tool waits for the lock.
    exec 9>>"$VEMO_REDIRECT_DIR.lock"
    flock 9
    on_terminal --answer "Tuning [" "" --answer "Tuning [" "" --answer "Tuning [" $'\x03' -- tune 9>&-
    [ "$status" -eq 130 ]
    exec 9>&-
}

@test "the prompt is not part of the result, and ids from a pipe need none" {
    row token---
    shows 0 "Token id: " --answer "Token id: " $'token---\r' --shell '"$0" check - Api >"$1"' -- "$DIR/result"
    [ "$(cat "$DIR/result")" = allowed ]
    shows 0 allowed --shell 'echo token--- | "$0" check - Api' --
}

@test "many tokens are revoked when the answer is yes, and left alone at any other" {
    rows <<<$'first\nsecond'
    cp "$DB" "$DIR/both"
    while IFS='|' read -r reply revoked; do
        cp "$DIR/both" "$DB"
        shows 0 "Revoke 2 tokens? [y/N] $reply
$revoked tokens revoked" --answer "Revoke 2 tokens? [y/N] " "$reply"$'\r' -- revoke --uid 0
        [ "$(sql "SELECT count(*) FROM token")" -eq $((2 - revoked)) ]
    done <<'TABLE'
y|2
yes|2
n|0
no|0
|0
yep|0
Ye|0
 |0
TABLE
    on_terminal --answer "Revoke 2 tokens? [y/N] " $'\x04' -- revoke --all
    [ "$status ${lines[-1]}" = "0 0 tokens revoked" ] # on a line of its own
    sql "DELETE FROM token WHERE tid LIKE 'first%'"
    shows 0 "Revoke 1 token? [y/N] y" --answer "[y/N] " $'y\r' --shell '"$0" revoke --all >"$1"' -- "$DIR/result"
    [ "$(cat "$DIR/result")" = "1 token revoked" ]
}

@test "nothing is asked where it is clear what to do, or where there is nobody to ask" {
    rows <<'END'
token---
another-
END
    shows 0 "2 tokens would be revoked" -- revoke --all --dry-run
    shows 0 "0 tokens revoked" -- revoke --function Other
    shows 2 "vemo-access-token: repeat with --yes: there is nobody to ask" --shell '"$0" revoke --all </dev/null' --
    shows 2 "" --shell '"$0" revoke --all 2>"$1"' -- "$DIR/stderr"
    [ "$(cat "$DIR/stderr")" = "vemo-access-token: repeat with --yes: there is nobody to ask" ]
    expect_left another- token---
    shows 0 "1 token revoked" -- revoke token---
    shows 0 "1 token revoked" -- revoke --all --yes
}

@test "expired tokens are red, but not without a terminal or with NO_COLOR" {
    row expired- "deadline = 5"
    row lasting-
    plain=$'expired-  5\nlasting-  9999999999'
    coloured=${ESC}[31m${plain/$'\n'/${ESC}[0m$'\n'}
    table=(list --no-header --epoch --columns "tid,deadline")
    shows 0 "$coloured" -- "${table[@]}"
    NO_COLOR= shows 0 "$coloured" -- "${table[@]}" --verbose # as if it were not set
    NO_COLOR=1 shows 0 "$plain" -- "${table[@]}"
    for option in "" --verbose; do
        shows 0 "" --shell "\"\$0\" ${table[*]} $option >\"\$1\"" -- "$DIR/result"
        [ "$(cat "$DIR/result")" = "$plain" ]
    done
    on_terminal -- show expired- --no-header --epoch
    [[ $(grep "$ESC" <<<"$output") == "${ESC}[31mdeadline  "*" ago)${ESC}[0m" ]]
    for arguments in "show lasting-" "list -o json"; do
        on_terminal -- $arguments
        [[ $status$output == 0* && $output != *"$ESC"* ]]
    done
}

@test "doctor's marks are coloured" {
    row token--- "deadline = 0"
    chmod 0755 "$VEMO_REDIRECT_DIR"
    while IFS='|' read -r no_color option mode deadline; do
        NO_COLOR=$no_color on_terminal -- doctor $option
        [ "$status" -eq 5 ]
        [ "$(grep -v '^ ' <<<"$output")" = "$mode: $REAL_DIRECTORY has mode 0755
$deadline: a deadline of 0 or less in 1 token (token---)" ]
    done <<TABLE
1||error|warning
||${ESC}[31merror${ESC}[0m|${ESC}[33mwarning${ESC}[0m
|--repair|${ESC}[32mrepaired${ESC}[0m|${ESC}[33mwarning${ESC}[0m
TABLE
    shows 5 "" --shell '"$0" doctor >"$1"' -- "$DIR/result"
    [[ $(cat "$DIR/result") == "warning: "* ]]
}

@test "long values go on in the next line, and lose nothing" {
    function=$(printf 'function-%.0s' {1..10})
    allow=Example.$(printf 'Long%.0s' {1..20}):get,list,$(printf 'put%.0s' {1..20})
    tool init
    id=$(tool create --uid 0 --ttl 9d12h --function "$function" --bind-sid $'session-\a' --allow "$allow" --allow Api)
    on_terminal --columns 60 -- list --show-ids
    [ "$status" -eq 0 ]
    [ "${#lines[@]}" -gt 4 ]
    [ "$(below TID)" = "$id" ]
    [ "$(below FUNCTION)" = "$function" ]
    [ "$(below ALLOWS)" = "Api$allow" ]
    on_terminal --columns 60 -- stats
    [ "$(wc -L <<<"$output")" -eq 60 ]
    # A terminal that does not know its width is taken for one of 80 columns.
    on_terminal --columns 80 -- list
    known=$output
    shows 0 "$known" --columns 0 -- list
    on_terminal --columns 60 -- show "$id"
    [ "$status" -eq 0 ]
    [ "$(awk 'length > 60' <<<"$output")" = "" ]
    values=$(below VALUE)
    [[ $values == "$id"'session-\x070'* ]]
    [[ $values == *"$function$(tool show "$id" --field webapi_allow){}" ]]
}

# Short values are what people copy or compare; other columns can become narrower.
@test "short values are not broken for the sake of long ones, and words only where they are very long" {
    id=$(a_token --allow "$(printf 'Example.Long%.0s' {1..20})" --allow Api:get,list --bind-sid "$(printf 's%.0s' {1..100})")
    sql "UPDATE token SET function = 'nightly backup', uid = 1, deadline = $(($(date +%s) + 1000 * 86400 + 600))"
    on_terminal --columns 60 -- list --utc
    [ "${lines[0]}" = "TID       USER    FUNCTION  USES  DEADLINE              ALLOWS" ]
    [[ ${lines[1]} =~ ^${id:0:8}\ \ daemon\ \ nightly\ {6}1\ \ 2[0-9]{3}-[0-9]{2}-[0-9]{2}\ [0-9]{2}:[0-9]{2}:[0-9]{2}Z\ \ Api:get,list$ ]]
    [[ ${lines[2]} =~ ^\ {18}backup\ +Example.LongExample.LongExample.LongExam$ ]]
    on_terminal --columns 10 -- stats
    [[ $output == *$'\nfree pages of 4096 bytes       0\n'* && $output == *$'\n  1  daemon       1' ]]
    on_terminal --columns 24 -- show "$id"
    for field in tid bind_sid uid deadline count create_time function webapi_allow extra; do
        grep -q "^$field  " <<<"$output"
    done
    on_terminal --columns 80 -- tune
    grep -qE "^look for a session's tokens +[0-9.]+ ms +[0-9.]+ ms" <<<"$output"
}

@test "a list leaves out what a terminal has no room for, unless it was asked for" {
    row token--- "deadline = $(($(date +%s) + 1000 * 86400 + 600)), bind_sid = 'session-1'"
    while IFS='|' read -r columns titles; do
        on_terminal --columns "$columns" -- list
        [ "${lines[0]}" = "$titles" ]
        [ "${#lines[@]}" -eq 2 ]
    done <<'TABLE'
82|TID       USER  FUNCTION  USES  DEADLINE             EXPIRES    SESSION    ALLOWS
81|TID       USER  FUNCTION  USES  DEADLINE             EXPIRES    ALLOWS
71|TID       USER  FUNCTION  USES  DEADLINE             EXPIRES    ALLOWS
70|TID       USER  FUNCTION  USES  DEADLINE             ALLOWS
20|TID       USER  FUNCTION  USES  DEADLINE             ALLOWS
TABLE
    shows 0 $'SESSION    EXPIRES\nsession-1  in 1000 d' --columns 20 -- list --columns session,expires
}

# Bytes that are no UTF-8, control characters, and characters that order the text anew or cannot be seen; of the
# last, of the first bytes of Û, too, a terminal with a character set of 8 bits takes one for ESC [.
EVIL=$'x\e[31my\a\x7f\xc2\x9b2Jz\x9b31m\u202eabc\u2066\u200b\u00ad\u2028\u3164\ufeff\U000e0041\ufe0fÛ\U00010000'

# in_all_forms [LOCALE]: prints on a terminal what the tool says of tokens that hold $EVIL, in each form
in_all_forms() {
    export EVIL ID EVIL_ID=${EVIL:6}$ZEROS NO_COLOR=1
    cat >"$DIR/commands" <<'TABLE'
list
list -o json
list -o jsonl
list --field function
list --field webapi_allow
list --field tid --show-ids
show $ID
show $ID -o json
show $ID --field bind_sid
show $ID --field extra
stats
stats -o json
stats --prometheus
export
create --uid 0 --function x --tid "$EVIL_ID"
doctor
doctor -o json
list --user "$EVIL"
list --"$EVIL"
list --sort "$EVIL"
"$EVIL"
import "$EVIL"
export "$EVIL/x"
list --verbose --function "$EVIL" # which lacks its table now
TABLE
    LC_ALL=$1 on_terminal --columns 200 --shell '
        while read -r arguments; do
            case $arguments in *--verbose*) sqlite3 "$2" "DROP TABLE token" ;; esac
            echo "$arguments"
            eval "\"\$0\" $arguments"
        done <"$1"' -- "$DIR/commands" "$DB"
}

@test "no text of a token or an argument can control the terminal" {
    tool init
    ID=$(tool create --uid 0 --function "$EVIL" --bind-sid "$EVIL" --allow "$EVIL:$EVIL" \
        --extra '{"x": "\u001b[31m\u007f\u009b\u202e\udb40\udc41"}')
    row doomed-- "tid = '${EVIL:6}', deadline = 0"
    for locale in C C.UTF-8; do
        cp "$DB" "$DIR/copy"
        in_all_forms "$locale"
        cp "$DIR/copy" "$DB"
        "$BATS_TEST_DIRNAME/visible.py" check <<<"$output"
        # In texts and in JSON.
        [[ $output == *'x\x1b[31my\x07\x7f\xc2\x9b2Jz\x9b31m\xe2\x80\xaeabc'* ]]
        [[ $output == *'x\u001b[31my\u0007\u007f\u009b2Jz\udc9b31m\u202eabc\u2066\u200b\u00ad\u2028\u3164\ufeff\udb40\udc41\ufe0f'* ]]
        [[ $output == *"run sql failed"* ]]
        [ "$locale" = C.UTF-8 ] || [ "$(LC_ALL=C tr -d '\n -~' <<<"$output")" = "" ]
        [ "$locale" = C.UTF-8 ] || [[ $output == *'\udb40\udc41\ufe0f\u00db\ud800\udc00'* ]]
    done
    [[ $output == *'there is no user "x'*Û* ]] # in sentences, too
    # Without a terminal, a value comes out as it is.
    gives "$EVIL" show "$ID" --field function
}

# shows_bar TITLE REST [OPTIONS] -- ARGUMENTS...: the tool shows a bar that grows from an empty one to a full one, and
# then the rest
shows_bar() {
    local first="$1 [                                        ]   0 %"
    local last="$1 [########################################] 100 %"
    on_terminal "${@:3}"
    expect 0 "${lines[0]}${2:+$'\n'$2}"
    [[ ${lines[0]} == $'\r'"$first"$'\r'* && ${lines[0]} == *$'\r'"$last" ]] || {
        echo "no bar: $(cat -v <<<"${lines[0]}")"
        return 1
    }
}

@test "export, import and tune show a progress bar on a terminal, which is not part of the result" {
    many_rows 2
    shows_bar Exporting "vemo-access-token: 2 tokens exported" -- export "$DIR/lines"
    shows_bar Exporting "vemo-access-token: 2 tokens exported" --shell '"$0" export >"$1"' -- "$DIR/result"
    cmp "$DIR/result" "$DIR/lines"
    shows_bar Tuning "" --shell '"$0" tune >"$1"' -- "$DIR/result"
    [[ $(head -n 1 "$DIR/result") =~ ^WHAT\ +BEFORE\ +AFTER$ ]]

    # A bar that does not get full ends before the reason is printed.
    sql "DELETE FROM token WHERE rowid = 1"
    on_terminal -- import "$DIR/lines"
    [[ ${lines[0]} == $'\r'"Importing ["* ]]
    expect 2 "${lines[0]}
vemo-access-token: $DIR/lines: line 2 has the id of a token that is there already; nothing of this file was imported"
    sql "DELETE FROM token"
    shows_bar Importing "2 tokens imported" -- import "$DIR/lines"

    # The bar stays on its line. A table that is wider than the terminal keeps its words.
    on_terminal --columns 10 -- tune --undo
    [[ ${lines[0]} == *$'\rTuning []' ]]
    on_terminal --columns 20 -- tune --undo
    [[ ${lines[0]} == *$'\rTuning [####] 100 %' ]]
    [[ $output == *$'\nlook for expired tokens, as every call does  '* ]]
}

@test "there is no progress bar where standard error is no terminal, or the result goes to the same" {
    many_rows 2
    shows 0 "" --shell '"$0" export "$1" 2>"$2"' -- "$DIR/lines" "$DIR/stderr"
    [ "$(cat "$DIR/stderr")" = "vemo-access-token: 2 tokens exported" ]
    sql "DELETE FROM token"
    shows 0 "2 tokens imported" --shell '"$0" import "$1" 2>"$2"' -- "$DIR/lines" "$DIR/stderr"
    [ ! -s "$DIR/stderr" ]
    shows 0 "write a small change" --shell '"$0" tune 2>"$1" | tail -n 1 | cut -c1-20' -- "$DIR/stderr"
    [ ! -s "$DIR/stderr" ]
    on_terminal --columns 1000 -- export
    expect 0 "$(tool export 2>/dev/null)
vemo-access-token: 2 tokens exported"
}

@test "a terminal that was stopped holds up the tool alone" {
    many_rows 300
    tool export "$DIR/file"
    sql "DELETE FROM token"
    for arguments in "import $DIR/file" tune; do
        # It is stopped as soon as the bar shows, and continued when another program has worked.
        /usr/bin/python3 - "$TOOL" $arguments >"$DIR/id" <<'END'
import os, pty, subprocess, sys, termios
own, other = pty.openpty()
tool = subprocess.Popen(sys.argv[1:], stderr=other, stdout=subprocess.DEVNULL)
os.read(own, 1)
termios.tcflow(other, termios.TCOOFF)
subprocess.run([sys.argv[1], "create", "--uid", "0", "--function", "f"], check=True, timeout=20)
termios.tcflow(other, termios.TCOON)
sys.exit(tool.wait(timeout=20))
END
        tool show - --field uid <"$DIR/id"
    done
    [ "$(tool list --count)" -eq 302 ]
}
