# Loaded by the tests of the tool. Each test has its own directory, $DIR, with the private directory and the
# database in it.
#
# It calls the tool by one of these; each is explained below:
#   tool, run_tool and expect, succeeds, gives, says, ends, fails, refuses, expect_first, on_terminal, in_namespace
# makes what there is to work on with these:
#   a_token, row, rows, many_rows, whole
# and looks at the result with these:
#   sql, expect_left, expect_made, state

bats_require_minimum_version 1.5.0

TOOL=${VEMO_TEST_TOOL:?names the tool: built with the redirection linked in}

REAL_DB=/usr/vemo/etc/private/session/vemo-access-token.db
REAL_DIRECTORY=${REAL_DB%/*}
ID_LENGTH=127
ZEROS=$(printf '%0*d' $((ID_LENGTH - 8)) 0)
ROW="'', 0, 9999999999, 1, 1000000000, 'VPN', '{\"Api\":{\"method\":[\"get\"]}}', '{}'"

# What each command says of a store that is not as it should be.
NO_DIRECTORY="there is no directory $REAL_DIRECTORY; \"vemo-access-token init\" makes it"
NO_FILE="there is no database $REAL_DB; \"vemo-access-token init\" makes it"
NO_TABLE="$REAL_DB has no table of tokens; \"vemo-access-token doctor --repair\" makes it"
NO_DATABASE="$REAL_DB is not a token database, or is damaged (file is not a database)"

setup() {
    DIR=$BATS_TEST_TMPDIR
    export VEMO_REDIRECT_DIR=$DIR/session
    DB=$VEMO_REDIRECT_DIR/vemo-access-token.db
    export TZ=Europe/Berlin
    unset NO_COLOR
}

# tool ARGUMENTS...: the tool, as the administrator calls it
tool() {
    "$TOOL" "$@"
}

# tool_on_path: from now on, the tool is called by its name, too
tool_on_path() {
    mkdir -p "$DIR/bin"
    ln -sf "$TOOL" "$DIR/bin/vemo-access-token"
    PATH=$DIR/bin:$PATH
}

# run_tool ARGUMENTS...: sets $status, $output (standard output), $lines (those of it that are not empty) and $stderr.
# It does what "run --separate-stderr" does, in less time. The arguments are shown when a test fails.
run_tool() {
    local streams=$BATS_TEST_TMPDIR.streams
    echo "vemo-access-token ${*@Q}"
    status=0
    "$TOOL" "$@" >"$streams" 2>"$streams.errors" || status=$?
    output=$(<"$streams") stderr=$(<"$streams.errors")
    IFS=$'\n' read -r -d '' -a lines <"$streams" || true
}

# expect STATUS OUTPUT [STDERR]: the result of run_tool, exactly
expect() {
    if [ "$status" -ne "$1" ] || [ "$output" != "$2" ] || [ "$stderr" != "${3-}" ]; then
        printf '%-9s status %s\noutput:   %s\nstderr:   %s\n' \
            expected: "$1" "$2" "${3-}" got: "$status" "$output" "$stderr"
        return 1
    fi
}

# succeeds ARGUMENTS...: the tool ends with status 0 and says nothing on standard error; what it prints is $output
succeeds() {
    run_tool "$@"
    expect 0 "$output"
}

# gives OUTPUT ARGUMENTS...: the tool succeeds and prints that, and nothing on standard error
gives() {
    run_tool "${@:2}"
    expect 0 "$1"
}

# says OUTPUT SENTENCE ARGUMENTS...: the same, with that sentence on standard error
says() {
    run_tool "${@:3}"
    expect 0 "$1" "vemo-access-token: $2"
}

# ends STATUS OUTPUT ARGUMENTS...: the tool ends with that status, prints that, and nothing on standard error
ends() {
    run_tool "${@:3}"
    expect "$1" "$2"
}

# fails STATUS SENTENCE ARGUMENTS...: the tool ends with that status and that sentence, and prints no result
fails() {
    run_tool "${@:3}"
    expect "$1" "" "vemo-access-token: $2"
}

# expect_first FINDING: doctor has findings, and prints this one first
expect_first() {
    run_tool doctor
    [ "$status $stderr${lines[0]}" = "5 $1" ]
}

# refuses [ARGUMENTS...]: each line "ARGUMENTS|SENTENCE" of standard input, behind those, is a call that fails
# with status 2 and that sentence. The line can redirect standard input. All of the calls change nothing.
refuses() {
    local arguments sentence before
    before=$(state)
    while IFS='|' read -r arguments sentence; do
        eval "run_tool $* $arguments" </dev/null
        expect 2 "" "vemo-access-token: $sentence"
    done
    [ "$(state)" = "$before" ]
}

# on_terminal [OPTIONS OF terminal.py...] -- ARGUMENTS...: as run_tool, with all streams on a terminal; $output is what
# it shows, and the file $DIR/modes tells of its modes
on_terminal() {
    run --separate-stderr "$BATS_TEST_DIRNAME/terminal.py" --modes "$DIR/modes" "$@"
}

# Commands of root in a namespace of its own: file systems in memory lie over /usr and /run, that over /usr in $0.
OVERLAY='mount -t tmpfs tmpfs "$0" && mkdir "$0/upper" "$0/work" &&
    mount -t overlay overlay -o "lowerdir=/usr,upperdir=$0/upper,workdir=$0/work" /usr && mount -t tmpfs tmpfs /run'

# in_namespace COMMANDS [ARGUMENTS...]: bash executes them as root of such a namespace. There "tool" works on the real
# paths, $REAL_DIRECTORY and $REAL_DB, and nothing is there yet. What is not root maps itself alone to root.
in_namespace() {
    local namespace=(unshare --mount --propagation private)
    [ "$(id -u)" -eq 0 ] || namespace=(unshare --mount --user --map-root-user)
    [ ! -e /usr/vemo ] || skip "/usr/vemo exists"
    mkdir -p "$DIR/layer"
    "${namespace[@]}" bash -c "$OVERLAY" "$DIR/layer" 2>/dev/null || skip "no namespace with an overlay here"
    export -f tool
    export TOOL REAL_DIRECTORY REAL_DB
    run --separate-stderr "${namespace[@]}" bash -c "unset VEMO_REDIRECT_DIR; $OVERLAY; $1" "$DIR/layer" "${@:2}"
}

# commands_of_tool: the commands that help lists
commands_of_tool() {
    tool --help | sed -n '/^Commands:/,/^$/s/^  \([a-z]\{1,\}\) .*/\1/p'
}

# options_of [COMMAND]: the long options that help lists, of a command or of the tool itself
options_of() {
    tool "$@" --help | sed -nE 's/^  (-[a-zA-Z],)?(--[a-z-]+).*/\2/p' | LC_ALL=C sort
}

# calls: each way to open the database, but for doctor. $ID is a token of it, and $DIR/other an export of another.
calls() {
    whole </dev/null >"$DIR/none"
    cat <<TABLE
list
list --count
list -o json
show $ID
show ${ID:0:8}
check $ID Api get
grant $ID Api get
update $ID --uses 2
rotate $ID
revoke $ID
revoke --dry-run $ID
revoke --all --dry-run
revoke --all --yes
purge
purge --dry-run
stats
stats -o json
stats --prometheus
export
export $DIR/exported
import $DIR/other
import $DIR/none
create --uid 0 --function TAG
init
tune
tune --wal
tune --undo
tune --dry-run
TABLE
}

# need_store: makes the store if there is none
need_store() {
    [ -e "$DB" ] || tool init >/dev/null
}

# a_token [OPTIONS...]: creates a token and prints its id
a_token() {
    need_store
    tool create --uid 0 --function VPN "$@"
}

# row NAME [COLUMN = VALUE, ...]: inserts a token as $ROW has it, but for these columns, behind the tool's back. Its id
# is the name and zeros.
row() {
    rows <<<"$1|${2//$'\n'/ }"
}

# rows: the same for each line "NAME|COLUMN = VALUE, ..." of standard input
rows() {
    local name columns statements=
    need_store
    while IFS='|' read -r name columns; do
        name+=$ZEROS$ZEROS
        statements+="INSERT INTO token VALUES ('${name:0:ID_LENGTH}', $ROW);"
        statements+=${columns:+"UPDATE token SET $columns WHERE rowid = last_insert_rowid();"}
    done
    sql "BEGIN; $statements COMMIT"
}

# many_rows NUMBER [COLUMN = VALUE, ...]: inserts so many tokens, whose ids are numbers from 1 on
many_rows() {
    need_store
    sql "BEGIN; WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < $1)
         INSERT INTO token SELECT printf('%0${ID_LENGTH}d', i), $ROW FROM n; ${2:+UPDATE token SET $2;} COMMIT"
}

# whole: the lines of standard input as a whole export, with the end behind them
whole() {
    local lines
    lines=$(mktemp "$BATS_TEST_TMPDIR.XXXXXX")
    cat >"$lines"
    cat "$lines"
    printf '{"end":{"sha256":"%s","tokens":%d}}\n' "$(sha256sum <"$lines" | cut -c 1-64)" \
        "$(grep -c '[^[:space:]]' "$lines")"
}

# sql STATEMENTS: on the database, behind the tool's back
sql() {
    sqlite3 -cmd "PRAGMA synchronous = OFF" "$DB" "$1"
}

# expect_left NAME...: these tokens are there, in order, and no others; their ids are the names and zeros
expect_left() {
    local left
    left=$(sql "SELECT rtrim(tid, '0') FROM token ORDER BY 1" | xargs)
    echo "there are: $left"
    [ "$left" = "$*" ]
}

# expect_made: the directory, the file and an empty table are there, as programs expect them, and nothing else
expect_made() {
    [ "$(stat -c %a "$VEMO_REDIRECT_DIR" "$DB" | xargs)" = "700 700" ]
    [ "$(ls -A "$VEMO_REDIRECT_DIR")" = vemo-access-token.db ]
    [ "$(sql "PRAGMA auto_vacuum; SELECT count(*) FROM token; SELECT sql FROM sqlite_schema WHERE name = 'token'")" = "\
1
0
CREATE TABLE token (tid TEXT primary key NOT NULL,bind_sid TEXT,uid INTEGER,deadline INTEGER default -1,\
count INTEGER default 1,create_time INTEGER default CURRENT_TIMESTAMP,function TEXT NOT NULL,webapi_allow TEXT,extra TEXT)" ]
}

# state: what there is of the private directory, to the byte
state() {
    [ ! -e "$VEMO_REDIRECT_DIR" ] || find "$VEMO_REDIRECT_DIR" -printf '%P %y %m %s\n' | sort
    [ ! -f "$DB" ] || sha256sum "$DB"
}
