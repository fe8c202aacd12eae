#!/usr/bin/env bats
# The files of deployment/: those for systemd, AppArmor and PAM, and the administrator's regular tasks. The units of the
# gate have a test of their own.

load common

DEPLOYMENT=$BATS_TEST_DIRNAME/../../deployment
INCLUDE=$BATS_TEST_DIRNAME/../../include
CONFIGURED=$(dirname "$TOOL")/../../tools
SESSION=/usr/vemo/etc/private/session
LOCK=/run/vemo-access-token.lock

# task NAME ARGUMENTS...: runs this task, and sets what run_tool sets
task() {
    tool_on_path
    run --separate-stderr "$DEPLOYMENT/libexec/$1" "${@:2}"
}

# paths FILE [BEGINNING]: the absolute paths in the file, one on a line, behind that beginning; sorted
paths() {
    sed -n "s,^ *${2-}/,/,p" "$DEPLOYMENT/$1" | LC_ALL=C sort
}

@test "the paths are those of the library" {
    [ "$(sed -n 's/^#define VEMO_ATOKEN_DB_PATH "\(.*\)"$/\1/p' "$INCLUDE/AccessTokenDefine.h")" = "$REAL_DB" ]
    grep -qF "FILE_OF_ALL = \"$LOCK\";" "$INCLUDE/CallLock.h"
    [ "$(paths systemd/uses-access-tokens.conf ReadWritePaths=)" = "$(printf '%s\n' $LOCK $SESSION)" ]
    grep -qx "ReadWritePaths=$SESSION" "$DEPLOYMENT/systemd/vemo-access-token@.service.in"
    grep -qx "ConditionPathExists=$REAL_DB" "$DEPLOYMENT/systemd/vemo-access-token@.service.in"
    grep -qx "database=$REAL_DB" "$DEPLOYMENT/libexec/revoke-session.in"
    [ "$(paths apparmor/vemo-access-token)" = "$(printf '%s,\n' "$LOCK rwk" "$SESSION/ r" "$REAL_DB rwk" \
        "$REAL_DB-journal rw" "$REAL_DB-shm rwk" "$REAL_DB-wal rw")" ]
}

@test "systemd finds nothing wrong with the units, and leaves the tasks little of root's power" {
    command -v systemd-analyze >/dev/null || skip "systemd-analyze is not installed"
    mkdir "$DIR/units" "$DIR/units/service.service.d"
    cp "$DEPLOYMENT/systemd/uses-access-tokens.conf" "$DIR/units/service.service.d"
    printf '[Service]\nExecStart=/bin/true\nProtectSystem=strict\nCapabilityBoundingSet=\n' >"$DIR/units/service.service"
    for task in backup expiry-notice metrics; do
        sed "s,^ExecStart=.*/%i$,ExecStart=$(realpath "$DEPLOYMENT")/libexec/%i," \
            "$CONFIGURED/vemo-access-token@.service" >"$DIR/units/vemo-access-token@$task.service"
        cp "$DEPLOYMENT/systemd/vemo-access-token-$task.timer" "$DIR/units"
    done
    grep -q libexec "$DIR/units/vemo-access-token@backup.service"
    # It looks up manual pages with man, which need not be there.
    run systemd-analyze --man=no verify "$DIR"/units/*.service "$DIR"/units/*.timer
    [ "$output" = "" ]
    [ "$status" -eq 0 ]
    run systemd-analyze security --offline=true --threshold=15 --no-pager "$DIR/units/vemo-access-token@backup.service"
    [ "$status" -eq 0 ]
    [[ $output == *"Overall exposure level"* ]]
}

@test "AppArmor accepts the abstraction" {
    command -v apparmor_parser >/dev/null || skip "apparmor_parser is not installed"
    cp -r /etc/apparmor.d "$DIR/profiles"
    cp "$DEPLOYMENT/apparmor/vemo-access-token" "$DIR/profiles/abstractions"
    echo 'include <tunables/global>
        profile program /usr/bin/program { include <abstractions/base> include <abstractions/vemo-access-token> }' \
        >"$DIR/profile"
    apparmor_parser --base "$DIR/profiles" --skip-kernel-load --skip-cache --stdout "$DIR/profile" >"$DIR/compiled"
    [ -s "$DIR/compiled" ]
}

@test "metrics appear in one step, and the collector can read them" {
    a_token >/dev/null
    mkdir "$DIR/collected"
    echo old >"$DIR/elsewhere"
    ln -s "$DIR/elsewhere" "$DIR/collected/vemo-access-token.new"
    task metrics "$DIR/collected"
    expect 0 ""
    [ "$(stat -c '%n %a' "$DIR"/collected/*)" = "$DIR/collected/vemo-access-token.prom 644" ]
    tool stats --prometheus | diff "$DIR/collected/vemo-access-token.prom" -
    [ "$(<"$DIR/elsewhere")" = old ]

    # What cannot be known stays as it was.
    cp "$DIR/collected/vemo-access-token.prom" "$DIR/before"
    echo "no database" >"$DB"
    task metrics "$DIR/collected"
    expect 4 "" "vemo-access-token: $NO_DATABASE"
    cmp "$DIR/collected/vemo-access-token.prom" "$DIR/before"
}

@test "a notice says which tokens expire soon" {
    a_token --ttl 30d >/dev/null
    task expiry-notice
    expect 0 ""
    a_token --ttl 6d >/dev/null
    task expiry-notice
    expect 0 "<5>tokens that expire within 7d: 1; see vemo-access-token list --expiring 7d"
    rm "$DB"
    task expiry-notice
    expect 4 "" "vemo-access-token: $NO_FILE"
}

@test "a backup is root's alone, can be imported, and is one of seven" {
    id=$(a_token)
    mkdir "$DIR/backups"
    touch "$DIR/backups/of-mine.jsonl"
    for day in 1 2 3 4 5 6 7 8; do
        touch "$DIR/backups/2099-01-0${day}T000000Z.jsonl" # by a clock that went wrong
    done
    STATE_DIRECTORY=$DIR/backups task backup
    [ "$status-$output" = 0- ]
    file=$(echo "$DIR"/backups/20[2-8]*.jsonl)
    [ "$(echo "$DIR"/backups/*)" = "$(printf "%s " "$file" "$DIR"/backups/2099-01-0{3..8}T000000Z.jsonl)$DIR/backups/of-mine.jsonl" ]
    [ "$(stat -c %a "$file")" = 600 ]
    tool revoke --all --yes
    [ "$(tool import "$file")" = "1 token imported" ]
    [ "$(tool list --field tid --show-ids)" = "$id" ]

    # Where there is no new one, the old ones stay.
    rm "$DB"
    task backup "$DIR/backups"
    [ "$status" -eq 4 ]
    [ "$(find "$DIR/backups" -type f | wc -l)" -eq 8 ]
}

BOOT=$(</proc/sys/kernel/random/boot_id)

# logout [NAME=VALUE...]: runs the hook as pam_exec does; $logged is what it logs
logout() {
    local hook=$DIR/revoke-session bin=$DIR/bin
    tool_on_path
    printf '#!/bin/sh\necho "$@" >>"%s/logged"\n' "$DIR" >"$bin/logger"
    chmod +x "$bin/logger"
    sed "s,^export PATH=.*,export PATH=$bin:/usr/bin:/bin,; s,^database=.*,database=$DB," "$CONFIGURED/revoke-session" \
        >"$hook"
    : >"$DIR/logged"
    run env -i "VEMO_REDIRECT_DIR=$VEMO_REDIRECT_DIR" PAM_SERVICE=sshd PAM_TYPE=close_session XDG_SESSION_ID=42 "$@" \
        sh "$hook"
    [ "$status-$output" = 0- ]
    logged=$(<"$DIR/logged")
    echo "logged: $logged"
}

@test "the end of a session revokes its tokens, and no others" {
    logout
    [ "$logged" = "" ] # there is no store
    others=$(a_token --bind-sid "$BOOT-421" && a_token --bind-sid 42 && a_token)
    logout
    [ "$logged" = "" ]
    a_token --bind-sid "$BOOT-42" >/dev/null
    while read -r arguments; do
        logout $arguments
        [ "$logged" = "" ]
        [ "$(sql "SELECT count(*) FROM token")" -eq 4 ]
    done <<'TABLE'
PAM_TYPE=open_session
PAM_TYPE=
XDG_SESSION_ID=
XDG_SESSION_ID=42/1
XDG_SESSION_ID=--all
XDG_SESSION_ID=43
PAM_SERVICE=sudo
TABLE
    logout
    [ "$logged" = "-t vemo-access-token -p authpriv.info -- session 42: its tokens are revoked" ]
    [ "$(tool list --field tid --show-ids | sort)" = "$(sort <<<"$others")" ]
}

@test "the end of a session reports tokens that it could not revoke, and does not wait for them" {
    a_token --bind-sid "$BOOT-42" >/dev/null
    start=$SECONDS
    exec 8<>"$VEMO_REDIRECT_DIR.lock"
    flock 8
    logout
    exec 8>&-
    [ $((SECONDS - start)) -le 6 ]
    [ "$logged" = "-t vemo-access-token -p authpriv.err -- session 42: its tokens may be there still, see vemo-access-token list --bind-sid $BOOT-42" ]
}
