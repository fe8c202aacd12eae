#!/usr/bin/env bats
# The lines about changes in the system log: who made them, and of which tokens.

load common

# logged [CALLER]: the lines so far, without what all of them have: priority, that the lock was free, and the caller. This
# is the user who runs the test, unless it is given. Other lines stay whole, behind a mark.
logged() {
    local caller=${1-by uid $(id -u)} login
    login=$(cat /proc/self/loginuid 2>/dev/null) || true
    case $login in
        '' | 4294967295) caller+=", no login uid" ;;
        *) caller+=", login uid $login" ;;
    esac
    [ ! -e "$DIR/log" ] || sed "s/^85 free \(.*\); $caller\$/\1/; t; s/^/another line: /" "$DIR/log"
    rm -f "$DIR/log"
}

# begin_log: what is logged from now on is kept, and no sudo is seen
begin_log() {
    unset SUDO_UID
    export VEMO_TEST_SYSLOG=$DIR/log
}

@test "each change has its line, and nothing else has one" {
    begin_log
    while IFS='|' read -r call expected; do
        eval "$call" >"$DIR/printed" 2>&1 || true
        [ "$(logged)" = "$expected" ]
    done <<TABLE
tool init|init: the store was changed
row token--- "count = 2"|
row expired- "deadline = 5"|
tool list|
tool check token---$ZEROS Api get|
tool grant token---$ZEROS Api put|grant: 1 token purged
tool grant token---$ZEROS Api put|
tool grant token---$ZEROS Api get|grant: 1 token granted (token---...)
tool update token--- --unlimited|update: 1 token updated (token---...)
tool grant token---$ZEROS Api get|grant: 1 token granted (token---...)
tool update unknown- --unlimited|
tool export $DIR/lines|
tool revoke --all --dry-run|
tool revoke token--- token---$ZEROS|revoke: 1 token deleted (token---...)
tool revoke token---|
for name in one two three four five six; do row \$name "function = '\$name'"; done|
tool revoke --function one --yes|revoke: 1 token deleted (one00000...)
tool revoke --all --yes|revoke: 5 tokens deleted (five0000..., four0000..., six00000..., three000..., two00000...)
tool import $DIR/lines|import: 1 token created (token---...)
tool import $DIR/lines|
tool create --uid 0 --function VPN --tid created-$ZEROS|create: 1 token created (created-...)
tool create --uid 0 --function VPN --tid created-$ZEROS|
tool purge|
tool tune --dry-run|
tool tune|tune: the store was changed
tool doctor|
TABLE
}

@test "for many tokens, a line says only how many" {
    many_rows 6 "deadline = 5"
    begin_log
    tool export "$DIR/lines"
    tool revoke --all --yes
    tool import "$DIR/lines"
    sql "UPDATE token SET function = CAST(function AS BLOB)"
    tool doctor --repair
    tool import "$DIR/lines"
    tool purge
    [ "$(logged)" = "revoke: 6 tokens deleted
import: 6 tokens created
doctor: 6 tokens updated
doctor: 6 tokens deleted
import: 6 tokens created
purge: 6 tokens deleted" ]
}

@test "a line names the user who became root by sudo" {
    tool init
    begin_log
    SUDO_UID=1000 tool create --uid 0 --function VPN --tid "created-$ZEROS"
    [ "$(logged "by uid 1000 (sudo)")" = "create: 1 token created (created-...)" ]
    for uid in "" root -1 4294967295 4294967296 1000x " 1000" $'1000\nby uid 7'; do
        SUDO_UID=$uid tool update created- --uses 2
        [ "$(logged)" = "update: 1 token updated (created-...)" ]
    done
}

@test "a change has its line even if the command then fails or is ended" {
    row token---
    begin_log
    VEMO_TEST_SYNC=directory run_tool update token--- --uses 3
    [ "$status" -eq 4 ]
    [ "$(logged)" = "update: 1 token updated (token---...)" ]

    VEMO_TEST_SYNC=file fails 4 "$REAL_DB failed: disk I/O error; the change may have been made" revoke token---
    [ "$(logged | grep -v '^another line: 3 ')" = "revoke: perhaps 1 token deleted (token---...)" ]

    run bash -c '"$@" >/dev/full' - "$TOOL" create --uid 0 --function VPN --tid "created-$ZEROS"
    [ "$status" -eq 4 ]
    [ "$(logged)" = "create: 1 token created (created-...)
create: 1 token deleted (created-...)" ]

    # Another program has the database open, so the tool watches for seconds whether the token is written back.
    run timeout 1 "$TOOL" revoke token--- 8<"$DB"
    [ "$status" -eq 124 ]
    [ "$(logged)" = "revoke: 1 token deleted (token---...)" ]

    # The change is made and is being synced.
    row token---
    # shellcheck disable=SC2016 # the tool's shell knows its parent
    VEMO_TEST_CALLS='fsync|kill -TERM $PPID' run_tool revoke token---
    [ "$status" -eq 143 ]
    [ "$(logged)" = "revoke: 1 token deleted (token---...)" ]

    # A change that is undone is not logged.
    row token---
    sql "CREATE TRIGGER refuse BEFORE DELETE ON token BEGIN SELECT RAISE(ABORT, 'n

o'); END"
    run_tool revoke token---
    [ "$status" -eq 4 ]
    # The library's line is as long as the reason, whose empty line is left out.
    [ "$(logged)" = "another line: 3 free
another line: 3 free" ]
}

@test "a change of the structure has its line, and its sentence, whatever comes in the middle" {
    # An unlink() that ends the tool before the removal of a journal with this number, or fails if that is negative. Each
    # change removes its journal; tune measures five small changes before its own, and five after it.
    cc -shared -fPIC -x c -o "$DIR/unlink.so" - <<'END' || skip "no C compiler"
#include <errno.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/syscall.h>
#include <unistd.h>
int unlink(const char* szFile)
{
    static int nUnlinked = 0;
    const int nAt = atoi(getenv("AT"));
    ++nUnlinked;
    if (nUnlinked == nAt) {
        raise(SIGTERM);
    }
    errno = EIO;
    return nUnlinked == -nAt ? -1 : (int)syscall(SYS_unlink, szFile);
}
END
    begin_log
    while IFS='|' read -r at arguments; do
        AT=$at LD_PRELOAD=$DIR/unlink.so run_tool $arguments
        [ "$status" -eq 143 ]
        [ "$(logged)" = "${arguments%% *}: the store was changed" ]
    done <<<$'1|init\n6|tune\n9|tune\n6|tune --undo\n6|tune --wal'
    tool tune --undo >/dev/null
    logged >/dev/null
    AT=-7 LD_PRELOAD=$DIR/unlink.so fails 4 \
        "$REAL_DB failed: disk I/O error; the store has changed: \"vemo-access-token tune --dry-run\" shows it as it is now" tune
    [ "$(logged | grep -v '^another line: 3 ')" = "tune: the store was changed" ]
}

@test "a line shows no whole id, and no character that could make two lines of one" {
    row short "tid = 'short'"
    row odd----- "tid = char(10) || 'by uid' || tid"
    begin_log
    tool revoke --all --yes
    [ "$(logged)" = 'revoke: 2 tokens deleted (\x0aby uido..., ...)' ]
}
