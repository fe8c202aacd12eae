#!/usr/bin/env bats
# A disk that is full: a small file system in memory, which only the tool sees; skipped without the right to mount

load common

# on_full_disk COMMANDS: bash executes them where the disk has no room left beside a store of one token, $ID, and
# a file
on_full_disk() {
    mkdir "$DIR/disk"
    cd "$DIR" || return
    unshare --mount --propagation private mount -t tmpfs tmpfs disk 2>/dev/null || skip "no right to mount"
    export TOOL VEMO_REDIRECT_DIR=$DIR/disk/session
    run --separate-stderr unshare --mount --propagation private bash -c '
        mount -t tmpfs -o size=256k tmpfs disk
        "$TOOL" init >/dev/null
        ID=$("$TOOL" create --uid 0 --function VPN --uses 5 --ttl 30d --allow Api:get)
        echo old >disk/file
        cat /dev/zero >disk/filler 2>/dev/null
        stored() { sqlite3 disk/session/vemo-access-token.db "PRAGMA integrity_check; SELECT count FROM token"; }
        '"$1"
}

FULL="vemo-access-token: /usr/vemo/etc/private/session/vemo-access-token.db failed: database or disk is full"

@test "what has no room on the disk is not done, and says so" {
    for i in {100..400}; do
        printf '{"bind_sid":"","count":1,"create_time":0,"deadline":9999999999,"extra":{},"function":"VPN",'
        printf '"tid":"%0127d","uid":0,"webapi_allow":{}}\n' "$i"
    done | whole >"$DIR/tokens"
    on_full_disk '
        "$TOOL" import tokens; echo $?
        "$TOOL" create --uid 0 --function VPN; echo $?
        "$TOOL" grant $ID Api get; echo $?
        "$TOOL" update $ID --uses 9; echo $?
        "$TOOL" revoke $ID; echo $?
        stored
        rm disk/filler
        "$TOOL" import tokens; echo $?'
    expect 0 "4
4
4
4
4
ok
5
301 tokens imported
0" "$FULL
$FULL
$FULL
$FULL
$FULL"
}

@test "an export that has no room leaves the old file, and no other" {
    on_full_disk '
        "$TOOL" export disk/file; echo $?
        cat disk/file
        ls disk
        "$TOOL" export >disk/other; echo $?'
    expect 0 "4
old
file
filler
session
session.lock
4" "vemo-access-token: disk/file: No space left on device
vemo-access-token: cannot write the result: No space left on device"
}

@test "reading needs no room" {
    on_full_disk '"$TOOL" show $ID --field count && "$TOOL" check $ID Api get && "$TOOL" list --count'
    expect 0 "5
allowed
1"
}
