#!/usr/bin/env bats
# The completions for bash, zsh and fish. The shells run as they do for people: on a terminal, with the
# tab key; fish has a command of its own for that.

load common

# What help says of the tool itself or of a command.
commands_of_tool()
{
    tool --help | sed -n '/^Commands:/,/^$/s/^  \([a-z]\{1,\}\) .*/\1/p'
}

# options_of [COMMAND]
options_of()
{
    tool "$@" --help | sed -nE 's/^  (-[a-zA-Z],)?(--[a-z-]+).*/\2/p'
}

# Files to complete, and in the tool's place a program that tells that it was called.
prepare()
{
    COMPLETION=$BATS_TEST_DIRNAME/../../tools/completion
    mkdir -p "$DIR/bin" "$DIR/home" "$DIR/files/backups"
    touch "$DIR/files/data file.json" "$DIR/files/backups/tokens"
    printf '#!/bin/sh\ntouch "%s/called"\n' "$DIR" >"$DIR/bin/vemo-access-token"
    chmod +x "$DIR/bin/vemo-access-token"
    export PATH=$DIR/bin:$PATH HOME=$DIR/home LC_ALL=C.UTF-8
    unset XDG_CONFIG_HOME XDG_DATA_HOME XDG_CACHE_HOME
    cd "$DIR/files"
}

not_called()
{
    [ ! -e "$DIR/called" ]
}

need()
{
    command -v "$1" >/dev/null || skip "$1 is not installed"
}

# tab SHELL: types each line of standard input with a tab behind it into an interactive shell, whose
# setup is in $DIR/setup and writes what it offers into $DIR/offered. Prints, for each line, the words
# that it has become, and behind a bar what was offered.
tab()
{
    /usr/bin/python3 - "$1" "$DIR/setup" "$DIR/offered" 3<&0 <<'END'
import os
import pexpect
import sys

shell, setup, offered = sys.argv[1:]
arguments = {"bash": ["--norc", "--noprofile", "-i"], "zsh": ["-f", "-i"]}[shell]
environment = dict(os.environ, TERM="xterm", PS1="", INPUTRC="/dev/null")
child = pexpect.spawn(shell, arguments, encoding="utf-8", timeout=60, env=environment, dimensions=(50, 300))
child.delaybeforesend = None
child.sendline(f". '{setup}'; printf 'REA%s\\n' DY")
child.expect("READY\r\n")
for line in os.fdopen(3):
    open(offered, "w").close()
    # Then to the beginning of the line, to make it the arguments of another command.
    child.send(line.rstrip("\n") + "\t\x01printf '<%s>' \x05; printf 'EN%s\\n' D\r")
    child.expect("((?:<[^<>\r\n]*>)+)END\r\n")
    with open(offered) as file:
        print(child.match[1][1:-1].replace("><", ","), *sorted(set(file.read().split("\n")) - {""}), sep="|")
child.close(force=True)
END
}

bash_tab()
{
    need bash
    /usr/bin/python3 -c 'import pexpect' || skip "python3-pexpect is not installed"
    local framework=/usr/share/bash-completion/bash_completion
    [ -e "$framework" ] || skip "bash-completion is not installed"
    cat >"$DIR/setup" <<END
. $framework
. '$COMPLETION/vemo-access-token.bash'
noted() { _vemo_access_token "\$@"; printf '%s\n' "\${COMPREPLY[@]}" >'$DIR/offered'; }
complete -F noted vemo-access-token
bind 'set enable-bracketed-paste off'
END
    tab bash
}

zsh_tab()
{
    need zsh
    /usr/bin/python3 -c 'import pexpect' || skip "python3-pexpect is not installed"
    cat >"$DIR/setup" <<END
fpath=('$COMPLETION' \$fpath)
autoload -Uz compinit
compinit -D -u
bindkey -e
unset zle_bracketed_paste
PROMPT= RPROMPT=
compadd() {
    # Not where it only fills an array.
    local argument
    for argument; do
        [[ \$argument == (-|--) ]] && break
        [[ \$argument == -*[OAD] ]] && { builtin compadd "\$@"; return; }
    done
    local -a hits
    builtin compadd -A hits "\$@"
    print -rl -- \$hits >>'$DIR/offered'
    builtin compadd "\$@"
}
END
    tab zsh
}

fish_tab()
{
    need fish
    fish --no-config -c "source '$COMPLETION/vemo-access-token.fish'
        while read --line line
            set offered (complete -C \$line | string replace -r '\t.*' '' | LC_ALL=C sort)
            string join -- '|' \$line \$offered
        end
        true"
}

# offers SHELL: that the shell offers the commands and options that there are, and no others
offers()
{
    prepare
    local command
    {
        echo "vemo-access-token |$(commands_of_tool | LC_ALL=C sort | paste -sd '|')"
        echo "vemo-access-token --|$(options_of | LC_ALL=C sort | paste -sd '|')"
        for command in $(commands_of_tool); do
            echo "vemo-access-token $command --|$(options_of "$command" | LC_ALL=C sort | paste -sd '|')"
        done
    } >"$DIR/expected"
    [ "$(wc -l <"$DIR/expected")" -ge 17 ]
    cut -d '|' -f 1 "$DIR/expected" | "$1_tab" >"$DIR/lines"
    # What the line becomes is another matter.
    paste -d '|' <(cut -d '|' -f 1 "$DIR/expected") <(cut -d '|' -f 2- "$DIR/lines") >"$DIR/got"
    diff "$DIR/expected" "$DIR/got"
    not_called
}

# becomes SHELL: that lines become, behind "=>", these words
becomes()
{
    prepare
    cat >"$DIR/cases"
    sed 's/ *=>.*//' "$DIR/cases" >"$DIR/typed"
    sed 's/.*=> *//' "$DIR/cases" >"$DIR/expected"
    sed 's/^/vemo-access-token /' "$DIR/typed" | "$1_tab" | sed 's/|.*//; s/^vemo-access-token,//' >"$DIR/got"
    diff "$DIR/expected" "$DIR/got"
    not_called
}

# Words to type, with a tab behind, and the words that they become. The first is always the name of the
# tool.
CASES='li                            => list
list --user roo                      => list,--user,root
create --user=roo                    => create,--user=root
list --output ta                     => list,--output,table
check -o ta                          => check,-o,table
show -o c                            => show,-o,csv
list --columns exp                   => list,--columns,expires
list --columns tid,no                => list,--columns,tid,note
show --field=bin                     => show,--field=bind_sid
list --sort dea                      => list,--sort,deadline
list --sort count:                   => list,--sort,count:desc
list --sort=uid:d                    => list,--sort=uid:desc
list --limit 3 --sho                 => list,--limit,3,--show-ids
create --extra @da                   => create,--extra,@data file.json
update x --extra=@backups/           => update,x,--extra=@backups/tokens
import d                             => import,data file.json
export --verbose backups/to          => export,--verbose,backups/tokens
create --function li --b             => create,--function,li,--bind-sid
create --function list --tt          => create,--function,list,--ttl
create --function d                  => create,--function,d
create --allow d                     => create,--allow,d
create --tid d                       => create,--tid,d
show d                               => show,d
grant --user roo                     => grant,--user,roo
revoke d                             => revoke,d
doctor d                             => doctor,d
help doc                             => help,doctor
nothing --d                          => nothing,--d'

@test "bash completes the commands and options that there are" {
    offers bash
}

@test "bash completes values and files, and neither ids nor free texts" {
    becomes bash <<<"$CASES"
}

@test "bash offers values" {
    prepare
    run bash_tab <<'END'
vemo-access-token stats --output 
vemo-access-token list --field 
vemo-access-token list --sort uid
vemo-access-token create --extra 
vemo-access-token show 
END
    not_called
    expect 0 "vemo-access-token,stats,--output|json|jsonl|metrics|table
vemo-access-token,list,--field|bind_sid|count|create_time|deadline|extra|function|tid|uid|webapi_allow
vemo-access-token,list,--sort,uid|uid|uid:desc
vemo-access-token,create,--extra,@|@
vemo-access-token,show"
}

@test "zsh completes the commands and options that there are" {
    offers zsh
}

@test "zsh completes values and files, and neither ids nor free texts" {
    becomes zsh <<<"$CASES"
}

@test "zsh offers values, and no option that an earlier one excludes" {
    prepare
    run zsh_tab <<'END'
vemo-access-token stats --output 
vemo-access-token list --field 
vemo-access-token list --sort uid
vemo-access-token create --extra 
vemo-access-token show 
vemo-access-token tune --wal --
vemo-access-token update x --allow A --ttl 1h --
END
    not_called
    expect 0 "vemo-access-token,stats,--output|json|jsonl|metrics|table
vemo-access-token,list,--field|bind_sid|count|create_time|deadline|extra|function|tid|uid|webapi_allow
vemo-access-token,list,--sort,uid|uid|uid:desc
vemo-access-token,create,--extra,@|@
vemo-access-token,show
vemo-access-token,tune,--wal,--|--dry-run|--help|--no-header|--verbose|--version
vemo-access-token,update,x,--allow,A,--ttl,1h,--|--allow|--bind-sid|--extra|--help|--note|--unlimited|--uses|--verbose|--version"
}

@test "fish completes the commands and options that there are" {
    offers fish
}

@test "fish offers values and files, and neither ids nor free texts" {
    prepare
    run fish_tab <<'END'
vemo-access-token li
vemo-access-token list --user roo
vemo-access-token create --user=roo
vemo-access-token stats --output 
vemo-access-token check -o ta
vemo-access-token list --output 
vemo-access-token list --columns tid,no
vemo-access-token list --field 
vemo-access-token list --sort uid
vemo-access-token list --sort=count:
vemo-access-token create --extra 
vemo-access-token create --extra @da
vemo-access-token update x --extra=@backups/
vemo-access-token import d
vemo-access-token export --verbose backups/
vemo-access-token create --function list --tt
vemo-access-token create --function d
vemo-access-token create --allow d
vemo-access-token create --tid d
vemo-access-token show d
vemo-access-token grant --user roo
vemo-access-token revoke d
vemo-access-token doctor d
vemo-access-token help doc
vemo-access-token nothing --d
END
    not_called
    expect 0 "vemo-access-token li|list
vemo-access-token list --user roo|root
vemo-access-token create --user=roo|--user=root
vemo-access-token stats --output |json|jsonl|metrics|table
vemo-access-token check -o ta|table
vemo-access-token list --output |csv|json|jsonl|table
vemo-access-token list --columns tid,no|tid,note
vemo-access-token list --field |bind_sid|count|create_time|deadline|extra|function|tid|uid|webapi_allow
vemo-access-token list --sort uid|uid|uid:desc
vemo-access-token list --sort=count:|--sort=count:desc
vemo-access-token create --extra |@
vemo-access-token create --extra @da|@data file.json
vemo-access-token update x --extra=@backups/|--extra=@backups/tokens
vemo-access-token import d|data file.json
vemo-access-token export --verbose backups/|backups/tokens
vemo-access-token create --function list --tt|--ttl
vemo-access-token create --function d
vemo-access-token create --allow d
vemo-access-token create --tid d
vemo-access-token show d
vemo-access-token grant --user roo
vemo-access-token revoke d
vemo-access-token doctor d
vemo-access-token help doc|doctor
vemo-access-token nothing --d"
}
