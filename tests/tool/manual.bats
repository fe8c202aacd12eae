#!/usr/bin/env bats
# The manual page beside the tool: it leaves nothing out, invents nothing, and its examples work.

load common

PAGE=$BATS_TEST_DIRNAME/../../man/vemo-access-token.8

# section TITLE: the source between this section's title and the next
section()
{
    sed -n "/^\.Sh $1\$/,/^\.Sh /p" "$PAGE" | sed 1d
}

# The commands that the section COMMANDS describes.
described()
{
    section COMMANDS | sed -n 's/^\.It Ic \([a-z]*\).*/\1/p'
}

# description COMMAND: what it says of one
description()
{
    section COMMANDS | sed -n "/^\.It Ic $1\( \|\$\)/,/^\.\(It Ic\|Ss\) /p" | sed '$d'
}

# The long options on standard input, each once.
long_options()
{
    grep -oE 'Fl -[a-z][a-z-]*' | sed 's/^Fl /-/' | LC_ALL=C sort -u
}

# options_of [COMMAND]: the long options that help lists
options_of()
{
    tool "$@" --help | sed -nE 's/^  (-[a-zA-Z],)?(--[a-z-]+).*/\2/p' | LC_ALL=C sort
}

@test "mandoc has nothing to say against the page" {
    command -v mandoc >/dev/null || skip "mandoc is not installed"
    run mandoc -T lint -W warning "$PAGE"
    [ "$status" -eq 0 ]
    [ "$output" = "" ]
}

@test "the page fits a terminal of 80 columns" {
    command -v mandoc >/dev/null || skip "mandoc is not installed"
    run bash -c "mandoc -T ascii -O width=80 '$PAGE' | sed 's/.\x08//g' | grep -E '.{81}'"
    [ "$status" -eq 1 ]
}

@test "the page describes the commands that there are" {
    diff <(described | LC_ALL=C sort) \
        <(tool --help | sed -n '/^Commands:/,/^$/s/^  \([a-z]\{1,\}\) .*/\1/p' | LC_ALL=C sort)
}

@test "the page describes each command's options, all of them and no others" {
    local common command
    common=$(section DESCRIPTION | grep '^\.It' | long_options)
    [ "$common" = "--help
--verbose
--version" ]
    [ "$(described | wc -l)" -ge 15 ]
    for command in $(described); do
        echo "$command:"
        options_of "$command" | grep -vxF -- "$common" >"$DIR/options" || true
        description "$command" | grep '^\.It Fl' | long_options | diff "$DIR/options" -
        # None that it has not is told of it in passing either.
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
    a_token >/dev/null
    diff <(section "OUTPUT FORMS" | sed -n 's/^\.It Ar //p') \
        <(tool list --no-header --limit 1 | cut -c 1-8 | tool show - --no-header | cut -d ' ' -f 1)
}

@test "what the page explains under diagnostics is what the tool says" {
    local sentence part
    section DIAGNOSTICS | sed -n 's/^\.It "\(.*\)"$/\1/p' >"$DIR/sentences"
    [ "$(wc -l <"$DIR/sentences")" -gt 5 ]
    while IFS= read -r sentence; do
        # The parts between the dots are fixed.
        while IFS= read -r part; do
            grep -qF -- "$part" "$BATS_TEST_DIRNAME"/../../tools/*.cpp || { echo "nobody says: $part"; false; }
        done < <(sed 's/,\{0,1\} *\.\.\. *,\{0,1\} */\n/g' <<<"$sentence" | grep .)
    done <"$DIR/sentences"
}

# Prints each literal block of the examples as a file of its own, in order.
example_blocks()
{
    section EXAMPLES | sed 's/\\-/-/g; s/\\e/\\/g' |
        awk -v dir="$1" '/^\.Ed/ { file = "" } file { print >file } /^\.Bd -literal/ { file = dir "/" 100 + n++ }'
}

# Runs a command of the page, with paths and users of the test's own, and compares what it prints with
# what the page shows of that.
run_example()
{
    local command shown=$2 expected=0
    command=$(sed "s|/usr/vemo/etc/private/session|$VEMO_REDIRECT_DIR|g; s|/root/|$DIR/|g
                   s|/var/backups/|$DIR/|g; s|--user backup|--user daemon|; s|--user alice|--user root|" <<<"$1")
    [[ $shown == refused:* ]] && expected=1
    local got=0
    eval "$command" >"$DIR/output" 2>"$DIR/error" || got=$?
    if [ "$got" -ne "$expected" ] || { [ "$shown" ] && [ "$shown" != "$(cat "$DIR/output")" ]; }; then
        echo "$command: status $got"
        cat "$DIR/output" "$DIR/error"
        return 1
    fi
}

# The commands of a block, each with what the page shows of its output.
run_block()
{
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

@test "the examples of the page do what it says, one after the other" {
    local block i
    mkdir "$DIR/bin" "$DIR/blocks" "$DIR/metrics"
    ln -s "$TOOL" "$DIR/bin/vemo-access-token"
    PATH=$DIR/bin:$PATH
    ssh()
    {
        [ "$1" = root@new ]
        VEMO_REDIRECT_DIR=$DIR/new "${@:2}"
    }
    tool init
    tool create --uid 0 --function VPN --tid "21IRmWbM$(tool generate)"
    for i in 1 2 3; do
        tool create --uid 0 --function VPN
    done
    tool create --uid 5 --function VPN --bind-sid 5f0c91ab
    tool create --uid 6 --function VPN --bind-sid 5f0c91ab

    example_blocks "$DIR/blocks"
    [ "$(find "$DIR/blocks" -type f | wc -l)" -ge 10 ]
    for block in "$DIR"/blocks/*; do
        case $(head -n 1 "$block") in
            "# "*) run_block <"$block" ;;
            "#!/bin/sh")
                sed "s|^PATH=.*|PATH=$PATH|; s|/var/lib/prometheus/node-exporter|$DIR/metrics|" "$block" >"$DIR/script"
                grep -qF "cd $DIR/metrics" "$DIR/script"
                sh "$DIR/script"
                grep -qxE 'vemo_access_token_tokens [0-9]+' "$DIR/metrics/tokens.prom"
                [ "$(ls "$DIR/metrics")" = tokens.prom ]
                ;;
            "*/5 * * * * root "*) [ "$(wc -l <"$block")" -eq 1 ] ;;
            *)
                cat "$block"
                false
                ;;
        esac
    done

    # One, for the backup, moved to the other machine.
    [ "$(VEMO_REDIRECT_DIR=$DIR/new tool list --no-header --field function)" = nightly-backup ]
    [ "$(tool list --count)" -eq 0 ]
    [ "$(stat -c %a "$DIR/backup-token" "$DIR/tokens.jsonl" | sort -u)" = 600 ]
}
