#!/bin/sh
# private-mount.sh COMMAND...: runs it where /usr/vemo is an empty directory on a file system in memory, which
# only this command and its children see. The machine's own files stay as they are. Needs root.
# Exit status: the command's; 77, with the reason, where that cannot be done.
set -eu

if [ "${1-}" != --inside ]; then
    unshare --mount --propagation private true || exit 77
    exec unshare --mount --propagation private "$0" --inside "$@"
fi
shift

fail()
{
    echo "cannot mount in a namespace of its own: $1" >&2
    exit 77
}

if [ -d /usr/vemo ]; then
    mount -t tmpfs -o mode=0755 tmpfs /usr/vemo 2>/dev/null || fail /usr/vemo
else
    # Another /usr in its place, with the same entries and this one besides.
    usr=$(mktemp -d)
    trap 'umount -l "$usr" 2>/dev/null || true; rmdir "$usr"' EXIT
    mount -t tmpfs -o mode=0755 tmpfs "$usr" 2>/dev/null || fail "$usr"
    for entry in /usr/* /usr/.[!.]*; do
        name=$usr/${entry##*/}
        if [ -L "$entry" ]; then
            cp -P "$entry" "$name"
        elif [ -d "$entry" ]; then
            mkdir "$name"
            mount --rbind "$entry" "$name" || fail "$entry"
        elif [ -e "$entry" ]; then
            : >"$name"
            mount --bind "$entry" "$name" || fail "$entry"
        fi
    done
    mkdir "$usr/vemo"
    mount --move "$usr" /usr || fail /usr
    rmdir "$usr"
    trap - EXIT
fi

exec "$@"
