#!/bin/bash
# Runs scripts/demo and checks that it shows every step and leaves nothing behind.
# usage: demo.sh SOURCE-DIRECTORY [--system]
# Exit status 77: skipped, for the reason printed.
set -euo pipefail
source=$1
mode=${2-}
dir=$(mktemp -d)
trap 'rm -rf "$dir"' EXIT

if [ -n "$mode" ]; then
    if [ "$(id -u)" -ne 0 ]; then
        echo "skipped: needs root"
        exit 77
    fi
    if [ -e /usr/vemo ]; then
        echo "skipped: /usr/vemo exists: this machine's own tokens are left alone"
        exit 77
    fi
fi

mkdir "$dir/tmp"
(cd "$source" && find . -path ./build -prune -o -path ./.git -prune -o -print | LC_ALL=C sort) >"$dir/before"
TMPDIR=$dir/tmp "$source/scripts/demo" $mode | tee "$dir/transcript"
(cd "$source" && find . -path ./build -prune -o -path ./.git -prune -o -print | LC_ALL=C sort) >"$dir/after"

diff "$dir/before" "$dir/after"
rmdir "$dir/tmp" # fails unless it is empty
[ -z "$mode" ] || [ ! -e /usr/vemo ]
grep -q 'On the real path, as root' "$dir/transcript" || [ -z "$mode" ]
for line in \
    "made the table of tokens" \
    "share=\$(vemo-access-token create --user root --function demo-share --ttl 1h --uses 2" \
    "refused: method not listed" "refused: API not listed" "1 token updated" "refused: unknown token" \
    "there is no such token" "2 tokens would be revoked" "2 tokens revoked" 'Who hands the id of a token to whom' \
    'unlimited uses                 1' 'no findings' '1 token exported' '1 token imported' \
    '"0 > (err = checkPermission(...))" is the refusal' 'VemoAccessTokenCreate(uid, strFunction, jOption, strTid)' \
    'VemoAccessTokenCreateByTid(uid, strFunction, jOption, strTid)' 'VemoAccessTokenGenerate(strTid)' \
    'VemoAccessTokenGrantEx(strTid, "Demo.File", "delete", jToken)' \
    'VemoAccessTokenGrantEx(strTid, "Demo.User", "get", jToken)' \
    'VemoAccessTokenGrant(strTid, "Demo.File", "get", szUser, sizeof(szUser))' 'szUser = root' \
    'VemoAccessTokenDeleteByTid(strUnknown)' 'VemoAccessTokenDeleteByBindSid("demo-login-1")' \
    'VemoAccessTokenDeleteByFunction(strFunction)' \
    'Answer::Granted == tokens.grant(strTid, "Demo.File", "get", &jToken)' 'The table: no tokens' 'HTTP/1.1 200 OK' \
    'X-Token-User: root' 'Refused, granted on behalf of its owner, and spent.'; do
    grep -qF "$line" "$dir/transcript"
done
