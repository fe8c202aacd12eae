#!/bin/sh
# Asks the gate: grant.sh API METHOD, with the token's id on standard input. Prints the user whom the token belongs to,
# as the header has it, and ends with 0; with 1 when it is refused, and with 2 when there is no answer.
# The id comes by standard input all the way: command lines are there for all to read.
socket=${GATE_SOCKET:-/run/vemo-access-token-gate/calls.sock}
read -r id
answer=$(printf 'Authorization: Bearer %s\n' "$id" | curl --silent --max-time 3 --unix-socket "$socket" \
    --header @- --dump-header - --output /dev/null "http://gate/grant/$1/$2")
case $answer in
    'HTTP/1.1 200'*) printf '%s\n' "$answer" | tr -d '\r' | sed -n 's/^X-Token-User: //p' ;;
    'HTTP/1.1 40'[13]*) echo "refused" >&2; exit 1 ;;
    *) echo "no answer" >&2; exit 2 ;;
esac
