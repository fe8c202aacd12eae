#!/usr/bin/env bats
# The tool as it ships, on the real path: as root, where /usr/vemo is a private file system in memory

load common

setup() {
    [ "$(id -u)" -eq 0 ] || skip "needs root"
    DIR=$BATS_TEST_TMPDIR
    PLAIN=$(realpath "$(dirname "$TOOL")/../../tools/vemo-access-token")
    unset VEMO_REDIRECT_DIR NO_COLOR
    export TZ=Europe/Berlin
    umask 022
    WAS_THERE=$([ ! -e /usr/vemo ] || stat -c '%i %y' /usr/vemo)
    # The namespace lives as long as this process, which ends with its standard input.
    mkdir "$DIR/layer"
    mkfifo "$DIR/hold" "$DIR/ready"
    unshare --mount --propagation private bash -c "$OVERLAY && mkdir -p /usr/vemo &&
        mount -t tmpfs -o mode=0755 tmpfs /usr/vemo && echo ready && exec cat" "$DIR/layer" \
        <"$DIR/hold" >"$DIR/ready" 2>"$DIR/reason" 3>&- &
    HOLDER=$!
    exec 7>"$DIR/hold"
    local ready=
    read -r -t 20 ready <"$DIR/ready" || true
    [ "$ready" = ready ] || skip "no namespace with an overlay here: $(head -n 1 "$DIR/reason")"
}

teardown() {
    [ -n "${HOLDER-}" ] || return 0
    exec 7>&-
    wait "$HOLDER" || true
    [ "$([ ! -e /usr/vemo ] || stat -c '%i %y' /usr/vemo)" = "$WAS_THERE" ]
}

# inside COMMAND...: in that namespace
inside() {
    nsenter --target "$HOLDER" --mount --root -- "$@"
}

run_inside() {
    run --separate-stderr nsenter --target "$HOLDER" --mount --root -- "$PLAIN" "$@"
}

# owners_and_modes: of the database and the directories above
owners_and_modes() {
    inside stat -c '%n %u:%g %a %F' /usr/vemo/etc /usr/vemo/etc/private "$REAL_DIRECTORY" "$REAL_DB" | sed "s,^/usr/vemo/,,"
}

SOUND="etc 0:0 755 directory
etc/private 0:0 755 directory
etc/private/session 0:0 700 directory
etc/private/session/vemo-access-token.db 0:0 700 regular file"

@test "on the real path a token goes from its creation to its last use" {
    run_inside list
    expect 4 "" "vemo-access-token: there is no directory $REAL_DIRECTORY; \"vemo-access-token init\" makes it"
    run_inside init
    expect 0 "made the directory $REAL_DIRECTORY
made the file $REAL_DB
made the table of tokens"
    [ "$(owners_and_modes)" = "$SOUND" ]
    run_inside create --user root --function VPN --allow Api:get --ttl 90m
    [ "$status$stderr" = 0 ]
    [[ $output =~ ^[0-9A-Za-z]{127,255}$ ]]
    id=$output
    run_inside list --no-header
    [ "$status" -eq 0 ]
    [[ $output =~ ^${id:0:8}\ \ root\ \ VPN\ +1\ \ [0-9]{4}-[0-9]{2}-[0-9]{2}\ [0-9:]{8}\ \ in\ 1\ h\ +Api:get$ ]]
    run_inside check "${id:0:8}" Api get
    expect 0 allowed
    run_inside doctor
    [ "$status" -eq 0 ]
    [ "$(tail -n 1 <<<"$output")" = "no findings" ]
    run_inside grant "$id" Api get --print-user
    expect 0 root
    run_inside grant "$id" Api get
    expect 1 "" "vemo-access-token: refused: unknown token"
    run_inside list --count
    expect 0 0
    [ "$(inside ls -A "$REAL_DIRECTORY")" = vemo-access-token.db ]
    [ "$(owners_and_modes)" = "$SOUND" ]
}

@test "doctor finds directories above that others can write to, and leaves them alone" {
    run_inside init
    inside chown 65534 /usr/vemo/etc
    inside chmod 0775 /usr/vemo/etc/private
    run_inside doctor --repair
    expect 5 "warning: /usr/vemo/etc belongs to uid 65534 and has mode 0755
    meaning: others than root can replace the private directory below it
    remedy: chown root /usr/vemo/etc && chmod go-w /usr/vemo/etc
warning: /usr/vemo/etc/private belongs to uid 0 and has mode 0775
    meaning: others than root can replace the private directory below it
    remedy: chown root /usr/vemo/etc/private && chmod go-w /usr/vemo/etc/private"
    [ "$(inside stat -c '%u %a' /usr/vemo/etc /usr/vemo/etc/private)" = "65534 755
0 775" ]
}

@test "a repair gives root nothing but the database, whatever others put in its place" {
    run_inside init
    inside sh -c 'echo secret >/usr/vemo/secret; chown 1:1 /usr/vemo/secret; chmod 0604 /usr/vemo/secret'
    # Below a directory of theirs, the private one can be another's.
    inside chown 65534 /usr/vemo/etc/private "$REAL_DIRECTORY"
    run_inside doctor --repair
    [ "$status" -eq 5 ]
    [ "$(inside stat -c %u "$REAL_DIRECTORY")" -eq 65534 ]
    inside chown 0 /usr/vemo/etc/private

    # The database can have become another name of any file: before it is looked at, or right after that.
    inside sh -c "rm $REAL_DB; ln /usr/vemo/secret $REAL_DB"
    run_inside doctor --repair
    [ "$status" -eq 5 ]
    [ "$(inside stat -c '%u %a' /usr/vemo/secret)" = "1 604" ]
    inside rm "$REAL_DB"
    run_inside init
    swap='import ctypes, sys
rename = ctypes.CDLL(None).renameat2
while 0 == rename(-100, sys.argv[1].encode(), -100, sys.argv[2].encode(), 2): # exchanges the two
    pass'
    for round in {1..10}; do
        inside sh -c "ln -sf /usr/vemo/secret $REAL_DIRECTORY/link; chown 65534 $REAL_DIRECTORY $REAL_DB"
        inside setpriv --reuid 65534 --clear-groups python3 -c "$swap" "$REAL_DB" "$REAL_DIRECTORY/link" 3>&- &
        run_inside doctor --repair
        wait $! || true
        [ "$(inside stat -c '%u %a' /usr/vemo/secret)" = "1 604" ]
        inside sh -c "[ ! -L $REAL_DB ] || mv -T $REAL_DIRECTORY/link $REAL_DB"
    done
}

@test "another effective uid than 0 is not enough, even for root" {
    setpriv --reuid=65534 --clear-groups test -x "$PLAIN" || skip "uid 65534 cannot reach the build directory"
    # As a program of mode 4755 would run it. But AddressSanitizer's search for leaks must trace the process, which
    # is not possible then; and a script in the tool's place would make its effective uid the real one again.
    as=--euid=65534
    if grep -q __asan_init "$PLAIN" || [[ $(ldd "$PLAIN" 2>&1) == *"not a dynamic executable"* ]]; then
        as=--reuid=65534
    fi
    for arguments in init "create --uid 0 --function VPN" list purge; do
        run --separate-stderr nsenter --target "$HOLDER" --mount --root -- setpriv "$as" "$PLAIN" $arguments
        expect 4 "" "vemo-access-token: only root may do this: the token database belongs to root, and the effective uid is 65534"
    done
    run --separate-stderr nsenter --target "$HOLDER" --mount --root -- setpriv "$as" "$PLAIN" doctor
    expect 5 "error: not run as root: the effective uid is 65534
    meaning: the database belongs to root and cannot be looked at
    remedy: run doctor as root"
    [ "$(inside ls -A /usr/vemo)" = "" ]
}

@test "a disk that may not be written to is a failure, and nothing was changed" {
    run_inside init
    run_inside create --uid 0 --function VPN --allow Api:get
    id=$output
    inside mount --bind "$REAL_DIRECTORY" "$REAL_DIRECTORY"
    inside mount -o remount,bind,ro "$REAL_DIRECTORY"
    run_inside grant "$id" Api get
    expect 4 "" "vemo-access-token: $REAL_DB is on a file system that is read-only; \"mount -o remount,rw\" makes that writable"
    run_inside show "$id" --field count
    expect 0 1
    inside mount -o remount,bind,rw "$REAL_DIRECTORY"
    run_inside tune --wal
    [ "$status" -eq 0 ]
    inside mount -o remount,bind,ro "$REAL_DIRECTORY"
    run_inside show "$id" --field count
    expect 4 "" "vemo-access-token: $REAL_DB is on a file system that is read-only; \"mount -o remount,rw\" makes that writable"
}
