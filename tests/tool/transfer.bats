#!/usr/bin/env bats
# export and import

load common

ROW="'', 0, 9999999999, 1, 0, 'VPN', '{}', '{}'"
TAIL=$(printf '%0*d' $((ID_LENGTH - 1)) 0) # of the id of a token whose name is one letter
LINE='{"bind_sid":"","count":1,"create_time":0,"deadline":9999999999,"extra":{},"function":"VPN","tid":"%s'$TAIL'","uid":0,"webapi_allow":{}}\n'

# For VEMO_TEST_CALLS: the file system has no files without a name.
NAMELESS='openat O_TMPFILE|95'

# written LETTER...: what export writes of these tokens, without the end
written() {
    # shellcheck disable=SC2059 # the letters are what it formats
    printf "$LINE" "$@"
}

# --- export

@test "export writes each token as a line of JSON, its id included, and an end, and purges nothing" {
    tool init
    says "$(whole </dev/null)" "0 tokens exported" export
    row A
    says "$(written A | whole)" "1 token exported" export
    row B "bind_sid = 's', uid = 1000, deadline = 1, count = -1, create_time = 5, function = 'Mail',
           webapi_allow = '{\"Example.File\":{\"method\":[\"get\"]}}', extra = '{\"a\":[1.5,\"é\"]}'"
    text=$({
        written A
        printf '%s%s\n' '{"bind_sid":"s","count":-1,"create_time":5,"deadline":1,"extra":{"a":[1.5,"é"]},"function":"Mail",' \
            '"tid":"B'"$TAIL"'","uid":1000,"webapi_allow":{"Example.File":{"method":["get"]}}}'
    } | whole)
    says "$text" "2 tokens exported" export
    says "$text" "2 tokens exported" export -
    fails 0 "2 tokens exported" export "$DIR/file"
    [ "$(cat "$DIR/file")" = "$text" ]
    expect_left A B
}

@test "an export of a selection is a whole export of these tokens" {
    rows <<'END'
A|uid = 4294967294, create_time = 7
B|count = -1, webapi_allow = '{"Api":{"method":["get"]}}'
C|deadline = 1, bind_sid = 's', function = 'Mail'
END
    while IFS='|' read -r arguments letters; do
        run_tool export $arguments
        [ "$status" -eq 0 ]
        [ "$(grep -oE '"tid":".' <<<"$output" | cut -c 8 | xargs)" = "$letters" ]
        [ "$output" = "$(grep tid <<<"$output" | whole)" ]
    done <<'TABLE'
--no-owner|A
--expired|C
--expiring 1h|
--user root --created-before @7 --function VPN|B
TABLE
}

@test "export replaces a file in one step by one of mode 0600, whatever the umask" {
    row A
    mkdir "$DIR/out"
    cd "$DIR/out"
    for mask in 0000 0077 0277 0777; do
        echo old >"$DIR/link"
        chmod 0666 "$DIR/link"
        ln -f "$DIR/link" file
        exec 5<file
        run --separate-stderr bash -c 'umask "$1" && "$0" export file' "$TOOL" "$mask"
        [ "$status" -eq 0 ]
        [ "$(cat - "$DIR/link" <&5)" = $'old\nold' ]
        exec 5<&-
        [ "$(cat file)" = "$(written A | whole)" ]
        [ "$(stat -c %a file) $(ls -A)" = "600 file" ]
    done
}

@test "an export that does not get to the disk fails, and leaves what was there, and nothing else" {
    many_rows 10
    mkdir "$DIR/out"
    for old in "" old; do
        [ ! "$old" ] || echo "$old" >"$DIR/out/file"
        run --separate-stderr bash -c 'trap "" XFSZ; ulimit -f 1; exec "$0" "$@"' "$TOOL" export "$DIR/out/file"
        expect 4 "" "vemo-access-token: $DIR/out/file: File too large"
        VEMO_TEST_SYNC=file fails 4 "$DIR/out/file: Input/output error" export "$DIR/out/file"
        [ "$(ls -A "$DIR/out")" = "${old:+file}" ]
        [ ! "$old" ] || [ "$(cat "$DIR/out/file")" = "$old" ]
    done
    # It is complete, but its name is not on the disk yet.
    cd "$DIR/out"
    VEMO_TEST_SYNC=. fails 4 "file: Input/output error; the file is there, but a power cut can undo that" export file
    [ "$(wc -l <file)" -eq 11 ]
}

@test "export to a place where no file can be made ends in a sentence that names it" {
    row A
    mkdir "$DIR/place" "$DIR/place/out" "$DIR/place/there"
    cd "$DIR/place"
    mkfifo fifo
    ln -s out/file link
    ln -s there here
    irregular="is not a regular file; to write to a pipe, write to standard output"
    refuses export <<TABLE
out|out $irregular
fifo|fifo $irregular
link|link $irregular
/dev/null|/dev/null $irregular
""|FILE: must not be empty
TABLE
    fails 4 "here is a symbolic link; name the place that it leads to" export here/file
    fails 4 "nowhere/file: No such file or directory" export nowhere/file
    fails 4 "$DB/file: Not a directory" export "$DB/file"
    [ "$(find . | sort | xargs)" = ". ./fifo ./here ./link ./out ./there" ]
}

@test "an export never takes the place of the database, of what belongs to it, or of the lock" {
    row A
    ln "$DB" "$DIR/linked"
    touch "$DB-wal" "$DB-backup"
    ln "$DB-wal" "$DIR/linked-wal"
    ln "$VEMO_REDIRECT_DIR.lock" "$DIR/linked-lock"
    cp "$DB" "$DIR/before"
    for file in "$REAL_DB" "$DB" "$DB-journal" "$DB-wal" "$DB-shm" "$DB-backup" "$DIR/linked" "$DIR/linked-wal" \
        "$DIR/linked-lock" "$VEMO_REDIRECT_DIR.lock"; do
        fails 2 "$file belongs to the database; choose another name" export "$file"
    done
    cmp "$DB" "$DIR/before"
    [ "$(cd "$VEMO_REDIRECT_DIR" && echo ./*)" = "./${DB##*/} ./${DB##*/}-backup ./${DB##*/}-wal" ]
    # In other directories any name may be used.
    for file in "$DIR/${DB##*/}" "$DIR/vemo-access-token.lock" "$VEMO_REDIRECT_DIR/backup"; do
        fails 0 "1 token exported" export "$file"
    done
}

@test "an export does not take the place of the lock, even while there is none" {
    in_namespace 'tool init >/dev/null && rm /run/* &&
        tool export /run/another.lock && tool export /run/vemo-access-token.lock'
    expect 2 "" "vemo-access-token: 0 tokens exported
vemo-access-token: /run/vemo-access-token.lock belongs to the database; choose another name"
}

@test "a file that others can have linked into their directory is not imported" {
    tool init
    chmod 0755 "$DIR" # whatever the umask
    mkdir -m 0777 "$DIR/theirs"
    written A | whole >"$DIR/secret"
    linked="has other names besides, and others can change its directory; copy it to a place of yours"
    theirs=$DIR/theirs/file secret=$DIR/secret
    # They can also remove or replace the file before or after it is opened.
    while IFS='|' read -r make calls sentence; do
        rm -f "$theirs"
        $make "$secret" "$theirs"
        VEMO_TEST_CALLS=${calls:+${calls/:/|}} fails 2 "$theirs $sentence" import "$theirs"
    done <<TABLE
ln||$linked
ln|fstat:rm $theirs|$linked
ln|fstat:rm $theirs && touch $theirs|$linked
cp|openat file:rm $theirs && mkfifo $theirs|is not a regular file
cp|openat file:ln -sf $secret $theirs|is a symbolic link; name the place that it leads to
TABLE
    # A file that has no other name is imported.
    rm "$theirs"
    cp "$secret" "$theirs"
    gives "1 token imported" import "$theirs"
}

@test "an export leaves the files of others alone, and removes what another export has left behind" {
    row A
    touch "$DIR/file"
    in_the_way="$DIR/file.part is in the way: another export is writing it, or it is none's"
    install -m 0601 /dev/null "$DIR/file.part"
    fails 4 "$in_the_way" export "$DIR/file"
    chmod 0600 "$DIR/file.part"
    if [ "$(id -u)" -eq 0 ]; then
        chown 1 "$DIR/file.part"
        fails 4 "$in_the_way" export "$DIR/file"
        chown 0 "$DIR/file.part"
    fi
    run --separate-stderr flock "$DIR/file.part" "$TOOL" export "$DIR/file"
    expect 4 "" "vemo-access-token: $in_the_way"
    [ ! -s "$DIR/file" ]
    fails 0 "1 token exported" export "$DIR/file"
    [ -s "$DIR/file" ]
    [ ! -e "$DIR/file.part" ]
}

@test "an export writes a file without a name; where it needs a name, no other export takes the file" {
    row A
    mkdir "$DIR/out"
    VEMO_TEST_CALLS="fdopen|ls $DIR/out >$DIR/names" fails 0 "1 token exported" export "$DIR/out/file"
    [ ! -s "$DIR/names" ]
    VEMO_TEST_CALLS="renameat file.part|! flock -ns $DIR/out/file.part true" \
        fails 0 "1 token exported" export "$DIR/out/file"
    install -m 0600 /dev/null "$DIR/out/file.part" # what another one has left behind
    VEMO_TEST_CALLS="$NAMELESS
fdopen|ls $DIR/out >$DIR/names; ! flock -ns $DIR/out/file.part true" fails 0 "1 token exported" export "$DIR/out/file"
    [ "$(cat "$DIR/names")" = "file
file.part" ]
    [ "$(ls "$DIR/out")" = file ]
    [ "$(stat -c %a "$DIR/out/file")" = 600 ]
}

@test "where an export needs a name, it leaves nothing when it fails, and leaves the files of others alone" {
    row A
    another="is in the way: another export is writing it, or it is none's"
    while IFS=% read -r there calls sentence left; do
        rm -rf "$DIR/out"
        mkdir "$DIR/out"
        cd "$DIR/out"
        install -m 0600 /dev/stdin ../another <<<another
        [ ! "$there" ] || cp -p ../another file.part
        VEMO_TEST_CALLS="$NAMELESS
$calls" fails 4 "$sentence" export file
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

@test "an export names a token that cannot be imported again, and is not whole without it" {
    row A "uid = 7"
    row B
    cp "$DB" "$DIR/sound"
    echo old >"$DIR/file"
    keeps="; \"sqlite3 $REAL_DB '.backup FILE'\" keeps all"
    while IFS='~' read -r change reason; do
        echo "$change"
        sql "UPDATE token SET $change WHERE tid LIKE 'B%'"
        told="token $(sql "SELECT substr(CAST(tid AS TEXT), 1, 8) FROM token WHERE uid <> 7") cannot be exported: $reason"
        run_tool export
        expect 4 "$(written A | sed 's/"uid":0/"uid":7/')" "vemo-access-token: $told
vemo-access-token: 1 token exported; without 1 token, the export has no end$keeps"
        fails 4 "$told
vemo-access-token: nothing exported; without 1 token, the file would not be whole$keeps" export "$DIR/file"
        [ "$(cat "$DIR/file")" = old ]
        cp "$DIR/sound" "$DB"
    done <<TABLE
uid = 'root'~"uid" is not a whole number
count = 'two'~"count" is not a whole number
tid = CAST(tid AS BLOB)~"tid" is not a text
function = CAST('VPN' AS BLOB)~"function" is not a text
function = 'V' || char(0)~"function" holds a NUL character
extra = '{}' || char(0)~"extra" holds a NUL character
webapi_allow = '{"Api":'~"webapi_allow" is not JSON
extra = ''~"extra" is not JSON
extra = '$(printf '{"a":%.0s' {1..1000})1$(printf '}%.0s' {1..1000})'~"extra" is nested too deeply
TABLE
}

# Some versions of jsoncpp read such a number as infinite; programs then get this value from the token.
@test "a number that is too large comes back as the library reads it, or is reported" {
    row A0000000 "extra = '{\"a\":1e400,\"b\":[-1e400]}'"
    run_tool show A0000000 --field extra
    read=$output
    run_tool export "$DIR/file"
    if [ "$read" = '{"a":Infinity,"b":[-Infinity]}' ]; then
        expect 0 "" "vemo-access-token: 1 token exported"
        sql "DELETE FROM token"
        gives "1 token imported" import "$DIR/file"
        gives "$read" show A0000000 --field extra
    else
        [ "$read" = '{"a":null}' ]
        expect 4 "" "vemo-access-token: token A0000000 cannot be exported: \"extra\" is not JSON
vemo-access-token: nothing exported; without 1 token, the file would not be whole; \"sqlite3 $REAL_DB '.backup FILE'\" keeps all"
        [ ! -e "$DIR/file" ]
    fi
}

@test "an export names each token that is missing in it" {
    rows <<'END'
A|count = 'x', extra = ''
B
C|webapi_allow = '['
END
    run_tool export
    expect 4 "$(written B)" "vemo-access-token: token A0000000 cannot be exported: \"count\" is not a whole number
vemo-access-token: token C0000000 cannot be exported: \"webapi_allow\" is not JSON
vemo-access-token: 1 token exported; without 2 tokens, the export has no end; \"sqlite3 $REAL_DB '.backup FILE'\" keeps all"
}

# --- import

@test "tokens come back from an export as they were, whatever they hold" {
    row without-id "tid = '', deadline = 1"
    /usr/bin/python3 "$BATS_TEST_DIRNAME/odd_rows.py" "$DB"
    all="SELECT hex(tid), hex(bind_sid), uid, deadline, count, create_time, hex(function), hex(webapi_allow), hex(extra)
         FROM token ORDER BY tid"
    sql "$all" >"$DIR/rows"
    [ "$(wc -l <"$DIR/rows")" -gt 250 ]
    tool export "$DIR/file"
    sql "DELETE FROM token"
    tool import "$DIR/file"
    sql "$all" | cmp "$DIR/rows" -
    tool export "$DIR/again"
    cmp "$DIR/file" "$DIR/again"
}

@test "tokens move through a pipe to a machine that has no database yet" {
    row A
    mkdir -m 0700 "$DIR/other"
    run --separate-stderr bash -c '"$0" export 2>/dev/null | VEMO_REDIRECT_DIR=$1 "$0" import -' "$TOOL" "$DIR/other"
    [ "$status $output" = "0 1 token imported" ]
    DB=$DIR/other/vemo-access-token.db
    expect_left A
    [ "$(stat -c %a "$DB")" = 700 ]
}

@test "import takes fields in any order, with spaces and escapes, blank lines, and an end without its line feed" {
    tool init
    printf '\n%s\n \n\t\n%s\r\n\r\n\t%s \n' "$(written A)" "$(written B)" '{ "webapi_allow" : {}, "uid" : 4294967294, "tid" : "C", "function" : "\u0056PN", "extra" : {}, "deadline" : 9999999999, "create_time" : 0, "count" : 2, "bind_sid" : "" }' |
        whole | head -c -1 >"$DIR/file"
    gives "3 tokens imported" import "$DIR/file"
    expect_left A B C
    [ "$(sql "SELECT uid, deadline, count, function FROM token WHERE tid = 'C'")" = "4294967294|9999999999|2|VPN" ]
}

@test "what is not the whole of an export is refused, unless --partial asks for what is there" {
    tool init
    cp "$DB" "$DIR/before"
    written A B | whole >"$DIR/whole"
    while IFS=';' read -r edit tokens flaw; do
        echo "$edit"
        eval "$edit" <"$DIR/whole" >"$DIR/file" || true
        fails 2 "$DIR/file: $flaw; nothing of this file was imported; --partial imports what is there" import "$DIR/file"
        cmp "$DB" "$DIR/before"
        for steps in "" --in-steps; do
            says "$tokens imported" "standard input: $flaw; the whole lines were imported" import --partial $steps - <"$DIR/file"
            cp "$DIR/before" "$DB"
        done
    done <<'TABLE'
head -c 0;0 tokens;the export has no end
VEMO_REDIRECT_DIR=$DIR/nowhere tool export 2>/dev/null;0 tokens;the export has no end
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

@test "a file with a bad line, or with more behind its end, is refused with the line's number and the reason" {
    tool init
    cp "$DB" "$DIR/before"
    written A B | whole >"$DIR/whole"
    deep=$(printf '{"a":%.0s' {1..1000})1$(printf '}%.0s' {1..1000})
    while IFS='~' read -r -a row; do # the reason is of one line, and does not say "Line 1" again
        for edit in "${row[@]:1}"; do
            echo "$edit"
            eval "$edit" <"$DIR/whole" >"$DIR/file"
            for option in "" --partial; do
                run_tool import $option "$DIR/file"
                [ "$status$output" = 2 ]
                [[ $stderr == "vemo-access-token: $DIR/file: line "${row[0]}"; nothing of this file was imported" ]]
            done
        done
    done <<'TABLE'
4 comes after the end of the export~cat - <(echo)~cat - <(written C)~cat - <(printf '{')~cat - "$DIR/whole"~sed 3p
3 has no "tid"~sed '3s/}}/,"x":1}}/'~sed '3s/}}/},"x":1}/'~sed '3s/2}/-2}/'~sed '3s/2}/2.5}/'~sed '3s/:"[^"]*"/:1/'
3 has no "tid"~sed '3s/:.*/:[1,2]}/'
2 has no "tid"~sed '2s/"tid":"[^"]*",//'
2 has no "uid"~sed '2s/"uid":0,//'
2 has no "extra"~sed '2s/"extra":{},//'
2 "tid" is not a string~sed '2s/"tid":"[^"]*"/"tid":1/'
2 "function" is not a string~sed '2s/"VPN"/["VPN"]/'
2 "uid" is not a whole number~sed '2s/"uid":0/"uid":"0"/'~sed '2s/"uid":0/"uid":9223372036854775808/'
2 "deadline" is not a whole number~sed '2s/9999999999/null/'~sed '2s/9999999999/9223372036854775808/'
2 "count" is not a whole number~sed '2s/"count":1/"count":1.5/'~sed '2s/"count":1/"count":true/'
2 "count" is not a whole number~sed '2s/"count":1/"count":Infinity/'~sed '2s/"count":1/"count":-9223372036854775809/'
2 "other" is not a field of a token~sed '2s/"extra":{}/&,"other":1/'
2 "function" holds a NUL character~sed '2s/VPN/V\\u0000N/'
2 is not a JSON object~sed '2s/.*/[]/'~sed '2s/.*/[&]/'
2 is not JSON: Column *~sed '2s/.*/x/'~sed '2s/.*/1/'~sed '2s/.*/{/'~sed '2s/$/ x/'~sed '2s/"count":1/&,"count":2/'
2 is not JSON: Column *~sed "2s/.*/'&'/"~sed '2s,^,//,'~sed '2s/VPN/\\ud800/'~head -n 1 | cat - <(printf x)
1 is not JSON: Column *~sed '1s/}$//'
2 holds a NUL byte~head -n 1 | cat - <(printf '{\0')
1 holds a NUL byte~sed '1s/$/\x00/'~sed '1s/$/\x00{broken/'~sed '1s/^/\x00/'
2 is nested too deeply for JSON~sed "2s/{}/$deep/"
TABLE
    cmp "$DB" "$DIR/before"
}

@test "import takes several files and standard input, each for itself" {
    tool init
    written A | whole >"$DIR/a"
    written B C | whole >"$DIR/bc"
    gives "1 token imported
1 token imported
2 tokens imported" import "$DIR/a" - "$DIR/bc" < <(written D | whole)
    expect_left A B C D
    sql "DELETE FROM token"
    written B C A | whole >"$DIR/bc"
    run_tool import "$DIR/a" "$DIR/bc" "$DIR/unread"
    expect 2 "1 token imported" "vemo-access-token: $DIR/bc: line 3 has the id of a token that is there already; nothing of this file was imported"
    expect_left A
}

@test "--skip-existing leaves tokens as they are that are there already, and counts them" {
    row A "count = 7"
    written A B | whole >"$DIR/file"
    gives "1 token imported; 1 token there already" import --skip-existing "$DIR/file"
    gives "0 tokens imported; 2 tokens there already" import --skip-existing "$DIR/file"
    expect_left A B
    [ "$(sql "SELECT count FROM token ORDER BY tid" | xargs)" = "7 1" ]
}

@test "an id that is there twice is refused with its line" {
    row A "function = 'kept'"
    while IFS='|' read -r letters option reason; do
        written $letters | sed G | whole >"$DIR/file"
        fails 2 "$DIR/file: $reason; nothing of this file was imported" import $option "$DIR/file"
        fails 2 "standard input: $reason; nothing of this file was imported" import $option - <"$DIR/file"
    done <<'TABLE'
B A||line 3 has the id of a token that is there already
B A|--partial|line 3 has the id of a token that is there already
B C B||line 5 has the id of line 1
B B|--skip-existing|line 3 has the id of line 1
TABLE
    expect_left A
    [ "$(sql "SELECT function FROM token")" = kept ]
}

@test "import reports expired tokens, and keeps them" {
    tool init
    written A B C | sed '1s/9999999999/1/; 2s/9999999999/-1/' | whole >"$DIR/file"
    says "3 tokens imported" "2 of them expired: the next call of a program purges those" import "$DIR/file"
    expect_left A B C
}

@test "a file that cannot be read is refused, and named" {
    tool init
    mkdir "$DIR/place"
    cd "$DIR/place"
    ln -s loop loop
    mkdir directory
    mkfifo fifo
    ln -s directory link
    : >directory/file
    written A >forbidden
    chmod 0 forbidden
    refuses import <<TABLE
nowhere|nowhere: No such file or directory
directory|directory: Is a directory
- <directory|standard input: Is a directory
fifo|fifo is not a regular file
loop|loop is a symbolic link; name the place that it leads to
link/file|link is a symbolic link; name the place that it leads to
/proc/$$/mem|/proc/$$/mem: Input/output error
|FILE is required
""|FILE: must not be empty
TABLE
    [ "$(id -u)" -eq 0 ] || refuses import <<<"forbidden|forbidden: Permission denied"
    # No database is made for a bad file.
    rm "$DB"
    echo x >file
    run_tool import file
    [ "$status" -eq 2 ]
    [ ! -e "$DB" ]
}
