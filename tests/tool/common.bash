# Loaded by the tests of the tool. Each test has a directory of its own, in which the private directory
# and the database stand.
#   tool ARGUMENTS...       the tool, as the administrator calls it
#   sql STATEMENTS          on the database, behind the tool's back
#   a_token [OPTIONS...]    creates a token and prints its id
#   run_tool ARGUMENTS...   runs it: $status, $output (standard output), $stderr

bats_require_minimum_version 1.5.0

TOOL=${VEMO_TEST_TOOL:?names the tool: built with the redirection linked in}

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

run_tool()
{
    run --separate-stderr "$TOOL" "$@"
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
