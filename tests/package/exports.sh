#!/bin/bash
# The shared object as seen from outside: its name, that it stays loaded, and its exported symbols.
# usage: exports.sh LIBRARY
set -euo pipefail
source=$(dirname "$0")/../..
# shellcheck source=scripts/releases.sh
. "$source/scripts/releases.sh"
library=$1
status=0

fault()
{
    echo "$1"
    status=1
}

soname=$(objdump -p "$library" | awk '$1 == "SONAME" { print $2 }')
[ "$soname" = libvemoaccesstoken.so.6 ] || fault "SONAME is $soname"

# Json::Value is part of the interface: another jsoncpp would be another interface.
jsoncpp=$(objdump -p "$library" | awk '$1 == "NEEDED" && /jsoncpp/ { print $2 }')
[ "$jsoncpp" = "${JSONCPP[$RELEASE]-$jsoncpp}" ] ||
    fault "the library needs $jsoncpp, and not ${JSONCPP[$RELEASE]} as programs of Debian $RELEASE do"

# Records that callers keep point at names in the library.
readelf -d "$library" | grep -q NODELETE || fault "the library can be unloaded"

echo "Exported symbols (< the list, > the library):"
diff <(sed -nE 's/^ (\(c\+\+\)")?([^"@]*)@Base.*/\2/p' "$source/debian/libvemoaccesstoken6.symbols" | LC_ALL=C sort) \
    <(nm -DC --defined-only "$library" | sed 's/^[0-9a-f]* T //' | LC_ALL=C sort -u) || status=1

exit $status
