#!/usr/bin/env bats
# The manual page compared with the tool: it describes everything, invents nothing, and its examples work.

load common

PAGE=$BATS_TEST_DIRNAME/../../man/vemo-access-token.8

# section TITLE: the source between this section's title and the next
section() {
    sed -n "/^\.Sh $1\$/,/^\.Sh /p" "$PAGE" | sed 1d
}

# The commands that the section COMMANDS describes.
described() {
    section COMMANDS | sed -n 's/^\.It Ic \([a-z]*\).*/\1/p'
}

# description COMMAND: what it says of one
description() {
    section COMMANDS | sed -n "/^\.It Ic $1\( \|\$\)/,/^\.\(It Ic\|Ss\) /p" | sed '$d'
}

# The long options on standard input, each once.
long_options() {
    grep -oE 'Fl -[a-z][a-z-]*' | sed 's/^Fl /-/' | LC_ALL=C sort -u
}

@test "the page describes the commands that there are, and each command's options, all of them and no others" {
    diff <(described | LC_ALL=C sort) <(commands_of_tool | LC_ALL=C sort)
    common=$(section DESCRIPTION | grep '^\.It' | long_options)
    [ "$common" = "--help
--verbose
--version" ]
    for command in $(described); do
        echo "$command:"
        options_of "$command" | grep -vxF -- "$common" >"$DIR/options" || true
        description "$command" | grep '^\.It Fl' | long_options | diff "$DIR/options" -
        # Nor does the text mention an option that the command does not have.
        description "$command" | long_options | diff "$DIR/options" -
    done
    diff <(options_of) <(grep -vx -- --verbose <<<"$common")
}

@test "the page describes the exit statuses that help lists" {
    tool --help | tr -d '\n' | grep -oE '[0-9] [a-z]' | cut -c 1 | LC_ALL=C sort >"$DIR/statuses"
    section "EXIT STATUS" | sed -n 's/^\.It //p' | diff "$DIR/statuses" -
    [ "$(tail -n 1 "$DIR/statuses")" -eq 5 ]
}

@test "the page describes the fields of a token, and in their order" {
    diff <(section "OUTPUT FORMS" | sed -n 's/^\.It Ar //p') <(a_token | tool show - --no-header | cut -d ' ' -f 1)
}

# Each sentence of the page, in which "..." means any text, is one that other tests expect of the tool.
@test "the page explains messages that the tool prints" {
    # One line of the page can hold two of them.
    section DIAGNOSTICS | sed -n 's/^\.It "\(.*\)"$/\1/p' |
        sed 's/\.\.\., /...\n/; s/, \.\.\. /\n... /' >"$DIR/sentences"
    [ "$(wc -l <"$DIR/sentences")" -ge 23 ]
    grep -hv '^ *#\|^@test' "$BATS_TEST_DIRNAME"/*.ba* >"$DIR/expected"
    while IFS= read -r sentence; do
        echo "$sentence"
        sentence=${sentence#... }
        grep -q -- "${sentence//.../.*}" "$DIR/expected"
    done <"$DIR/sentences"
}

# write_examples: writes each literal block of the examples into its own file in $DIR/blocks, in order
write_examples() {
    mkdir "$DIR/blocks"
    section EXAMPLES | sed 's/\\-/-/g; s/\\e/\\/g' |
        awk -v dir="$DIR/blocks" '/^\.Ed/ { file = "" } file { print >file } /^\.Bd -literal/ { file = dir "/" 100 + n++ }'
}

# run_example COMMAND SHOWN: runs a command of the page, with the test's paths and users. It prints what the page shows, if
# the page shows anything.
run_example() {
    local command shown=$2 expected=0 got=0
    [[ $shown != refused:* ]] || expected=1
    command=$(sed "s|/usr/vemo/etc/private/session|$VEMO_REDIRECT_DIR|g; s|/root/|$DIR/|g
                   s|/var/backups/|$DIR/|g; s|--user backup|--user daemon|; s|--user alice|--user root|" <<<"$1")
    echo "$command"
    eval "$command" >"$DIR/output" || got=$?
    [ "$got" -eq "$expected" ]
    [ "$shown" = "" ] || diff "$DIR/output" - <<<"$shown"
}

# The commands of a block, each with what the page shows of its output.
run_block() {
    local line command= shown=
    while IFS= read -r line; do
        if [[ $line == "# "* ]]; then
            [ -z "$command" ] || run_example "$command" "$shown"
            command=${line#\# } shown=
        elif [[ $command == *\\ ]]; then
            command=${command%\\}$line
        else
            shown+=${shown:+$'\n'}$line
        fi
    done
    [ -z "$command" ] || run_example "$command" "$shown"
}

# ssh COMMAND...: on the other machine, which is called root@new
ssh() {
    [ "$1" = root@new ]
    VEMO_REDIRECT_DIR=$DIR/new "${@:2}"
}

@test "the examples of the page do what it says, one after the other" {
    tool_on_path
    tool init
    tool create --uid 0 --function VPN --tid "21IRmWbM$(tool generate)"
    for i in 1 2 3; do
        tool create --uid 0 --function VPN
    done
    tool create --uid 5 --function VPN --bind-sid 5f0c91ab
    tool create --uid 6 --function VPN --bind-sid 5f0c91ab

    write_examples
    [ "$(find "$DIR/blocks" -type f | wc -l)" -ge 10 ]
    for block in "$DIR"/blocks/*; do
        [[ $(head -n 1 "$block") == "# "* ]]
        run_block <"$block"
    done

    # One of them, for the backup, has moved to the other machine.
    [ "$(VEMO_REDIRECT_DIR=$DIR/new tool list --no-header --field function)" = nightly-backup ]
    [ "$(tool list --count)" -eq 0 ]
    [ "$(stat -c %a "$DIR/backup-token" "$DIR/tokens.jsonl" | sort -u)" = 600 ]
}

@test "the move to another machine deletes nothing unless all has arrived" {
    tool_on_path
    a_token >/dev/null
    a_token >/dev/null
    write_examples
    grep -lF root@new "$DIR"/blocks/* >"$DIR/move"
    [ "$(wc -l <"$DIR/move")" -eq 1 ]
    sed -n 's/^# //p; s/^    //p' "$(cat "$DIR/move")" >"$DIR/commands"
    [ "$(tail -n 1 "$DIR/commands" | grep -c 'revoke --all --yes')" -eq 1 ]
    before=$(state)

    # The commands on the new machine, and their results.
    while read -r fault; do
        echo "$fault"
        rm -rf "$DIR/new"
        bash -c "
            ssh() ( VEMO_REDIRECT_DIR=$DIR/new; shift; $fault; \"\$@\" )
            . $DIR/commands" || true
        [ "$(state)" = "$before" ]
    done <<'TABLE'
[ $2 != init ] || return 255
[ $2 != import ] || return 255
[ $2 != export ] || return 255
[ $2 != import ] || set -- sh -c 'head -n 1 | vemo-access-token import -'
[ $2 != export ] || set -- vemo-access-token purge
return 255
TABLE
}
