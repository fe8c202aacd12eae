#!/bin/bash
# The units of the gate: systemd has nothing to say against them, takes from the service what it does not need, and
# hands over both sockets to it by their names. And the gate serves more connections than the usual limits allow.
# usage: units.sh SOURCE-DIRECTORY SERVICE-UNIT GATE TOOL
# SERVICE-UNIT: as it is installed. GATE and TOOL: built with the redirection linked in.
# Exit status 77: skipped, for the reason printed.
set -euo pipefail
source=$1
service=$2
gate=$3
tool=$4
for program in systemd-analyze systemd-socket-activate curl; do
    if ! command -v $program >/dev/null; then
        echo "skipped: $program is not installed"
        exit 77
    fi
done
dir=$(mktemp -d)
started=()
# shellcheck disable=SC2317 # called at the end
end()
{
    local pid
    for pid in "${started[@]}"; do
        kill "$pid"
        wait "$pid" || true
    done
    rm -rf "$dir"
}
trap end EXIT
status=0

cp "$source"/deployment/systemd/*.socket "$dir"
sed "s,^ExecStart=.*,ExecStart=$gate," "$service" >"$dir/vemo-access-token-gate.service"

echo "What systemd says:"
# It looks up manual pages with man, which need not be there.
systemd-analyze --man=no verify "$dir"/*.socket "$dir"/*.service 2>&1 | tee "$dir/said"
[ ! -s "$dir/said" ] || status=1

echo "What the service keeps of root's power, from 0 to 10:"
systemd-analyze security --offline=true --threshold=15 --no-pager "$dir"/*.service >"$dir/report" || {
    cat "$dir/report"
    status=1
}
sed -n 's/.*Overall exposure level[^:]*: \([0-9.]*\).*/\1/p' "$dir/report" | grep . || status=1

echo "What is handed over:"
export VEMO_REDIRECT_DIR=$dir/session
"$tool" init >"$dir/log"
(
    ulimit -Sn 64 # the gate needs more, and takes it
    exec systemd-socket-activate --fdname=calls:status -l "$dir/calls" -l "$dir/status" -E VEMO_REDIRECT_DIR \
        "$gate" --user nobody
) 2>"$dir/log" &
started+=($!)
for _ in {1..500}; do
    [ ! -S "$dir/status" ] || break
    sleep 0.01
done
exec 3< <(python3 - "$dir/calls" <<'END'
import socket, sys, time
held = []
for _ in range(60):
    held.append(socket.socket(socket.AF_UNIX))
    held[-1].connect(sys.argv[1])
print("connected", flush=True)
time.sleep(60)
END
)
started+=($!)
read -r -u 3 -t 10 _ || status=1
{
    curl -sS --max-time 5 --unix-socket "$dir/status" http://gate/health
    curl -sS --max-time 5 --unix-socket "$dir/calls" http://gate/grant/Example.File
} >"$dir/answers" || status=1
diff "$dir/answers" - <<END || status=1
healthy
a token is needed: Authorization: Bearer ID
END
[ $status -eq 0 ] || cat "$dir/log"
exit $status
