# Loaded by the tests of the tool. Each test has a directory of its own, in which the private directory
# and the database stand.
#   tool ARGUMENTS...       the tool, as the administrator calls it
#   sql STATEMENTS          on the database, behind the tool's back
#   a_token [OPTIONS...]    creates a token and prints its id
#   row NAME [COLUMN = VALUE, ...]  a token whose id is the name, of 8 characters, and $ZEROS; behind the tool's
#                           back. Its fields are those of ROW, which a file can set otherwise.
#   state                   what there is of the private directory, to the byte
#   whole                   the lines of standard input as a whole export: with the end behind them
#   in_namespace COMMANDS   the real path, where there is nothing else
#   run_tool ARGUMENTS...   runs it: $status, $output (standard output), $lines (of it, but for empty ones), $stderr

bats_require_minimum_version 1.5.0

TOOL=${VEMO_TEST_TOOL:?names the tool: built with the redirection linked in}

ZEROS=$(printf '%0119d' 0)
ROW="'', 0, 9999999999, 1, 1000000000, 'VPN', '{\"Api\":{\"method\":[\"get\"]}}', '{}'"

setup()
{
    DIR=$BATS_TEST_TMPDIR
    export VEMO_REDIRECT_DIR=$DIR/session
    DB=$VEMO_REDIRECT_DIR/vemo-access-token.db
    REAL_DB=/usr/vemo/etc/private/session/vemo-access-token.db
    export TZ=Europe/Berlin
    unset NO_COLOR
}

tool()
{
    "$TOOL" "$@"
}

# What "run --separate-stderr" does, in a third of the time.
run_tool()
{
    local streams=$BATS_TEST_TMPDIR.streams
    status=0
    "$TOOL" "$@" >"$streams" 2>"$streams.errors" || status=$?
    output=$(<"$streams")
    stderr=$(<"$streams.errors")
    local IFS=$'\n'
    set -f
    # shellcheck disable=SC2034,SC2206 # for the tests, which want the lines
    lines=($output)
    set +f
}

sql()
{
    sqlite3 "$DB" "$1"
}

a_token()
{
    [ -e "$DB" ] || tool init >/dev/null
    tool create --uid 0 --function VPN "$@"
}

row()
{
    [ -e "$DB" ] || tool init >/dev/null
    sql "INSERT INTO token VALUES ('$1$ZEROS', $ROW);
         ${2:+UPDATE token SET $2 WHERE rowid = last_insert_rowid();}"
}

whole()
{
    local lines
    lines=$(mktemp "$BATS_TEST_TMPDIR.XXXXXX")
    cat >"$lines"
    cat "$lines"
    printf '{"end":{"sha256":"%s","tokens":%d}}\n' "$(sha256sum <"$lines" | cut -c 1-64)" \
        "$(grep -c '[^[:space:]]' "$lines")"
}

state()
{
    [ ! -e "$VEMO_REDIRECT_DIR" ] || find "$VEMO_REDIRECT_DIR" -printf '%P %y %m %s\n' | sort
    [ ! -f "$DB" ] || sha256sum "$DB"
}

# refuses [ARGUMENTS]...: each line "ARGUMENTS|SENTENCE" of standard input, behind those, is a call that fails
# with status 2 and that sentence. All of them change nothing.
refuses()
{
    local arguments sentence before
    before=$(state)
    while IFS='|' read -r arguments sentence; do
        echo "$arguments"
        eval "run_tool $* $arguments" </dev/null
        expect 2 "" "vemo-access-token: $sentence"
    done
    [ "$(state)" = "$before" ]
}

# in_namespace COMMANDS ARGUMENTS...: runs them as root of a namespace, where a layer in memory lies over /usr
in_namespace()
{
    local overlay='mount -t tmpfs tmpfs "$0" && mkdir "$0/upper" "$0/work" &&
        mount -t overlay overlay -o "lowerdir=/usr,upperdir=$0/upper,workdir=$0/work" /usr'
    [ ! -e /usr/vemo ] || skip "/usr/vemo exists"
    mkdir "$DIR/layer"
    unshare --user --map-root-user --mount bash -c "$overlay" "$DIR/layer" 2>/dev/null ||
        skip "no namespace with an overlay here"
    run --separate-stderr unshare --user --map-root-user --mount bash -c "unset VEMO_REDIRECT_DIR; $overlay; $1" \
        "$DIR/layer" "${@:2}"
}

# expect STATUS OUTPUT [STDERR]: the result of run_tool, exactly
expect()
{
    if [ "$status" -ne "$1" ] || [ "$output" != "$2" ] || [ "$stderr" != "${3-}" ]; then
        echo "expected: status $1"
        echo "output:   $2"
        echo "stderr:   ${3-}"
        echo "got:      status $status"
        echo "output:   $output"
        echo "stderr:   $stderr"
        return 1
    fi
}
