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

@test "the page describes the commands that there are" {
    diff <(described | LC_ALL=C sort) <(commands_of_tool | LC_ALL=C sort)
}

@test "the page describes each command's options, all of them and no others" {
    common=$(section DESCRIPTION | grep '^\.It' | long_options)
    [ "$common" = "--help
--verbose
--version" ]
    [ "$(described | wc -l)" -ge 15 ]
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
    a_token >/dev/null
    diff <(section "OUTPUT FORMS" | sed -n 's/^\.It Ar //p') \
        <(tool list --no-header --limit 1 | cut -c 1-8 | tool show - --no-header | cut -d ' ' -f 1)
}

# locked ARGUMENTS...: the tool, while another process holds a lock
locked() {
    sqlite3 "$DB" "BEGIN EXCLUSIVE;" ".shell VEMO_TEST_HASTE=1 '$TOOL' $*"
}

@test "the tool prints the messages that the page explains under diagnostics" {
    ! grep -q __asan_init "$TOOL" || skip "AddressSanitizer takes more memory"
    [[ $(ldd "$TOOL" 2>&1) != *"not a dynamic executable"* ]] || skip "valgrind takes more memory"
    not_root=(env -u VEMO_REDIRECT_DIR)
    [ "$(id -u)" -ne 0 ] || not_root+=(setpriv --reuid=65534 --regid=65534 --clear-groups)
    "${not_root[@]}" test -x "$TOOL" || skip "uid 65534 cannot reach the build directory"
    while IFS='|' read -r sentence calls; do
        echo "$sentence" >>"$DIR/sentences"
        rm -rf "$VEMO_REDIRECT_DIR"
        row token---
        eval "$calls" >/dev/null 2>"$DIR/said" || true
        [[ $(cat "$DIR/said") == "vemo-access-token: "*${sentence//.../*}* ]] || {
            echo "$calls: does not say \"$sentence\", but \"$(cat "$DIR/said")\""
            return 1
        }
    done <<'TABLE'
only root may do this: the token database belongs to root, ...|"${not_root[@]}" "$TOOL" list
there is no directory ...|rm -r "$VEMO_REDIRECT_DIR"; tool list
there is no database ...|rm "$DB"; tool list
... has no table of tokens|sql "DROP TABLE token"; tool list
... stayed locked by another process for 5 seconds|locked list
... stayed locked by ... for 5 seconds|VEMO_TEST_HASTE=1 flock "$VEMO_REDIRECT_DIR.lock" "$TOOL" purge
... is not root's alone, and others could hold the lock for ever|chmod 0644 "$VEMO_REDIRECT_DIR.lock"; tool purge; rm "$VEMO_REDIRECT_DIR.lock"
... is a symbolic link; name the place that it leads to|ln -s here "$DIR/link"; tool export "$DIR/link/file"
... belongs to the database; choose another name|tool export "$DB"
... has a ... in the place of the table of tokens|sql "DROP TABLE token; CREATE VIEW token AS SELECT 1"; tool init
... holds a token that cannot be read|sql "UPDATE token SET extra = NULL"; tool list
... is damaged|truncate -s 8192 "$DB"; tool list
... is not a token database, or is damaged|printf '%04096d' 0 >"$DB"; tool list
token ... cannot be exported: ...|sql "UPDATE token SET extra = ''"; tool export
several tokens begin with ...|sql "INSERT INTO token SELECT tid || 'x', $ROW FROM token"; tool show token---
the user ... could not be looked up: ...|VEMO_TEST_LOOKUP=5 tool list --user root
granted, but there is no user of the number ...|VEMO_TEST_LOOKUP=0 tool grant "token---$ZEROS" Api --print-user
granted, but the user of the number ... could not be looked up: ...|VEMO_TEST_LOOKUP=5 tool grant "token---$ZEROS" Api --print-user
cannot write the result: ...|tool list >/dev/full
... the change may have been made|VEMO_TEST_SYNC=file tool revoke token---
... the change was made, but a power cut can undo it|VEMO_TEST_SYNC=directory tool revoke token---
... itself undoes each change: a trigger does that|sql "CREATE TRIGGER t UPDATE ON token BEGIN SELECT RAISE(IGNORE); END"; tool update token--- --bind-sid x
out of memory|head -c 60000000 /dev/zero | tr '\0' x >"$DIR/large"; (ulimit -v 100000; tool create --uid 0 --function VPN --extra "@$DIR/large")
TABLE
    # One line of the page can hold two of them.
    section DIAGNOSTICS | sed -n 's/^\.It "\(.*\)"$/\1/p' | sed 's/\.\.\., /...\n/; s/, \.\.\. /\n... /' | diff "$DIR/sentences" -
}

# Writes each literal block of the examples into its own file, in order.
example_blocks() {
    section EXAMPLES | sed 's/\\-/-/g; s/\\e/\\/g' |
        awk -v dir="$1" '/^\.Ed/ { file = "" } file { print >file } /^\.Bd -literal/ { file = dir "/" 100 + n++ }'
}

# Runs a command of the page, with the test's paths and users, and compares its output with the part that
# the page shows.
run_example() {
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
    mkdir "$DIR/blocks"
    tool_on_path
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
            *)
                cat "$block"
                false
                ;;
        esac
    done

    # One of them, for the backup, has moved to the other machine.
    [ "$(VEMO_REDIRECT_DIR=$DIR/new tool list --no-header --field function)" = nightly-backup ]
    [ "$(tool list --count)" -eq 0 ]
    [ "$(stat -c %a "$DIR/backup-token" "$DIR/tokens.jsonl" | sort -u)" = 600 ]
}

@test "the move to another machine deletes nothing unless all has arrived" {
    mkdir "$DIR/blocks"
    tool_on_path
    a_token >/dev/null
    a_token >/dev/null
    example_blocks "$DIR/blocks"
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
