#!/bin/bash
# The shared object as seen from outside: its name, that it stays loaded, and its exported symbols.
# usage: exports.sh LIBRARY
set -euo pipefail
source=$(dirname "$0")/../..
# shellcheck source=scripts/releases.sh
. "$source/scripts/releases.sh"
library=$1
status=0

soname=$(objdump -p "$library" | awk '$1 == "SONAME" { print $2 }')
if [ "$soname" != libvemoaccesstoken.so.6 ]; then
    echo "SONAME is $soname"
    status=1
fi

# Json::Value is part of the interface: another jsoncpp would be another interface.
jsoncpp=$(objdump -p "$library" | awk '$1 == "NEEDED" && /jsoncpp/ { print $2 }')
if [ "$jsoncpp" != "${JSONCPP[$RELEASE]-$jsoncpp}" ]; then
    echo "the library needs $jsoncpp, and not ${JSONCPP[$RELEASE]} as programs of Debian $RELEASE do"
    status=1
fi

# Records that callers keep point at names in the library.
if ! readelf -d "$library" | grep -q NODELETE; then
    echo "the library can be unloaded"
    status=1
fi

echo "Exported symbols (< the list, > the library):"
diff <(sed -nE 's/^ (\(c\+\+\)")?([^"@]*)@Base.*/\2/p' "$source/debian/libvemoaccesstoken6.symbols" | LC_ALL=C sort) \
    <(nm -DC --defined-only "$library" | sed 's/^[0-9a-f]* T //' | LC_ALL=C sort -u) || status=1

exit $status
