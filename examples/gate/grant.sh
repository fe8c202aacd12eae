#!/bin/sh
# Asks the gate: grant.sh API METHOD, with the token's id on standard input. Prints the token's user, as in the header,
# and ends with 0. Ends with 1 if the call is refused, and with 2 if there is no answer.
# curl gets the id on standard input too, because everybody can read command lines.
socket=${GATE_SOCKET:-/run/vemo-access-token-gate/calls.sock}
read -r id
answer=$(printf 'Authorization: Bearer %s\n' "$id" | curl --silent --max-time 3 --unix-socket "$socket" \
    --header @- --dump-header - --output /dev/null "http://gate/grant/$1/$2")
case $answer in
    'HTTP/1.1 200'*) printf '%s\n' "$answer" | tr -d '\r' | sed -n 's/^X-Token-User: //p' ;;
    'HTTP/1.1 40'[13]*) echo "refused" >&2; exit 1 ;;
    *) echo "no answer" >&2; exit 2 ;;
esac
