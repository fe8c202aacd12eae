#!/usr/bin/env bats
# export and import

load common

LINE='{"bind_sid":"","count":1,"create_time":0,"deadline":9999999999,"extra":{},"function":"VPN","tid":"TID","uid":0,"webapi_allow":{}}'

# For VEMO_TEST_CALLS: the file system does not know files without a name.
NAMELESS='openat O_TMPFILE|95'

# a_tid LETTERS: an id of 127 characters that begins with them
a_tid()
{
    printf '%s%0*d' "$1" $((127 - ${#1})) 0
}

# a_line LETTERS: what export writes of a token
a_line()
{
    echo "${LINE/TID/$(a_tid "$1")}"
}

# a_row LETTERS: that token, written behind the tool's back
a_row()
{
    [ -e "$DB" ] || tool init >/dev/null
    sql "INSERT INTO token VALUES ('$(a_tid "$1")', '', 0, 9999999999, 1, 0, 'VPN', '{}', '{}')"
}

many_rows()
{
    tool init >/dev/null
    sql "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < $1)
         INSERT INTO token SELECT printf('%0127d', i), '', 0, 9999999999, 1, 0, 'VPN', '{}', '{}' FROM n"
}

all_rows()
{
    sql "SELECT hex(tid), hex(bind_sid), uid, deadline, count, create_time, hex(function), hex(webapi_allow), hex(extra)
         FROM token ORDER BY tid"
}

# expect_left LETTERS...: the tokens that are there, by their first letters, in order
expect_left()
{
    [ "$(sql "SELECT rtrim(tid, '0') FROM token ORDER BY tid" | xargs)" = "$*" ]
}

# on_terminal COMMAND...
on_terminal()
{
    run /usr/bin/python3 -c '
import pexpect, sys
child = pexpect.spawn(sys.argv[1], sys.argv[2:], timeout=30, dimensions=(24, 200))
child.expect(pexpect.EOF)
child.wait()
sys.stdout.buffer.write(child.before.replace(b"\r\n", b"\n"))
sys.exit(child.exitstatus)' "$@"
}

FULL_BAR='[########################################] 100 %'

# Whatever a field can hold, as the library writes it. The store takes more than creations do.
awkward_rows()
{
    tool init >/dev/null
    sql "INSERT INTO token VALUES
         ('$(a_tid A)', 's ''1\"', 0, 9999999999, 1, 0,
          'it''s \"q\" \\ /' || char(10, 13, 9, 1, 127) || 'Grüße 日本 😀', '{}', '{}'),
         ('$(a_tid B)', CAST(x'ff80fe41' AS TEXT), 0, 1, 0, 0, CAST(x'c328' AS TEXT),
          CAST(x'7b22ff223a7b226d6574686f64223a5b22c3225d7d7d' AS TEXT), CAST(x'7b2261223a22ff227d' AS TEXT)),
         ('$(a_tid C)'' ü', '', 4294967294, 9223372036854775807, -9223372036854775808, -9223372036854775808, 'F',
          '{\"\":{},\"Example.File\":{\"method\":[\"get\",\"li''st\"]},\"x\":\"y\"}',
          '{\"a\":{\"b\":[[],{},[1,[2,[null]]],true]},\"nul\":\"a\\u0000b\",\"ü\":\"\\n\\\"\\\\/\"}'),
         ('$(a_tid D)', '', 1000, 9999999999, 9223372036854775807, 1, 'F', '{}',
          '{\"d\":0.10000000000000001,\"e\":1.7976931348623157e+308,\"i\":Infinity,\"j\":-Infinity,' ||
          '\"l\":-9223372036854775808,\"t\":4.9406564584124654e-324,\"u\":18446744073709551615,\"z\":-0.0}'),
         ('', '', -1, 9999999999, 1, 0, '', 'null', '[1,\"\\u0000\"]'),
         ('short', '', 4294967295, 9999999999, 1, 0, 'F', 'true', '\"\\u0000\"'),
         ('-1', '', 9223372036854775807, 9999999999, 1, 0, 'F', '[]', '1.5')"
}

# --- export

@test "export writes each token as a line of JSON, its id included, and an end, and purges nothing" {
    a_row A
    sql "INSERT INTO token VALUES ('$(a_tid B)', 's', 1000, 1, -1, 5, 'Mail', '{\"Example.File\":{\"method\":[\"get\"]}}',
         '{\"a\":[1.5,\"é\"]}')"
    local text
    text=$({
        a_line A
        printf '%s"%s"%s\n' '{"bind_sid":"s","count":-1,"create_time":5,"deadline":1,"extra":{"a":[1.5,"é"]},"function":"Mail","tid":' \
            "$(a_tid B)" ',"uid":1000,"webapi_allow":{"Example.File":{"method":["get"]}}}'
    } | whole)
    run_tool export
    expect 0 "$text" "vemo-access-token: 2 tokens exported"
    run_tool export -
    expect 0 "$text" "vemo-access-token: 2 tokens exported"
    run_tool export "$DIR/file"
    expect 0 "" "vemo-access-token: 2 tokens exported"
    [ "$(cat "$DIR/file")" = "$text" ]
    expect_left A B
}

@test "an export of a selection is a whole one of these tokens" {
    local arguments letters
    a_row A
    a_row B
    a_row C
    sql "UPDATE token SET uid = 4294967294, create_time = 7 WHERE tid LIKE 'A%';
         UPDATE token SET count = -1, webapi_allow = '{\"Api\":{\"method\":[\"get\"]}}' WHERE tid LIKE 'B%';
         UPDATE token SET deadline = 1, bind_sid = 's', function = 'Mail' WHERE tid LIKE 'C%'"
    while IFS='|' read -r arguments letters; do
        run_tool export $arguments
        [ "$status" -eq 0 ]
        [ "$(grep -oE '"tid":".' <<<"$output" | cut -c 8 | xargs)" = "$letters" ]
        [ "$output" = "$(grep tid <<<"$output" | whole)" ]
    done <<'TABLE'
--uid 4294967294|A
--user root|B C
--function Mail|C
--bind-sid s|C
--created-before @7|B C
--created-after @7|A
--opens Api:get|B
--no-owner|A
--unlimited|B
--expired|C
--expiring 1h|
--user root --created-before @7 --function VPN|B
TABLE
    tool export --no-owner "$DIR/file"
    rm -r "$VEMO_REDIRECT_DIR"
    tool init
    run_tool import "$DIR/file"
    expect 0 "1 token imported"
    expect_left A
}

@test "export counts in plain English" {
    tool init
    run_tool export
    expect 0 "$(whole </dev/null)" "vemo-access-token: 0 tokens exported"
    a_row A
    run_tool export
    expect 0 "$(a_line A | whole)" "vemo-access-token: 1 token exported"
}

@test "an exported file has mode 0600 whatever the umask, and whatever was there" {
    a_row A
    install -m 0666 /dev/null "$DIR/file"
    local mask
    for mask in 0000 0077 0277 0777; do
        run --separate-stderr bash -c 'umask "$1" && "$0" export "$2"' "$TOOL" "$mask" "$DIR/file"
        [ "$status" -eq 0 ]
        [ "$(stat -c %a "$DIR/file")" = 600 ]
    done
}

@test "export replaces a file in one step" {
    a_row A
    mkdir "$DIR/out"
    echo old >"$DIR/out/file"
    exec 5<"$DIR/out/file"
    ln "$DIR/out/file" "$DIR/link"
    cd "$DIR/out"
    run_tool export file
    [ "$status" -eq 0 ]
    [ "$(cat <&5)" = old ]
    [ "$(cat "$DIR/link")" = old ]
    [ "$(cat file)" = "$(a_line A | whole)" ]
    [ "$(ls -A)" = file ]
    exec 5<&-
}

@test "an export that fails leaves what was there, and nothing else" {
    many_rows 10
    mkdir "$DIR/out"
    local limited='trap "" XFSZ; ulimit -f 1; exec "$0" "$@"'
    run --separate-stderr bash -c "$limited" "$TOOL" export "$DIR/out/file"
    expect 4 "" "vemo-access-token: $DIR/out/file: File too large"
    [ "$(ls -A "$DIR/out")" = "" ]
    echo old >"$DIR/out/file"
    run --separate-stderr bash -c "$limited" "$TOOL" export "$DIR/out/file"
    expect 4 "" "vemo-access-token: $DIR/out/file: File too large"
    [ "$(ls -A "$DIR/out")" = file ]
    [ "$(cat "$DIR/out/file")" = old ]
}

@test "export to a place where no file can be made ends in a sentence that names it" {
    a_row A
    mkdir "$DIR/work"
    cd "$DIR/work"
    mkdir out
    mkfifo fifo
    ln -s out/file link
    local file
    for file in out fifo link /dev/null; do
        run_tool export "$file"
        expect 2 "" "vemo-access-token: $file is not a regular file; to write to a pipe, write to standard output"
    done
    mkdir there
    ln -s there here
    run_tool export here/file
    expect 4 "" "vemo-access-token: here is a symbolic link; name the place that it leads to"
    [ -z "$(ls -A there)" ]
    run_tool export nowhere/file
    expect 4 "" "vemo-access-token: nowhere/file: No such file or directory"
    run_tool export "$DB/file"
    expect 4 "" "vemo-access-token: $DB/file: Not a directory"
    [ "$(ls -A out)" = "" ]
    [ ! -e nowhere ]
}

@test "an export never takes the place of the database, of what belongs to it, or of the lock" {
    a_row A
    ln "$DB" "$DIR/linked"
    touch "$DB-wal" "$DB-backup"
    ln "$DB-wal" "$DIR/linked-wal"
    ln "$VEMO_REDIRECT_DIR.lock" "$DIR/linked-lock"
    cp "$DB" "$DIR/before"
    local file
    for file in "$REAL_DB" "$DB" "$DB-journal" "$DB-wal" "$DB-shm" "$DB-backup" "$DIR/linked" "$DIR/linked-wal" \
        "$DIR/linked-lock" "$VEMO_REDIRECT_DIR.lock"; do
        run_tool export "$file"
        expect 2 "" "vemo-access-token: $file belongs to the database; choose another name"
    done
    cmp "$DB" "$DIR/before"
    [ "$(ls "$VEMO_REDIRECT_DIR")" = "${DB##*/}
${DB##*/}-backup
${DB##*/}-wal" ]
    # Elsewhere the names are anybody's.
    for file in "$DIR/${DB##*/}" "$DIR/vemo-access-token.lock" "$VEMO_REDIRECT_DIR/backup"; do
        run_tool export "$file"
        expect 0 "" "vemo-access-token: 1 token exported"
    done
}

@test "an export does not take the place of the lock while there is none, either" {
    in_namespace 'mount -t tmpfs tmpfs /run && "$1" init >/dev/null && rm /run/* &&
        "$1" export /run/another.lock && "$1" export /run/vemo-access-token.lock' "$TOOL"
    expect 2 "" "vemo-access-token: 0 tokens exported
vemo-access-token: /run/vemo-access-token.lock belongs to the database; choose another name"
}

@test "what others linked into a directory of theirs is not imported" {
    chmod 0755 "$DIR" # whatever the umask
    mkdir -m 0777 "$DIR/theirs"
    a_line A | whole >"$DIR/secret"
    tool init
    ln "$DIR/secret" "$DIR/theirs/file"
    run_tool import "$DIR/theirs/file"
    expect 2 "" "vemo-access-token: $DIR/theirs/file has other names besides, and others can change its directory; copy it to a place of yours"
    # Nor if they take it away again when it has been opened, or put another one there.
    VEMO_TEST_CALLS="fstat|rm $DIR/theirs/file" run_tool import "$DIR/theirs/file"
    expect 2 "" "vemo-access-token: $DIR/theirs/file has other names besides, and others can change its directory; copy it to a place of yours"
    [ ! -e "$DIR/theirs/file" ]
    ln "$DIR/secret" "$DIR/theirs/file"
    VEMO_TEST_CALLS="fstat|rm $DIR/theirs/file && touch $DIR/theirs/file" run_tool import "$DIR/theirs/file"
    expect 2 "" "vemo-access-token: $DIR/theirs/file has other names besides, and others can change its directory; copy it to a place of yours"
    # Nor what they put in its place while it is being opened; but a file that is theirs alone.
    cp "$DIR/secret" "$DIR/theirs/file"
    VEMO_TEST_CALLS="openat file|rm $DIR/theirs/file && mkfifo $DIR/theirs/file" run_tool import "$DIR/theirs/file"
    expect 2 "" "vemo-access-token: $DIR/theirs/file is not a regular file"
    rm "$DIR/theirs/file"
    cp "$DIR/secret" "$DIR/theirs/file"
    VEMO_TEST_CALLS="openat file|ln -sf $DIR/secret $DIR/theirs/file" run_tool import "$DIR/theirs/file"
    expect 2 "" "vemo-access-token: $DIR/theirs/file is a symbolic link; name the place that it leads to"
    rm "$DIR/theirs/file"
    cp "$DIR/secret" "$DIR/theirs/file"
    run_tool import "$DIR/theirs/file"
    expect 0 "1 token imported"
}

@test "an export leaves alone what is not its own beside it, and removes what one has left behind" {
    a_row A
    touch "$DIR/file"
    local in_the_way="vemo-access-token: $DIR/file.part is in the way: another export is writing it, or it is none's"
    install -m 0601 /dev/null "$DIR/file.part"
    run_tool export "$DIR/file"
    expect 4 "" "$in_the_way"
    chmod 0600 "$DIR/file.part"
    if [ "$(id -u)" -eq 0 ]; then
        chown 1 "$DIR/file.part"
        run_tool export "$DIR/file"
        expect 4 "" "$in_the_way"
        chown 0 "$DIR/file.part"
    fi
    run flock "$DIR/file.part" "$TOOL" export "$DIR/file"
    [ "$status" -eq 4 ]
    [ "$output" = "$in_the_way" ]
    [ ! -s "$DIR/file" ]
    run_tool export "$DIR/file"
    [ "$status" -eq 0 ]
    [ -s "$DIR/file" ]
    [ ! -e "$DIR/file.part" ]
}

@test "what an export writes has no name, and where it needs one, nobody takes it for remains" {
    a_row A
    mkdir "$DIR/out"
    VEMO_TEST_CALLS="fdopen|ls $DIR/out >$DIR/names" run_tool export "$DIR/out/file"
    expect 0 "" "vemo-access-token: 1 token exported"
    [ ! -s "$DIR/names" ]
    VEMO_TEST_CALLS="renameat file.part|! flock -ns $DIR/out/file.part true" run_tool export "$DIR/out/file"
    expect 0 "" "vemo-access-token: 1 token exported"
    install -m 0600 /dev/null "$DIR/out/file.part" # what another one has left behind
    VEMO_TEST_CALLS="$NAMELESS
fdopen|ls $DIR/out >$DIR/names; ! flock -ns $DIR/out/file.part true" run_tool export "$DIR/out/file"
    expect 0 "" "vemo-access-token: 1 token exported"
    [ "$(cat "$DIR/names")" = "file
file.part" ]
    [ "$(ls "$DIR/out")" = file ]
    [ "$(stat -c %a "$DIR/out/file")" = 600 ]
}

@test "an export with a name of its own leaves nothing when it fails, and never what is another's" {
    a_row A
    local another="is in the way: another export is writing it, or it is none's" there calls sentence left
    while IFS=% read -r there calls sentence left; do
        rm -rf "$DIR/out"
        mkdir "$DIR/out"
        cd "$DIR/out"
        install -m 0600 /dev/stdin ../another <<<another
        [ ! "$there" ] || cp -p ../another file.part
        VEMO_TEST_CALLS="$NAMELESS
$calls" run_tool export file
        expect 4 "" "vemo-access-token: $sentence"
        [ "$(ls)" = "${left:+file.part}" ]
        [ ! "$left" ] || [ "$(cat file.part)" = "${left#empty}" ]
    done <<TABLE
%fdopen|12%file: Cannot allocate memory%
%fstatat file|5%file: Input/output error%
%openat file.part|28%file: No space left on device%
%openat file.part|cp -p ../another file.part%file.part $another%another
%flock|mv ../another file.part%file.part $another%another
%flock|rm file.part%file: No such file or directory%
%flock|11%file.part $another%empty
there%flock|mv ../another file.part%file.part $another%another
there%flock|11%file.part $another%another
TABLE
}

@test "a file that is not on the disk, or its name, is no success" {
    a_row A
    mkdir "$DIR/elsewhere"
    VEMO_TEST_SYNC=$DIR/elsewhere run_tool export "$DIR/elsewhere/file"
    expect 4 "" "vemo-access-token: $DIR/elsewhere/file: Input/output error; the file is there, but a power cut can undo that"
    [ -s "$DIR/elsewhere/file" ]
    rm "$DIR/elsewhere/file"
    VEMO_TEST_SYNC=file run_tool export "$DIR/elsewhere/file"
    expect 4 "" "vemo-access-token: $DIR/elsewhere/file: Input/output error"
    [ "$(ls "$DIR/elsewhere")" = "" ]
}

@test "an empty name is no file" {
    a_row A
    local command
    for command in export import; do
        run_tool $command ""
        [ "$status" -eq 2 ]
        [[ $stderr == "vemo-access-token: FILE: "* ]]
    done
}

@test "an export that cannot be written to standard output is no success" {
    a_row A
    run --separate-stderr bash -c '"$0" export >/dev/full' "$TOOL"
    expect 4 "" "vemo-access-token: cannot write the result: No space left on device"
    run --separate-stderr bash -c '"$0" export >&-' "$TOOL"
    expect 4 "" "vemo-access-token: cannot write the result: Bad file descriptor"
}

@test "export takes one file, and no form" {
    a_row A
    run_tool export "$DIR/a" "$DIR/b"
    expect 2 "" "vemo-access-token: unexpected argument \"$DIR/b\""
    run_tool export -o json
    expect 2 "" "vemo-access-token: unknown option \"-o\""
    [ ! -e "$DIR/a" ]
}

@test "export never takes an unusable store for an empty one, and leaves no file" {
    local arguments
    mkdir "$DIR/out"
    for arguments in "" "$DIR/out/file"; do
        run_tool export $arguments
        expect 4 "" "vemo-access-token: there is no directory ${REAL_DB%/*}; \"vemo-access-token init\" makes it"
        mkdir -m 0700 "$VEMO_REDIRECT_DIR"
        run_tool export $arguments
        expect 4 "" "vemo-access-token: there is no database $REAL_DB; \"vemo-access-token init\" makes it"
        [ ! -e "$DB" ]
        : >"$DB"
        run_tool export $arguments
        expect 4 "" "vemo-access-token: $REAL_DB has no table of tokens; \"vemo-access-token doctor --repair\" makes it"
        echo "no database, but a text that is long enough to be told from an empty one" >"$DB"
        run_tool export $arguments
        expect 4 "" "vemo-access-token: $REAL_DB is not a token database, or is damaged (file is not a database)"
        rm "$DB"
        a_row A
        sql "UPDATE token SET extra = NULL"
        run_tool export $arguments
        expect 4 "" "vemo-access-token: $REAL_DB holds a token that cannot be read; \"vemo-access-token doctor\" finds it"
        rm -r "$VEMO_REDIRECT_DIR"
    done
    [ "$(ls -A "$DIR/out")" = "" ]
}

@test "a token that an import would not make again is told, and no export without it passes for a whole one" {
    a_row A
    a_row B
    sql "UPDATE token SET uid = 7 WHERE tid LIKE 'A%'"
    cp "$DB" "$DIR/sound"
    echo old >"$DIR/file"
    local keeps="; \"sqlite3 $REAL_DB '.backup FILE'\" keeps all" change reason told
    while IFS='~' read -r change reason; do
        echo "$change"
        sql "UPDATE token SET $change WHERE tid LIKE 'B%'"
        told="vemo-access-token: token $(sql "SELECT substr(CAST(tid AS TEXT), 1, 8) FROM token WHERE uid <> 7") cannot be exported: $reason"
        run_tool export
        expect 4 "$(a_line A | sed 's/"uid":0/"uid":7/')" "$told
vemo-access-token: 1 token exported; without 1 token, the export has no end$keeps"
        run_tool export "$DIR/file"
        expect 4 "" "$told
vemo-access-token: nothing exported; without 1 token, the file would not be whole$keeps"
        [ "$(cat "$DIR/file")" = old ]
        cp "$DIR/sound" "$DB"
    done <<TABLE
uid = 'root'~"uid" is not a whole number
deadline = 9999999999.5~"deadline" is not a whole number
count = 'two'~"count" is not a whole number
create_time = CURRENT_TIMESTAMP~"create_time" is not a whole number
tid = CAST(tid AS BLOB)~"tid" is not a text
bind_sid = x''~"bind_sid" is not a text
function = CAST('VPN' AS BLOB)~"function" is not a text
function = 'V' || char(0)~"function" holds a NUL character
tid = tid || char(0, 65)~"tid" holds a NUL character
extra = '{}' || char(0)~"extra" holds a NUL character
webapi_allow = x'7b7d00'~"webapi_allow" holds a NUL character
webapi_allow = '{"Api":'~"webapi_allow" is not JSON
extra = ''~"extra" is not JSON
extra = '{"a":"\ud800"}'~"extra" is not JSON
extra = '$(printf '{"a":%.0s' {1..1000})1$(printf '}%.0s' {1..1000})'~"extra" is nested too deeply
TABLE
}

# Some versions of jsoncpp read such a number as an infinite one, which is then what programs get of the token.
@test "a number that is too large comes back as the library reads it, or is told" {
    row A0000000 "extra = '{\"a\":1e400,\"b\":[-1e400]}'"
    run_tool show A0000000 --field extra
    local read=$output
    run_tool export "$DIR/file"
    if [ "$read" = '{"a":Infinity,"b":[-Infinity]}' ]; then
        expect 0 "" "vemo-access-token: 1 token exported"
        sql "DELETE FROM token"
        run_tool import "$DIR/file"
        expect 0 "1 token imported"
        run_tool show A0000000 --field extra
        expect 0 "$read"
    else
        [ "$read" = '{"a":null}' ]
        expect 4 "" "vemo-access-token: token A0000000 cannot be exported: \"extra\" is not JSON
vemo-access-token: nothing exported; without 1 token, the file would not be whole; \"sqlite3 $REAL_DB '.backup FILE'\" keeps all"
        [ ! -e "$DIR/file" ]
    fi
}

@test "an export names each token that is missing in it, in every field that can be wrong" {
    a_row A
    a_row B
    a_row C
    sql "UPDATE token SET count = 'x', extra = '' WHERE tid LIKE 'A%';
         UPDATE token SET webapi_allow = '[' WHERE tid LIKE 'C%'"
    run_tool export
    expect 4 "$(a_line B)" "vemo-access-token: token A0000000 cannot be exported: \"count\" is not a whole number
vemo-access-token: token C0000000 cannot be exported: \"webapi_allow\" is not JSON
vemo-access-token: 1 token exported; without 2 tokens, the export has no end; \"sqlite3 $REAL_DB '.backup FILE'\" keeps all"
    tool export 2>/dev/null >"$DIR/file" || true
    sql "DELETE FROM token"
    run_tool import "$DIR/file"
    expect 2 "" "vemo-access-token: $DIR/file: the export has no end; nothing of this file was imported; --partial imports what is there"
}

# --- import

@test "tokens come back from an export as they were, whatever they hold" {
    local seed=${VEMO_TEST_SEED-1} count=$((500 * ${VEMO_TEST_FACTOR-1}))
    echo "seed $seed"
    awkward_rows
    /usr/bin/python3 "$BATS_TEST_DIRNAME/odd_rows.py" "$DB" "$seed" "$count"
    all_rows >"$DIR/rows"
    [ "$(wc -l <"$DIR/rows")" -eq $((7 + count)) ]
    tool export "$DIR/file"
    sql "DELETE FROM token"
    tool import "$DIR/file"
    all_rows | cmp "$DIR/rows" -
    tool export "$DIR/again"
    cmp "$DIR/file" "$DIR/again"
}

@test "tokens move through a pipe to a machine that has no database yet" {
    awkward_rows
    local rows
    rows=$(all_rows)
    mkdir -m 0700 "$DIR/other"
    run --separate-stderr bash -c '"$0" export 2>/dev/null | VEMO_REDIRECT_DIR=$1 "$0" import -' "$TOOL" "$DIR/other"
    [ "$status" -eq 0 ]
    [ "$output" = "7 tokens imported" ]
    VEMO_REDIRECT_DIR=$DIR/other
    DB=$DIR/other/vemo-access-token.db
    [ "$(all_rows)" = "$rows" ]
    [ "$(stat -c %a "$DB")" = 700 ]
    run_tool purge
    expect 0 "1 token purged"
}

@test "an object nested as deeply as create takes comes back from an export" {
    tool init
    local deep
    deep=$(printf '{"a":%.0s' {1..999})1$(printf '}%.0s' {1..999})
    tool create --uid 0 --function VPN --extra "$deep"
    tool export "$DIR/file"
    sql "DELETE FROM token"
    run_tool import "$DIR/file"
    expect 0 "1 token imported"
    [ "$(sql "SELECT extra FROM token")" = "$deep" ]
}

@test "import passes over blank lines, and takes an end without its line feed" {
    tool init
    printf '\n%s\n \n\t\n%s\r\n\r\n%s\n' "$(a_line A)" "$(a_line B)" "$(a_line C)" | whole | head -c -1 >"$DIR/file"
    run_tool import "$DIR/file"
    expect 0 "3 tokens imported"
    expect_left A B C
}

@test "what is not the whole of an export is refused, unless --partial asks for what is there" {
    tool init
    cp "$DB" "$DIR/before"
    { a_line A; a_line B; } | whole >"$DIR/whole"
    local edit tokens flaw
    while IFS=';' read -r edit tokens flaw; do
        echo "$edit"
        eval "$edit" <"$DIR/whole" >"$DIR/file"
        run_tool import "$DIR/file"
        expect 2 "" "vemo-access-token: $DIR/file: $flaw; nothing of this file was imported; --partial imports what is there"
        cmp "$DB" "$DIR/before"
        run_tool import --partial - <"$DIR/file"
        expect 0 "$tokens imported" "vemo-access-token: standard input: $flaw; the whole lines were imported"
        cp "$DIR/before" "$DB"
    done <<'TABLE'
head -c 0;0 tokens;the export has no end
head -n 2;2 tokens;the export has no end
head -n 2 | head -c -1;2 tokens;the export has no end
head -n 2 | head -c -2;1 token;the export has no end, and line 2 is cut off
head -c 1;0 tokens;the export has no end, and line 1 is cut off
head -c -2;2 tokens;the export has no end, and line 3 is cut off
sed 1d;1 token;line 2 is the end of 2 tokens, not of 1
sed '3s/:"./:"x/';2 tokens;line 3 is the end of other lines: their checksum differs
sed '3s/"tokens":2/"tokens":3/';2 tokens;line 3 is the end of 3 tokens, not of 2
sed 2s/VPN/VPM/;2 tokens;line 3 is the end of other lines: their checksum differs
sed '1s/,/, /';2 tokens;line 3 is the end of other lines: their checksum differs
sed '1s/^/\n/';2 tokens;line 4 is the end of other lines: their checksum differs
sed '2s/$/\r/';2 tokens;line 3 is the end of other lines: their checksum differs
TABLE
}

@test "nothing may stand behind the end of an export, and --partial takes no bad line" {
    tool init
    cp "$DB" "$DIR/before"
    { a_line A; a_line B; } | whole >"$DIR/whole"
    local edit reason option
    while IFS=';' read -r edit reason; do
        echo "$edit"
        eval "$edit" <"$DIR/whole" >"$DIR/file"
        for option in "" --partial; do
            # shellcheck disable=SC2086 # none, too
            run_tool import $option "$DIR/file"
            [ "$status" -eq 2 ]
            [ "$output" = "" ]
            [[ $stderr == "vemo-access-token: $DIR/file: line $reason"*"; nothing of this file was imported" ]]
        done
        cmp "$DB" "$DIR/before"
    done <<'TABLE'
cat - <(echo);4 stands behind the end of the export
cat - <(a_line C);4 stands behind the end of the export
cat - <(printf '{');4 stands behind the end of the export
cat - "$DIR/whole";4 stands behind the end of the export
sed 3p;4 stands behind the end of the export
sed '3s/}}/,"x":1}}/';3 has no "tid"
sed '3s/}}/},"x":1}/';3 has no "tid"
sed '3s/2}/-2}/';3 has no "tid"
sed '3s/2}/2.5}/';3 has no "tid"
sed '3s/:"[^"]*"/:1/';3 has no "tid"
sed '3s/:.*/:[1,2]}/';3 has no "tid"
sed '1s/}$//';1 is not JSON: 
sed '2s/"uid":0,//';2 has no "uid"
head -n 1 | cat - <(printf x);2 is not JSON: 
head -n 1 | cat - <(printf '{\0');2 holds a NUL byte
TABLE
}

@test "an export that fails in front of a pipe imports nothing" {
    tool init
    cp "$DB" "$DIR/before"
    run --separate-stderr bash -c 'VEMO_REDIRECT_DIR=$1 "$0" export 2>/dev/null | "$0" import -' "$TOOL" "$DIR/nowhere"
    expect 2 "" "vemo-access-token: standard input: the export has no end; nothing of this file was imported; --partial imports what is there"
    cmp "$DB" "$DIR/before"
}

@test "import takes several files and standard input, each for itself" {
    tool init
    a_line A | whole >"$DIR/a"
    { a_line B; a_line C; } | whole >"$DIR/bc"
    run_tool import "$DIR/a" - "$DIR/bc" < <(a_line D | whole)
    expect 0 "1 token imported
1 token imported
2 tokens imported"
    expect_left A B C D
    sql "DELETE FROM token"
    { a_line B; a_line C; a_line A; } | whole >"$DIR/bc"
    run_tool import "$DIR/a" "$DIR/bc" "$DIR/unread"
    expect 2 "1 token imported" "vemo-access-token: $DIR/bc: line 3 has the id of a token that is there already; nothing of this file was imported"
    expect_left A
}

@test "--skip-existing leaves tokens as they are that are there already, and counts them" {
    a_row A
    sql "UPDATE token SET count = 7"
    { a_line A; a_line B; } | whole >"$DIR/file"
    run_tool import --skip-existing "$DIR/file"
    expect 0 "1 token imported; 1 token there already"
    run_tool import --skip-existing "$DIR/file"
    expect 0 "0 tokens imported; 2 tokens there already"
    expect_left A B
    [ "$(sql "SELECT count FROM token ORDER BY tid" | xargs)" = "7 1" ]
    # What stands twice in the file is a fault of the file.
    { a_line C; a_line C; } | whole >"$DIR/file"
    run_tool import --skip-existing "$DIR/file"
    expect 2 "" "vemo-access-token: $DIR/file: line 2 has the id of line 1; nothing of this file was imported"
}

@test "an id that is there twice is refused with its line" {
    a_row A
    sql "UPDATE token SET function = 'kept'"
    { a_line B; a_line A; } | whole >"$DIR/file"
    run_tool import "$DIR/file"
    expect 2 "" "vemo-access-token: $DIR/file: line 2 has the id of a token that is there already; nothing of this file was imported"
    run_tool import - <"$DIR/file"
    expect 2 "" "vemo-access-token: standard input: line 2 has the id of a token that is there already; nothing of this file was imported"
    { a_line B; echo; a_line C; a_line B; } >"$DIR/file"
    run_tool import "$DIR/file"
    expect 2 "" "vemo-access-token: $DIR/file: line 4 has the id of line 1; nothing of this file was imported"
    run_tool import - <"$DIR/file"
    expect 2 "" "vemo-access-token: standard input: line 4 has the id of line 1; nothing of this file was imported"
    expect_left A
    [ "$(sql "SELECT function FROM token")" = kept ]
}

@test "a line that is no token's record is refused with its number and the reason, and nothing is imported" {
    tool init
    cp "$DB" "$DIR/before"
    local from to reason
    while IFS='|' read -r from to reason; do
        to=${to//NUL/\\u0000}
        { a_line A; echo; local line=${LINE/"$from"/$to}; echo "${line/TID/$(a_tid B)}"; a_line C; } >"$DIR/file"
        run_tool import "$DIR/file"
        expect 2 "" "vemo-access-token: $DIR/file: line 3 $reason; nothing of this file was imported"
    done <<'TABLE'
"tid":"TID",||has no "tid"
"bind_sid":"",||has no "bind_sid"
"uid":0,||has no "uid"
"deadline":9999999999,||has no "deadline"
"count":1,||has no "count"
"create_time":0,||has no "create_time"
"function":"VPN",||has no "function"
,"webapi_allow":{}||has no "webapi_allow"
"extra":{},||has no "extra"
"tid":"TID"|"tid":1|"tid" is not a string
"bind_sid":""|"bind_sid":null|"bind_sid" is not a string
"function":"VPN"|"function":["VPN"]|"function" is not a string
"uid":0|"uid":"0"|"uid" is not a whole number
"uid":0|"uid":9223372036854775808|"uid" is not a whole number
"deadline":9999999999|"deadline":null|"deadline" is not a whole number
"deadline":9999999999|"deadline":9223372036854775808|"deadline" is not a whole number
"count":1|"count":1.5|"count" is not a whole number
"count":1|"count":true|"count" is not a whole number
"count":1|"count":Infinity|"count" is not a whole number
"count":1|"count":-9223372036854775809|"count" is not a whole number
"create_time":0|"create_time":{}|"create_time" is not a whole number
"extra":{}|"extra":{},"other":1|"other" is not a field of a token
"function":"VPN"|"function":"VNULN"|"function" holds a NUL character
"bind_sid":""|"bind_sid":"NUL"|"bind_sid" holds a NUL character
TID|TIDNUL|"tid" holds a NUL character
TABLE
    cmp "$DB" "$DIR/before"
}

@test "a line that is not a JSON object is refused with its number" {
    tool init
    cp "$DB" "$DIR/before"
    local good line
    good=$(a_line B)
    for line in '[]' "[$good]"; do
        { a_line A; echo "$line"; } >"$DIR/file"
        run_tool import "$DIR/file"
        expect 2 "" "vemo-access-token: $DIR/file: line 2 is not a JSON object; nothing of this file was imported"
    done
    for line in x 1 '"a"' null '{' "${good%?}" "$good," "$good$good" "$good x" "'$good'" "//$good" "${good/1/}" \
        "${good/VPN/\\ud800}" "${good/VPN/\\x}" "${good/:1,/:1,\"count\":2,}" "${good/:/}"; do
        { a_line A; echo "$line"; } >"$DIR/file"
        run_tool import "$DIR/file"
        [ "$status" -eq 2 ]
        [ "$output" = "" ]
        [[ $stderr == "vemo-access-token: $DIR/file: line 2 is not JSON: "*"; nothing of this file was imported" ]]
    done
    cmp "$DB" "$DIR/before"
}

@test "of a line that is not JSON, no other line's number is told" {
    tool init
    { a_line A; echo "{"; } >"$DIR/file"
    run_tool import "$DIR/file"
    [[ $stderr == *": line 2 "* ]]
    [[ $stderr != *"Line 1"* ]]
}

@test "a line that holds a NUL byte is refused" {
    tool init
    local format
    for format in '%s\0\n' '%s\0{broken\n' '\0%s\n'; do
        printf "$format" "$(a_line A)" >"$DIR/file"
        run_tool import "$DIR/file"
        [ "$status" -eq 2 ]
        [[ $stderr == "vemo-access-token: $DIR/file: line 1 "*"; nothing of this file was imported" ]]
        expect_left
    done
}

@test "an object nested too deeply is refused with its line" {
    tool init
    local line
    line=$(a_line A)
    printf '%s\n' "${line/\{\}/$(printf '{"a":%.0s' {1..1000})1$(printf '}%.0s' {1..1000})}" >"$DIR/file"
    run_tool import "$DIR/file"
    expect 2 "" "vemo-access-token: $DIR/file: line 1 is nested too deeply for JSON; nothing of this file was imported"
}

@test "the fields of a line may stand in any order, with spaces and escapes" {
    tool init
    printf '\t{ "webapi_allow" : {}, "uid" : 4294967294, "tid" : "%s", "function" : "\\u0056PN", "extra" : {}, "deadline" : 9999999999, "create_time" : 0, "count" : 2, "bind_sid" : "" } \n' "$(a_tid A)" | whole >"$DIR/file"
    run_tool import "$DIR/file"
    expect 0 "1 token imported"
    [ "$(sql "SELECT uid, deadline, count, function FROM token")" = "4294967294|9999999999|2|VPN" ]
}

@test "import tells of expired tokens, and keeps them" {
    tool init
    local line
    line=$(a_line A)
    { echo "${line/9999999999/1}"; line=$(a_line B); echo "${line/9999999999/-1}"; a_line C; } | whole >"$DIR/file"
    run_tool import "$DIR/file"
    expect 0 "3 tokens imported" "vemo-access-token: 2 of them expired: the next call of a program purges those"
    expect_left A B C
}

@test "a file that cannot be read is refused, and named" {
    tool init
    cp "$DB" "$DIR/before"
    cd "$DIR"
    ln -s loop loop
    mkdir directory
    local file reason
    mkfifo fifo
    ln -s directory link
    : >directory/file
    while IFS='|' read -r file reason; do
        run_tool import "$file"
        expect 2 "" "vemo-access-token: $reason"
    done <<TABLE
nowhere|nowhere: No such file or directory
nowhere/file|nowhere/file: No such file or directory
directory|directory: Is a directory
fifo|fifo is not a regular file
loop|loop is a symbolic link; name the place that it leads to
link/file|link is a symbolic link; name the place that it leads to
/proc/$$/mem|/proc/$$/mem: Input/output error
TABLE
    run_tool import
    expect 2 "" "vemo-access-token: FILE is required"
    run_tool import --force directory
    expect 2 "" "vemo-access-token: unknown option \"--force\""
    cmp "$DB" "$DIR/before"
}

@test "standard input that cannot be read is no empty file" {
    tool init
    run_tool import - <"$DIR"
    expect 2 "" "vemo-access-token: standard input: Is a directory"
}

@test "a file that may not be read is refused, and named" {
    [ "$(id -u)" -ne 0 ] || skip "root may read any file"
    tool init
    a_line A >"$DIR/file"
    chmod 0 "$DIR/file"
    run_tool import "$DIR/file"
    expect 2 "" "vemo-access-token: $DIR/file: Permission denied"
}

@test "a bad file makes no database" {
    mkdir -m 0700 "$VEMO_REDIRECT_DIR"
    echo x >"$DIR/file"
    run_tool import "$DIR/file"
    [ "$status" -eq 2 ]
    [ "$(ls -A "$VEMO_REDIRECT_DIR")" = "" ]
}

@test "import never takes an unusable store for an empty one" {
    a_line A | whole >"$DIR/file"
    whole </dev/null >"$DIR/empty"
    local file
    for file in "$DIR/file" "$DIR/empty"; do
        run_tool import "$file"
        expect 4 "" "vemo-access-token: there is no directory ${REAL_DB%/*}; \"vemo-access-token init\" makes it"
        mkdir -m 0700 "$VEMO_REDIRECT_DIR"
        sql "CREATE TABLE other (tid)"
        cp "$DB" "$DIR/other"
        run_tool import "$file"
        expect 4 "" "vemo-access-token: $REAL_DB has no table of tokens; \"vemo-access-token doctor --repair\" makes it"
        cmp "$DB" "$DIR/other"
        echo "no database, but a text that is long enough to be told from an empty one" >"$DB"
        cp "$DB" "$DIR/text"
        run_tool import "$file"
        expect 4 "" "vemo-access-token: $REAL_DB is not a token database, or is damaged (file is not a database)"
        cmp "$DB" "$DIR/text"
        rm -r "$VEMO_REDIRECT_DIR"
    done
}

@test "export and import show a bar on a terminal, and only there" {
    many_rows 250
    on_terminal "$TOOL" export "$DIR/file"
    [ "$status" -eq 0 ]
    [[ $output == $'\rExporting ['*$'\rExporting '"$FULL_BAR"$'\n'"vemo-access-token: 250 tokens exported" ]]
    sql "DELETE FROM token"
    on_terminal "$TOOL" export "$DIR/none"
    [[ $output == *$'\rExporting '"$FULL_BAR"$'\n'"vemo-access-token: 0 tokens exported" ]]
    on_terminal "$TOOL" import "$DIR/file"
    [ "$status" -eq 0 ]
    [[ $output == $'\rImporting ['*$'\rImporting '"$FULL_BAR"$'\n'"250 tokens imported" ]]
    on_terminal bash -c '"$0" export 2>"$1" >/dev/null' "$TOOL" "$DIR/stderr"
    [ "$output" = "" ]
    [ "$(cat "$DIR/stderr")" = "vemo-access-token: 250 tokens exported" ]
}
