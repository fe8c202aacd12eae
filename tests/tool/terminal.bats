#!/usr/bin/env bats
# What is different on a terminal: hidden prompts, questions, colours, the width of tables, progress bars

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
    # The same while a bar shows that the tool waits for the lock.
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

# Short values are what people copy or compare. Words are broken only where they are very long.
@test "long values go on in the next line and lose nothing, and short values are not broken for their sake" {
    row token--- "uid = 1, function = 'nightly backup', bind_sid = 'session-' || char(7), webapi_allow =
        '{\"Api\":{\"method\":[\"get\",\"list\"]},\"Example$(printf '.Long%.0s' {1..7})\":{\"method\":[\"put\"]}}'"
    shows 0 "\
TID       USER    FUNCTION  USES  DEADLINE              ALLOWS
token---  daemon  nightly      1  2286-11-20 17:46:39Z  Api:get,list
                  backup                                Example.Long.Long.Long.Long.Long.Long.Lo
                                                        ng:put" --columns 60 -- list --utc
    on_terminal --columns 60 -- show token--- --utc
    [ "$(sed 's/in [0-9]* d/in N d/' <<<"$output")" = "\
FIELD         VALUE
tid           token---00000000000000000000000000000000000000
              0000000000000000000000000000000000000000000000
              00000000000000000000000000000000000
bind_sid      session-\x07
uid           1 (daemon)
deadline      2286-11-20 17:46:39Z (in N d)
count         1
create_time   2001-09-09 01:46:40Z
function      nightly backup
webapi_allow  {\"Api\":{\"method\":[\"get\",\"list\"]},
              \"Example.Long.Long.Long.Long.Long.Long.Long\":{
              \"method\":[\"put\"]}}
extra         {}" ]
    on_terminal --columns 10 -- stats
    [[ $output == *$'\nfree pages of 4096 bytes       0\n'*$'\nnightly        1\nbackup '*$'\n  1  daemon       1' ]]
    on_terminal --columns 80 -- tune
    grep -qE "^look for a session's tokens +[0-9.]+ ms +[0-9.]+ ms" <<<"$output"
    # A terminal that does not know its width is taken for one of 80 columns.
    on_terminal --columns 80 -- list
    shows 0 "$output" --columns 0 -- list
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
70|TID       USER  FUNCTION  USES  DEADLINE             ALLOWS
TABLE
    shows 0 $'SESSION    EXPIRES\nsession-1  in 1000 d' --columns 19 -- list --columns session,expires
}

# Bytes that are not UTF-8, control characters, characters that change the direction of the text, and some that cannot
# be seen. A terminal with a character set of 8 bits takes the second byte of Û for ESC [.
EVIL=$'x\e[31my\a\x7f\xc2\x9b2Jz\x9b31m\u202eabc\u2066\u200b\u00ad\u2028\u3164\ufeff\U000e0041\ufe0fÛ\U00010000'

# in_all_forms LOCALE: prints on a terminal what the tool says of tokens that hold $EVIL, in each form
in_all_forms() {
    export DB EVIL ID EVIL_ID=${EVIL:6}$ZEROS NO_COLOR=1
    LC_ALL=$1 on_terminal --columns 200 --shell '
        "$0" list
        "$0" list -o json
        "$0" list -o jsonl
        "$0" list --field function
        "$0" list --field webapi_allow
        "$0" list --field tid --show-ids
        "$0" show $ID
        "$0" show $ID -o json
        "$0" show $ID --field bind_sid
        "$0" show $ID --field extra
        "$0" stats
        "$0" stats -o json
        "$0" stats --prometheus
        "$0" export
        "$0" create --uid 0 --function x --tid "$EVIL_ID"
        "$0" doctor
        "$0" doctor -o json
        "$0" list --user "$EVIL"
        "$0" list --"$EVIL"
        "$0" list --sort "$EVIL"
        "$0" "$EVIL"
        "$0" import "$EVIL"
        "$0" export "$EVIL/x"
        sqlite3 "$DB" "DROP TABLE token"
        "$0" list --verbose --function "$EVIL"' --
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

    # On a narrow terminal the bar stays on its line, and no word of the table is broken.
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
