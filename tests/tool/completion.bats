#!/usr/bin/env bats
# The completions for bash, zsh and fish. The shells run as they do for people: on a terminal, with the
# tab key; fish has its own command for that.

load common

# tab SHELL ARGUMENTS...: types each line of standard input with a tab behind it into this interactive shell, which
# has read $DIR/setup and writes what it offers into $DIR/offered. Prints, for each line, the words that it has become,
# and what was offered, behind bars.
tab() {
    local line answers=(--answer '$ ' ". '$DIR/setup'"$'\r' --answer READY)
    cat >>"$DIR/setup" <<END
end_line() {
    offered=\$(LC_ALL=C sort -u '$DIR/offered' | sed '/^\$/d' | paste -sd '|')
    echo "\${offered:+|\$offered}EN""D"
    : >'$DIR/offered'
}
: >'$DIR/offered'
echo REA""DY
END
    while IFS= read -r line; do
        # Then to the beginning of the line, to make it the arguments of another command.
        answers+=("$line"$'\t\x01printf "<%s>" \x05; end_line\r' --answer $'END\r\n')
    done
    TERM=xterm PS1='$ ' INPUTRC=/dev/null on_terminal --columns 300 "${answers[@]}" $'exit\r' --shell 'exec "$@"' -- "$@"
    grep -aoE '<vemo-access-token>.*END$' <<<"$output" | sed 's/END$//; s/^<//; s/></,/g; s/>//'
}

bash_tab() {
    local framework=/usr/share/bash-completion/bash_completion
    [ -e "$framework" ] || skip "bash-completion is not installed"
    cat >"$DIR/setup" <<END
. $framework
. '$COMPLETION/vemo-access-token.bash'
note_offers() { _vemo_access_token "\$@"; printf '%s\n' "\${COMPREPLY[@]}" >'$DIR/offered'; }
complete -F note_offers vemo-access-token
bind 'set enable-bracketed-paste off'
END
    tab bash --norc --noprofile -i
}

zsh_tab() {
    cat >"$DIR/setup" <<END
fpath=('$COMPLETION' \$fpath)
autoload -Uz compinit
compinit -D -u
bindkey -e
unset zle_bracketed_paste
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
    tab zsh -f -i
}

# What fish offers; the line becomes the first where all others begin with it.
fish_tab() {
    fish --no-config -c "source '$COMPLETION/vemo-access-token.fish'
        while read --line line
            set words (string split ' ' \$line)
            set offered (complete -C \$line | string replace -r '\t.*' '' | LC_ALL=C sort)
            set begun (string match -- \$words[-1]\* \$offered)
            test -z \"\$begun\"; or set offered \$begun # newer versions also offer what only resembles the word
            string match -qv -- \"\$offered[1]*\" \$offered; or test -z \"\$offered\"; or set words[-1] \$offered[1]
            string join -- '|' (string join -- ',' \$words) \$offered
        end
        true"
}

# What shells offer after these words.
OFFERED='vemo-access-token stats --output |json|jsonl|metrics|table
vemo-access-token list --output |csv|json|jsonl|table
vemo-access-token list --field |bind_sid|count|create_time|deadline|extra|function|tid|uid|webapi_allow
vemo-access-token list --sort uid|uid|uid:desc
vemo-access-token create --extra |@
vemo-access-token show '

# completes SHELL [LINES]: the shell offers the commands, options and values that there are, and no others, and besides
# what the lines say; and it completes the cases
completes() {
    local command
    command -v "$1" >/dev/null || skip "$1 is not installed"
    # Files to complete, and in the tool's place a program that records that it was called.
    COMPLETION=${TOOL%/tests/*}/tools/completion
    mkdir -p "$DIR/bin" "$DIR/home" "$DIR/files/backups"
    touch "$DIR/files/data file.json" "$DIR/files/backups/tokens"
    printf '#!/bin/sh\ntouch "%s/called"\n' "$DIR" >"$DIR/bin/vemo-access-token"
    chmod +x "$DIR/bin/vemo-access-token"
    export PATH=$DIR/bin:$PATH HOME=$DIR/home LC_ALL=C.UTF-8
    unset XDG_CONFIG_HOME XDG_DATA_HOME XDG_CACHE_HOME
    cd "$DIR/files"
    {
        echo "vemo-access-token |$(commands_of_tool | LC_ALL=C sort | paste -sd '|')"
        echo "vemo-access-token --|$(options_of | paste -sd '|')"
        for command in $(commands_of_tool); do
            echo "vemo-access-token $command --|$(options_of "$command" | paste -sd '|')"
        done
        echo "$OFFERED${2:+$'\n'$2}"
    } >"$DIR/expected"
    [ "$(wc -l <"$DIR/expected")" -ge 23 ]
    cut -d '|' -f 1 "$DIR/expected" | "$1_tab" >"$DIR/lines"
    paste -d '|' <(cut -d '|' -f 1 "$DIR/expected") <(sed 's/^[^|]*|\?//' "$DIR/lines") | diff <(sed 's/^[^|]*$/&|/' "$DIR/expected") -

    sed 's/ *=>.*//; s/^/vemo-access-token /' <<<"$CASES" | "$1_tab" | sed 's/|.*//; s/^vemo-access-token,//' >"$DIR/lines"
    sed 's/.*=> *//' <<<"$CASES" | diff - "$DIR/lines"
    [ ! -e "$DIR/called" ]
}

# Words to type, followed by a tab, and the words that they become. The first is always the name of the
# tool.
CASES='li                            => list
list --user roo                      => list,--user,root
create --user=roo                    => create,--user=root
check -o ta                          => check,-o,table
show -o c                            => show,-o,csv
list --columns exp                   => list,--columns,expires
list --columns tid,no                => list,--columns,tid,note
show --field=bin                     => show,--field=bind_sid
list --sort count:                   => list,--sort,count:desc
list --sort=uid:d                    => list,--sort=uid:desc
list --limit 3 --sho                 => list,--limit,3,--show-ids
create --extra @da                   => create,--extra,@data file.json
update x --extra=@backups/           => update,x,--extra=@backups/tokens
import d                             => import,data file.json
export --verbose backups/to          => export,--verbose,backups/tokens
create --function li --b             => create,--function,li,--bind-sid
create --function d                  => create,--function,d
create --tid d                       => create,--tid,d
show d                               => show,d
grant --user roo                     => grant,--user,roo
doctor d                             => doctor,d
help doc                             => help,doctor
nothing --d                          => nothing,--d'

@test "bash completes commands, options, values and files, and neither ids nor free texts" {
    completes bash
}

@test "zsh completes commands, options, values and files, and neither ids nor free texts" {
    # Nor an option that an earlier one excludes.
    completes zsh 'vemo-access-token tune --wal --|--deadline-only|--dry-run|--help|--no-header|--verbose|--version
vemo-access-token update x --allow A --ttl 1h --|--allow|--bind-sid|--extra|--help|--note|--unlimited|--uses|--verbose|--version'
}

@test "fish completes commands, options, values and files, and neither ids nor free texts" {
    completes fish
}
