#!/bin/bash
# The newest entries of the two changelogs name the same release, that of the build: its version and its day.
# usage: changelogs.sh SOURCE-DIRECTORY VERSION
set -euo pipefail
cd "$1"
heading=$(grep -m 1 '^## ' CHANGELOG.md)
version=$(sed -n '1s/^vemo-access-token (\(.*\)) .*/\1/p' debian/changelog)
# The first line that is signed.
day=$(date -u -d "$(sed -n '/^ -- /{s/.*>  //p;q}' debian/changelog)" +%F)
diff - <(printf '%s\n' "## $version ($day)" "$version") <<<"$heading
$2"
