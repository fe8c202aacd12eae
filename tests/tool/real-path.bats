#!/usr/bin/env bats
# The tool as it ships, on the real path, where a namespace of the test's own has private file systems

load common

PLAIN=$(realpath "$(dirname "$TOOL")/../../tools/vemo-access-token")

# As the drop-in for services has it (deployment/systemd), root needs none of its capabilities.
@test "on the real path a token goes from its creation to its last use, without a capability" {
    in_namespace 'umask 0022
        tool() { setpriv --bounding-set=-all --inh-caps=-all --ambient-caps=-all "$tool" "$@"; }
        tool=$1; tool list; tool init && tool init &&
            id=$(tool create --user root --function VPN --allow Api:get --ttl 90m) && tool check "${id:0:8}" Api get &&
            tool doctor | tail -n 1 && tool grant "$id" Api get --print-user
        tool grant "$id" Api get; tool list --count; ls -A "$2"
        cd /usr/vemo && stat -c "%n %u:%g %a %F" . etc etc/private "$2" "$3"' "$PLAIN" "$REAL_DIRECTORY" "$REAL_DB"
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
OTHERS='tool=$1 database=$2 directory=${2%/*} secret=/usr/vemo/secret
    repair() { "$tool" doctor --repair >/dev/null; echo "$? $(stat -c "%u %a" "$secret")"; }
    "$tool" init >/dev/null && echo secret >"$secret" && chown 1:1 "$secret" && chmod 0604 "$secret"
    '

@test "a repair gives root nothing but the database, whatever others put in its place" {
    [ "$(id -u)" -eq 0 ] || skip "needs root"
    # Below a directory of theirs, the private one can be another's.
    in_namespace "$OTHERS"'chown 65534 "${directory%/*}" "$directory"; "$tool" doctor --repair | head -n 1
        stat -c %u "$directory"' "$PLAIN" "$REAL_DB"
    expect 0 "warning: /usr/vemo/etc/private belongs to uid 65534 and has mode 0755
65534"

    # The database can have become another name of any file: before it is looked at, or right after that.
    in_namespace "$OTHERS"'rm "$database"; ln "$secret" "$database"; repair' "$PLAIN" "$REAL_DB"
    expect 0 "5 1 604"
    swap='import ctypes, sys
rename = ctypes.CDLL(None).renameat2
while 0 == rename(-100, sys.argv[1].encode(), -100, sys.argv[2].encode(), 2): # exchanges the two
    pass'
    in_namespace "$OTHERS"'for round in {1..10}; do
            ln -sf "$secret" "$directory/link"
            chown 65534 "$directory" "$database"
            setpriv --reuid 65534 --clear-groups /usr/bin/python3 -c "$3" "$database" "$directory/link" 3>&- &
            repair
            wait
            [ ! -L "$database" ] || mv -T "$directory/link" "$database"
        done | cut -d " " -f 2- | sort -u' "$PLAIN" "$REAL_DB" "$swap"
    expect 0 "1 604"
}

@test "a disk that may not be written to is a failure, and nothing was changed" {
    in_namespace '"$1" init >/dev/null && id=$("$1" create --uid 0 --function VPN --allow Api) && mount --bind "$2" "$2" &&
        mount -o remount,bind,ro "$2" && ! "$1" grant "$id" Api && "$1" show "$id" --field count &&
        mount -o remount,bind,rw "$2" && "$1" tune --wal >/dev/null && mount -o remount,bind,ro "$2" && "$1" show "$id"' \
        "$PLAIN" "$REAL_DIRECTORY"
    sentence="vemo-access-token: $REAL_DB is on a file system that is read-only; \"mount -o remount,rw\" makes that writable"
    expect 4 1 "$sentence
$sentence"
}
