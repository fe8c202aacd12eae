#!/bin/bash
# The life of access tokens, as the administrator of a machine manages it. Each step shows commands and what
# they print. Ends with status 1 when a command does not end as expected. Needs vemo-access-token in the PATH.
# Tokens of other programs are counted, but neither shown nor used.
set -uo pipefail
dir=$(mktemp -d)
trap 'rm -rf "$dir"' EXIT

tool=vemo-access-token
step=0
as_expected=yes

step()
{
    step=$((step + 1))
    [ $step -eq 1 ] || echo
    printf '%s. %s\n\n' $step "$1"
}

# call STATUS ARGUMENTS...: shows a command, with ids shortened, and runs it
call()
{
    local expected=$1 argument shown=() got
    shift
    for argument in "$@"; do
        if [ ${#argument} -ge 127 ]; then
            argument=${argument:0:8}...
        fi
        shown+=("$argument")
    done
    echo "   \$ $tool ${shown[*]}"
    "$tool" "$@" 2>&1 | sed 's/^/     /'
    got=${PIPESTATUS[0]}
    [ "$got" -eq 0 ] || echo "     (exit status $got)"
    if [ "$got" -ne "$expected" ]; then
        echo "     NOT WHAT THIS STEP SHOWS"
        as_expected=
    fi
}

# create VARIABLE ARGUMENTS...: shows the creation of a token, and sets the variable to its id
create()
{
    local -n id=$1
    shift
    echo "   \$ ${!id}=\$($tool create $*)"
    id=$("$tool" create "$@") || as_expected=
}

cat <<END
Who hands the id of a token to whom:

   who lets somebody in           who makes the calls          who is called
   (a login page, a share)        (a browser, a job)           (a web API)
     create  --- the id --->        keeps it      --- the id ---->  grant
                                                   with each call
   The id is the secret of a token: whoever knows it is let in. So it is only sent where nobody else can
   read it, and lists show only its first characters.

END

step "The private directory, the file and the table are made before the first program needs them."
call 0 init

step "A token for root: two uses, for an hour, of two methods of one API. Its id is printed."
create share --user root --function demo-share --ttl 1h --uses 2 --allow Demo.File:get,list
# shellcheck disable=SC2154 # create has set it
echo "   (${share:0:8}..., ${#share} characters)"
call 0 list --function demo-share

step "Would the token allow this call? Asking spends no use. Eight characters of the id are enough."
call 0 check "${share:0:8}" Demo.File get
call 1 check "${share:0:8}" Demo.File delete
call 1 check "${share:0:8}" Demo.User get

step "The token gets another method and more time."
call 0 update "${share:0:8}" --add-allow Demo.File:delete --ttl 2d
call 0 list --function demo-share

step "A grant spends one use, and needs the whole id. The last use deletes the token."
call 0 grant "$share" Demo.File get --print-user
call 0 grant "$share" Demo.File delete
call 1 grant "$share" Demo.File get
call 3 show "${share:0:8}"

step "Two tokens of a login session; the session ends, and they are revoked."
create sync --uid 0 --function demo-sync --unlimited --allow Demo.Sync --bind-sid demo-login-1
create view --uid 0 --function demo-view --allow Demo.View:get --bind-sid demo-login-1
call 0 list --bind-sid demo-login-1
call 0 revoke --bind-sid demo-login-1 --dry-run
call 0 revoke --bind-sid demo-login-1 --yes
call 0 list --bind-sid demo-login-1

step "What does the store hold, and is anything wrong with it? Doctor's notes are not findings: it ends with 0."
create nightly --uid 0 --function demo-nightly --ttl 30d --unlimited --allow Demo.Backup:put
call 0 stats
call 0 doctor

step "A backup of these tokens only. It holds the whole ids, so only root can read the file."
call 0 export --function demo-nightly "$dir/tokens.jsonl"
echo "   \$ stat -c '%A %U' $dir/tokens.jsonl"
stat -c '     %A %U' "$dir/tokens.jsonl"
call 0 revoke --function demo-nightly --yes
call 0 import "$dir/tokens.jsonl"
call 0 revoke --function demo-nightly --yes

[ -n "$as_expected" ]
