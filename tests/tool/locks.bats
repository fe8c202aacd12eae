#!/usr/bin/env bats
# Locks that other programs hold: what took effect after waiting is reported as done, and what did not
# changed nothing

load common

EXCLUSIVE="BEGIN EXCLUSIVE;"
WRITING="BEGIN IMMEDIATE;"
# An open read transaction blocks a change when it is committed, not when it begins.
READING="BEGIN; SELECT tid FROM token WHERE tid = '';"

# lock STATEMENTS: another program executes them, and keeps the lock that they take
lock() {
    coproc other { exec sqlite3 "$DB" 3>&-; }
    OTHER=$!
    other "$1"
}

# other STATEMENTS: that program executes these, too
other() {
    echo "$1 SELECT 'done';" >&"${other[1]}"
    read -r -t 20 -u "${other[0]}"
}

# unlock [STATEMENTS]: it executes these, and ends
unlock() {
    printf '%s\n.quit\n' "${1-}" >&"${other[1]}"
    wait "$OTHER"
}

# start ARGUMENTS...: the tool runs in the background. Stream 9 has a line for each time that it waits for a lock.
start() {
    rm -f "$DIR/waits"
    mkfifo "$DIR/waits"
    exec 9<>"$DIR/waits" # open for reading before the tool writes
    VEMO_TEST_WAITS=$DIR/waits "$TOOL" "$@" <&0 >"$DIR/out" 2>"$DIR/err" 3>&- 9>&- &
    STARTED=$!
}

# finish: waits for its end; sets $status, $output and $stderr as run_tool does
finish() {
    status=0
    wait "$STARTED" || status=$?
    output=$(<"$DIR/out") stderr=$(<"$DIR/err")
}

# run_waiting STATEMENTS ARGUMENTS...: as run_tool, while another program holds the lock that the statements take. When
# the tool waits for it, the tool gets $SIGNAL, if that is set, and the other program commits and ends.
run_waiting() {
    lock "$1"
    start "${@:2}"
    read -r -t 20 -u 9
    [ -z "${SIGNAL-}" ] || kill "-$SIGNAL" "$STARTED"
    unlock "COMMIT;"
    finish
}

# a_store: a token with five uses, $ID, and an expired one; $DIR/other holds a third that is not in it
a_store() {
    ID=$(a_token --allow Api:get --uses 5 --ttl 90m) # for half an hour, it will show "in 1 h"
    tool export 2>/dev/null | sed '$d; s/"tid":"......../"tid":"________/' | whole >"$DIR/other"
    sql "INSERT INTO token SELECT 'old' || tid, 'old', uid, strftime('%s', 'now') - 5400, count, create_time, function,
         webapi_allow, extra FROM token"
}

# stored: uses and session of each token
stored() {
    sql "SELECT group_concat(count || '/' || bind_sid, ' ') FROM (SELECT * FROM token ORDER BY deadline, tid)"
}

@test "reading waits for a lock, and then shows what there is" {
    a_store
    while read -r arguments; do
        expected=$(tool $arguments 2>/dev/null)
        run_waiting "$EXCLUSIVE" $arguments
        expect 0 "$expected" "$([ "$arguments" != export ] || echo "vemo-access-token: 2 tokens exported")"
    done < <(calls |
        grep -xE "list|list --count|show $ID|check .*|stats -o json|export|purge --dry-run|revoke .*--dry-run.*")
    tool purge >/dev/null
    run_waiting "$EXCLUSIVE" doctor
    [ "$status" -eq 0 ]
    [ "$(tail -n 1 <<<"$output")" = "no findings" ]
    run_waiting "$EXCLUSIVE" tune --dry-run
    [ "$status$stderr" = 0 ]
    [ "$(tail -n 1 <<<"$output")" = "would run: COMMIT" ]
}

@test "a change that had to wait is reported as done, and a refusal as a refusal" {
    a_store
    [ "$(stored)" = "5/old 5/" ]
    cp "$DB" "$DIR/before"
    while IFS='|' read -r arguments status_then output_then sentence stored_then; do
        for kind in EXCLUSIVE READING; do
            [ $kind = EXCLUSIVE ] || [ "$status_then" = 0 ] || continue # not all refusals have something to commit
            cp "$DIR/before" "$DB"
            run_waiting "${!kind}" $arguments
            expect "$status_then" "$output_then" "${sentence:+vemo-access-token: $sentence}"
            [ "$(stored)" = "$stored_then" ]
        done
    done <<TABLE
grant $ID Api get|0|granted||4/
grant $ID Api get --print-user|0|root||4/
grant $ID Api put|1||refused: method not listed|5/
check $ID Other|1|refused: API not listed||5/old 5/
update $ID --uses 2 --bind-sid s|0|1 token updated||5/old 2/s
update unknown-token --uses 1|3||there is no such token|5/old 5/
create --uid 0 --function VPN --tid $ID|2||--tid: there is a token with this id already|5/old 5/
revoke $ID|0|1 token revoked||5/old
revoke $ID old$ID|0|2 tokens revoked||
revoke --all --yes|0|2 tokens revoked||
revoke --bind-sid old --yes|0|1 token revoked||5/
purge|0|1 token purged||5/
import $DIR/other|0|1 token imported||5/old 5/ 5/
TABLE
}

@test "create prints the id of a token that had to wait" {
    tool init
    trap '' HUP # a signal that the caller ignores does not interrupt it
    while read -r kind SIGNAL; do
        run_waiting "${!kind}" create --uid 0 --function VPN --allow Api
        [ "$status$stderr" = 0 ]
        [ "$(sql "SELECT tid FROM token")" = "$output" ]
        sql "DELETE FROM token"
    done <<'TABLE'
EXCLUSIVE
READING
READING HUP
TABLE
    # A signal that interrupts it leaves no token whose id nobody knows.
    SIGNAL=TERM run_waiting "$READING" create --uid 0 --function VPN --allow Api
    expect 143 "" "vemo-access-token: interrupted; the token was taken back"
    [ "$(sql "SELECT count(*) FROM token")" -eq 0 ]
}

@test "tuning that had to wait is done" {
    a_store
    journal_and_indexes="PRAGMA journal_mode; SELECT name FROM sqlite_schema WHERE sql LIKE 'CREATE INDEX%' ORDER BY 1"
    for kind in EXCLUSIVE WRITING READING; do
        run_waiting "${!kind}" tune --wal
        [ "$status$stderr" = 0 ]
        [[ $(grep "^journal" <<<"$output") =~ ^journal\ +delete\ +wal$ ]]
        [ "$(sql "$journal_and_indexes" | xargs)" = "wal token_bind_sid token_deadline token_function" ]
        run_waiting "$WRITING" tune --undo
        [ "$status$stderr" = 0 ]
        [ "$(sql "$journal_and_indexes")" = delete ]
    done
    [ "$(stored)" = "5/old 5/" ]
}

@test "reading does not wait for a change that is not being committed yet" {
    a_store
    lock "$WRITING"
    gives 2 list --count
    unlock
    tool tune --wal >/dev/null
    lock "$WRITING UPDATE token SET count = 7;"
    gives 5 show "$ID" --field count
    unlock
    run_waiting "$WRITING UPDATE token SET count = 7;" grant "$ID" Api get
    expect 0 granted
    [ "$(stored)" = 6/ ]
    lock "$READING" # with the write-ahead journal, readers block no other program
    run_tool grant "$ID" Api get
    unlock
    expect 0 granted
}

@test "a lock that stays is a failure, and nothing was changed" {
    locked="$REAL_DB stayed locked by another process for 5 seconds"
    a_store
    cp "$DB" "$DIR/before"
    # While another program reads all the time, the commit fails.
    for kind in EXCLUSIVE READING; do
        pattern=.
        [ $kind = EXCLUSIVE ] || pattern="^(create|grant)"
        lock "${!kind}"
        while read -r arguments; do
            [[ $arguments == @(list|show|check|stats|export|*--dry-run)* ]] && more= || more="; nothing was changed"
            VEMO_TEST_HASTE=1 fails 4 "$locked$more" $arguments
        done < <(calls | grep -E "$pattern")
        cmp "$DB" "$DIR/before"
        if [ $kind = EXCLUSIVE ]; then
            # doctor finds it, too. To move the file away is no remedy.
            VEMO_TEST_HASTE=1 run_tool doctor
            [ "$status ${lines[0]}" = "5 error: $locked" ]
            [[ $output != *"move the file away"* ]]
        else
            # It reports what it has repaired before, and leaves the rest.
            chmod 0755 "$VEMO_REDIRECT_DIR"
            VEMO_TEST_HASTE=1 run_tool doctor --repair
            [ "$status ${lines[0]}" = "5 repaired: $REAL_DIRECTORY has mode 0755" ]
            [[ $output == *$'\n'"warning: expired for more than an hour: 1 token (old${ID:0:5})"$'\n'* ]]
            [[ $stderr == *"$locked"* ]]
            cmp "$DB" "$DIR/before"
        fi
        unlock
    done
}

@test "after a first change, the failure of a lock does not say that nothing was changed" {
    a_store
    sql "DELETE FROM token"
    lock "" # no lock yet
    mkfifo "$DIR/lines"
    exec 5<>"$DIR/lines"
    VEMO_TEST_HASTE=1 start import "$DIR/other" - <"$DIR/lines" 5>&-
    until [ -s "$DIR/out" ]; do :; done # the first commit is made
    other "$EXCLUSIVE"
    whole </dev/null >&5
    exec 5>&-
    finish
    unlock
    expect 4 "1 token imported" "vemo-access-token: $REAL_DB stayed locked by another process for 5 seconds"
}

# at_once NUMBER ARGUMENTS...: prints what so many runs at the same time print, and their statuses, sorted
at_once() {
    # shellcheck disable=SC2016 # for the shell inside
    seq "$1" | xargs -P "$1" -I{} sh -c '"$0" "$@" 2>&1 || echo "status $?"' "$TOOL" "${@:2}" | LC_ALL=C sort
}

@test "several creations at once, where there is no database yet, all succeed" {
    mkdir -m 0700 "$VEMO_REDIRECT_DIR"
    at_once 6 create --uid 0 --function VPN --allow Api >"$DIR/created"
    [ "$(wc -l <"$DIR/created")" -eq 6 ]
    sql "SELECT tid FROM token ORDER BY 1" | diff "$DIR/created" -
}

@test "several grants at once spend one use each, and of several that revoke a token, one has revoked it" {
    id=$(a_token --allow Api:get --uses 3)
    [ "$(at_once 8 grant "$id" Api get | uniq -c | xargs)" = \
        "3 granted 5 status 1 5 vemo-access-token: refused: unknown token" ]
    [ "$(sql "SELECT count(*) FROM token")" -eq 0 ]
    id=$(a_token)
    at_once 4 create --uid 0 --function VPN --allow Api >"$DIR/created" &
    creations=$!
    [ "$(at_once 4 revoke "$id" | uniq -c | xargs)" = \
        "3 0 tokens revoked 1 1 token revoked 3 vemo-access-token: 1 id is unknown" ]
    wait $creations
    sql "SELECT tid FROM token ORDER BY 1" | diff "$DIR/created" -
}

# calling: a program that has read the tokens, opens no transaction and takes no lock
calling() {
    lock ".timeout 5000
CREATE TEMP TABLE read AS SELECT * FROM token;"
}

# until_sql NUMBER STATEMENT: waits until the statement gives the number
until_sql() {
    until [ "$(sqlite3 -cmd ".timeout 5000" "$DB" "$2")" = "$1" ]; do :; done
}

# beside_call NUMBER STATEMENT CHANGE ARGUMENTS...: as run_tool, beside such a program, which makes its change when
# the statement gives the number, and ends
beside_call() {
    calling
    start "${@:4}"
    until_sql "$1" "$2"
    unlock "$3;"
    finish
}

@test "a token that a call writes back is revoked again, but no new token" {
    id=$(a_token)
    while IFS='|' read -r arguments tokens times; do
        [[ $arguments != *--uid* ]] || many_rows 8
        beside_call 0 "SELECT count(*) FROM token" "CREATE TEMP TABLE new AS SELECT * FROM read;
            UPDATE new SET tid = 'new' || tid; INSERT INTO token SELECT * FROM read UNION ALL SELECT * FROM new" $arguments
        expect 0 "$tokens revoked" "vemo-access-token: a token came back $times, by calls that do not take the lock, and was revoked again"
        [ "$(sql "SELECT DISTINCT substr(tid, 1, 3) FROM token")" = new ]
        sql "DELETE FROM token"
        tool create --uid 0 --function VPN --tid "$id" >/dev/null
    done <<TABLE
revoke $id|1 token|1 time
revoke --uid 0 --yes|9 tokens|9 times
TABLE
}

@test "a token that a call writes back is updated again, and the uses that it spent are reported" {
    again="the token was written back as it had been 1 time, by calls that do not take the lock, and was updated again"
    left="left: calls have spent some meanwhile, or written back an old number"
    gone="the token is gone: a call has spent its last use meanwhile, or deleted it"
    writes="UPDATE read SET count = max(count - 1, -1); REPLACE INTO token SELECT * FROM read"
    while IFS='|' read -r uses change set call then sentence; do
        a_token --allow Api:get,put $uses >"$DIR/id"
        beside_call 1 "SELECT count(*) FROM token WHERE $set" "$call" update - $change <"$DIR/id"
        expect 0 "1 token updated" "${sentence:+vemo-access-token: $sentence}"
        [ "$(sql "SELECT group_concat(count) FROM token WHERE $set")" = "$then" ]
        sql "DELETE FROM token"
    done <<TABLE
--uses 9|--remove-allow Api:put|webapi_allow = '{"Api":{"method":["get"]}}'|$writes|8|$again
--uses 9 --extra {"n":NaN}|--extra {"n":1}|extra = '{"n":1}'|$writes|8|$again
--uses 9|--uses 2|count <= 2|$writes|2|$again
--uses 9|--unlimited|count = -1|$writes|-1|$again
--unlimited|--uses 1|count = 1|$writes|1|$again
--uses 9|--uses 2|count <= 2|UPDATE token SET count = 0|0|0 uses $left
--uses 9|--uses 2|count <= 2|DELETE FROM token||$gone
--uses 9|--unlimited|count = -1|UPDATE token SET count = -2||
TABLE
}

@test "the old token of a rotation ends as intended when a call has written it back" {
    while IFS=';' read -r arguments then sentence again; do
        old=$(a_token --uses 9 --ttl 2h)
        beside_call 1 "SELECT count(*) FROM token WHERE tid <> '$old'" \
            "UPDATE read SET count = 8; REPLACE INTO token SELECT * FROM read" rotate $arguments - <<<"$old"
        expect 0 "$output" "vemo-access-token: $sentence 1 time, by calls that do not take the lock, and was $again again"
        [ "$(sql "SELECT count, round((deadline - strftime('%s', 'now')) / 100.0) FROM token ORDER BY tid = '$old'" | xargs)" = "9|72.0$then" ]
        [ "$(sql "SELECT tid FROM token WHERE tid <> '$old'")" = "$output" ]
        sql "DELETE FROM token"
    done <<'TABLE'
;;a token came back;revoked
--grace 10m; 8|6.0;the token was written back as it had been;updated
TABLE
}

# Calls that take no lock: while one waits to write the token back, the next one begins, and reads what the first
# writes. They give up after a second, or after 200 calls. Prints how many have written.
overlapping_calls() {
    exec /usr/bin/python3 -c '
import sqlite3, sys, time
def connect():
    return sqlite3.connect(sys.argv[1], isolation_level=None, timeout=1)
call = connect()
token = call.execute("SELECT * FROM token").fetchone()
print("read", flush=True)
for written in range(200):
    while call.execute("SELECT 1 FROM token").fetchone():
        time.sleep(0.001)
    following = connect()
    try:
        call.execute("REPLACE INTO token VALUES (?, ?, ?, ?, ?, ?, ?, ?, ?)", token)
    except sqlite3.OperationalError:
        break
    call.close()
    call = following
print(written)' "$DB"
}

@test "a token that calls write back again and again is revoked all the same" {
    id=$(a_token)
    coproc calls { overlapping_calls 3>&-; }
    exec 5<&"${calls[0]}"
    read -r -t 20 -u 5 # that the first has read the token
    run_tool revoke "$id"
    read -r -u 5 written
    [ "$written" -ge 20 ]
    [ "$written" -lt 199 ]
    expect 0 "1 token revoked" "vemo-access-token: a token came back $written times, by calls that do not take the lock, and was revoked again"
    [ "$(sql "SELECT count(*) FROM token")" -eq 0 ]
}

@test "a change that a trigger undoes again and again fails" {
    row token---
    sql "CREATE TRIGGER t AFTER DELETE ON token BEGIN INSERT INTO token VALUES (OLD.tid, OLD.bind_sid, OLD.uid,
        OLD.deadline, OLD.count, OLD.create_time, OLD.function, OLD.webapi_allow, OLD.extra); END"
    fails 4 "/usr/vemo/etc/private/session/vemo-access-token.db itself undoes each change: a trigger does that; \"vemo-access-token doctor\" tells what helps" revoke token---
    expect_left token---
}

@test "a change fails where /proc cannot be read" {
    uses=1
    id=$(a_token)
    while IFS='|' read -r error reason; do
        uses=$((uses + 1))
        VEMO_TEST_CALLS="opendir /proc/|$error" fails 4 "/proc/: $reason; the change was made, but calls that were \
under way can have undone it" update "$id" --uses $uses
        [ "$(sql "SELECT count FROM token")" -eq $uses ]
    done <<'TABLE'
12|Cannot allocate memory
23|Too many open files in system
24|Too many open files
TABLE
    # A process that it may not see is not a reason to fail.
    VEMO_TEST_CALLS="opendir /proc/|13" gives "1 token revoked" revoke "$id"
}

@test "the tool waits for a program that has read a token, and does not name the program when it ends without writing" {
    id=$(a_token)
    calling
    start revoke "$id"
    until_sql 0 "SELECT count(*) FROM token"
    other "$EXCLUSIVE"
    while read -r -t 0 -u 9; do
        read -r -u 9 # what it had waited for before
    done
    read -r -t 20 -u 9 # to look again
    unlock
    finish
    expect 0 "1 token revoked"
}

@test "a change says so where /proc does not show who may still write back" {
    namespace=(unshare --user --map-root-user --mount)
    "${namespace[@]}" mount -t tmpfs none /proc 2>/dev/null || skip "no namespace with another /proc here"
    id=$(a_token)
    run --separate-stderr "${namespace[@]}" sh -c 'mount -t tmpfs none /proc && exec "$@"' - "$TOOL" revoke "$id"
    expect 0 "1 token revoked" "vemo-access-token: /proc does not tell who has the database open: what was read before can still be written back"
    # Then it does not know the holder of the lock, either.
    exec 6>"$VEMO_REDIRECT_DIR.lock"
    flock 6
    VEMO_TEST_HASTE=1 run --separate-stderr "${namespace[@]}" sh -c 'mount -t tmpfs none /proc && exec "$@"' - "$TOOL" purge
    exec 6>&-
    expect 4 "" "vemo-access-token: /run/vemo-access-token.lock stayed locked by another process for 5 seconds; nothing was changed"
}

@test "programs that may still write back are named" {
    first=$(a_token --uses 5)
    second=$(a_token --uses 5)
    calling
    sleep 60 6<"$DB" 3>&- &
    reader=$!
    open=$(printf '%s\n' "$OTHER:sqlite3" "$reader:sleep" | LC_ALL=C sort | sed -E 's/(.*):(.*)/\2 (process \1)/')
    open="vemo-access-token: ${open/$'\n'/, } had the database open all the time: what it read before can still be written back; look again when it has ended"
    start revoke "$first"
    run_tool update "$second" --uses 3
    expect 0 "1 token updated" "$open"
    finish
    expect 0 "1 token revoked" "$open"
    kill "$reader"
    unlock
    [ "$(sql "SELECT tid || count FROM token")" = "${second}3" ]
}

@test "the program that holds the lock is named" {
    a_store
    flock "$VEMO_REDIRECT_DIR.lock" sh -c 'echo >"$0"; exec sleep 60' "$DIR/locked" 3>&- &
    local locker=$!
    until [ -e "$DIR/locked" ]; do :; done
    while read -r arguments; do
        VEMO_TEST_HASTE=1 fails 4 "/run/vemo-access-token.lock stayed locked by flock (process $locker) for 5 seconds; nothing was changed" $arguments
    done < <(calls |
        grep -E '^(create|grant|update|rotate|revoke [^-]|revoke --all --yes|purge$|import .*other|tune( --wal)?$)')
    pkill -P "$locker"
    wait "$locker" || true
    # One that is gone has no name, and within a namespace of processes no number either.
    exec 6>"$VEMO_REDIRECT_DIR.lock"
    flock 6 &
    wait $!
    VEMO_TEST_HASTE=1 run_tool purge
    [[ $stderr == *" stayed locked by "@("a program (process $!)"|"another process")" for 5 seconds; nothing was changed" ]]
    exec 6>&-
    [ "$(stored)" = "5/old 5/" ]
}

@test "a lock that others could hold is refused, and found" {
    a_token >/dev/null
    chmod 0601 "$VEMO_REDIRECT_DIR.lock"
    fails 4 "/run/vemo-access-token.lock is not root's alone, and others could hold the lock for ever; remove it while no program that uses tokens runs" purge
    ends 5 "error: /run/vemo-access-token.lock is not root's alone: it belongs to uid 0 and has mode 0601
    meaning: others can hold the lock for ever; programs that take it refuse this file
    remedy: remove it while no program that uses tokens runs" doctor
    if [ "$(id -u)" -eq 0 ]; then
        chmod 0600 "$VEMO_REDIRECT_DIR.lock"
        chown 1 "$VEMO_REDIRECT_DIR.lock"
        expect_first "error: /run/vemo-access-token.lock is not root's alone: it belongs to uid 1 and has mode 0600"
    fi
    rm "$VEMO_REDIRECT_DIR.lock"
    mkdir -m 0700 "$VEMO_REDIRECT_DIR.lock"
    expect_first "error: /run/vemo-access-token.lock is not root's alone: it belongs to uid 0 and has mode 0700"
    rmdir "$VEMO_REDIRECT_DIR.lock"
    gives "0 tokens purged" purge
}

@test "log lines are written when nobody waits for the lock any more" {
    row token---
    sql "CREATE TRIGGER stop BEFORE DELETE ON token BEGIN SELECT RAISE(ABORT, 'stopped'); END"
    VEMO_TEST_SYSLOG=$DIR/log run_tool revoke token---
    [ "$status" -eq 4 ]
    [ "$(sort -u "$DIR/log")" = "3 free" ] # of errors
    run_tool revoke -v token---
    [[ $stderr == *"run sql failed"* ]]
    [ "$(wc -l <"$DIR/log")" -eq "$(grep -c '\.cpp:' <<<"$stderr")" ]
}

@test "a reader that does not take an id holds nobody up" {
    tool init >/dev/null
    mkfifo "$DIR/pipe"
    exec 5<>"$DIR/pipe"
    head -c 65536 /dev/zero >&5
    "$TOOL" create --uid 0 --function VPN --allow Api >&5 3>&- &
    until_sql 1 "SELECT count(*) FROM token"
    succeeds create --uid 0 --function Mail --allow Api
    head -c 65536 <&5 >/dev/null
    wait $!
    exec 5>&-
    [ "$(sql "SELECT count(*) FROM token")" = 2 ]
}
