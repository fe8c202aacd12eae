#!/usr/bin/env bats
# The tool as it ships, on the real path, where a namespace of the test's own has private file systems

load common

TOOL=$(realpath "$(dirname "$TOOL")/../../tools/vemo-access-token")

# As the drop-in for services has it (deployment/systemd), root needs none of its capabilities.
@test "on the real path a token goes from its creation to its last use, without a capability" {
    in_namespace 'umask 0022
        tool() { setpriv --bounding-set=-all --inh-caps=-all --ambient-caps=-all "$TOOL" "$@"; }
        tool list; tool init && tool init &&
            id=$(tool create --user root --function VPN --allow Api:get --ttl 90m) && tool check "${id:0:8}" Api get &&
            tool doctor | tail -n 1 && tool grant "$id" Api get --print-user
        tool grant "$id" Api get; tool list --count; ls -A "$REAL_DIRECTORY"
        cd /usr/vemo && stat -c "%n %u:%g %a %F" . etc etc/private "$REAL_DIRECTORY" "$REAL_DB"'
    expect 0 "made the directory $REAL_DIRECTORY
made the file $REAL_DB
made the table of tokens
all was there already
allowed
no findings
root
0
vemo-access-token.db
. 0:0 755 directory
etc 0:0 755 directory
etc/private 0:0 755 directory
$REAL_DIRECTORY 0:0 700 directory
$REAL_DB 0:0 700 regular file" "vemo-access-token: $NO_DIRECTORY
vemo-access-token: refused: unknown token"
}

# What root does to another user's files; $secret is such a file, and repair prints what happened to it.
OTHERS='secret=/usr/vemo/secret
    repair() { tool doctor --repair >/dev/null; echo "$? $(stat -c "%u %a" "$secret")"; }
    tool init >/dev/null && echo secret >"$secret" && chown 1:1 "$secret" && chmod 0604 "$secret"
    '

@test "a repair gives root nothing but the database, whatever others put in its place" {
    [ "$(id -u)" -eq 0 ] || skip "needs root"
    # Below a directory of theirs, the private one can be another's.
    in_namespace "$OTHERS"'chown 65534 "${REAL_DIRECTORY%/*}" "$REAL_DIRECTORY"; tool doctor --repair | head -n 1
        stat -c %u "$REAL_DIRECTORY"'
    expect 0 "warning: /usr/vemo/etc/private belongs to uid 65534 and has mode 0755
65534"

    # The database can have become another name of any file: before it is looked at, or right after that.
    in_namespace "$OTHERS"'rm "$REAL_DB"; ln "$secret" "$REAL_DB"; repair'
    expect 0 "5 1 604"
    swap='import ctypes, sys
rename = ctypes.CDLL(None).renameat2
while 0 == rename(-100, sys.argv[1].encode(), -100, sys.argv[2].encode(), 2): # exchanges the two
    pass'
    in_namespace "$OTHERS"'for round in {1..10}; do
            ln -sf "$secret" "$REAL_DIRECTORY/link"
            chown 65534 "$REAL_DIRECTORY" "$REAL_DB"
            setpriv --reuid 65534 --clear-groups /usr/bin/python3 -c "$1" "$REAL_DB" "$REAL_DIRECTORY/link" 3>&- &
            repair
            wait
            [ ! -L "$REAL_DB" ] || mv -T "$REAL_DIRECTORY/link" "$REAL_DB"
        done | cut -d " " -f 2- | sort -u' "$swap"
    expect 0 "1 604"
}

@test "a disk that may not be written to is a failure, and nothing was changed" {
    in_namespace 'd=$REAL_DIRECTORY; tool init >/dev/null && id=$(tool create --uid 0 --function VPN --allow Api) &&
        mount --bind "$d" "$d" && mount -o remount,bind,ro "$d" && ! tool grant "$id" Api &&
        tool show "$id" --field count && mount -o remount,bind,rw "$d" && tool tune --wal >/dev/null &&
        mount -o remount,bind,ro "$d" && tool show "$id"'
    sentence="vemo-access-token: $REAL_DB is on a file system that is read-only; \"mount -o remount,rw\" makes that writable"
    expect 4 1 "$sentence
$sentence"
}
