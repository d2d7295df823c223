#!/usr/bin/env bash
# An attacker's probe of the HTTP side and the gate (tools/probe.py), end to end: orvex with the
# shipped host properties and a users file of two users made by tools/orvex-passwd. An answer
# is kept, the service restarted, and the probe run with it; any case that FAILED (and is not
# marked as expected) fails the check. Runs in its own network namespace.
#   tools/e2e-probe.sh [BUILD_DIR]      (as root: it makes a network namespace of its own)
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
build=$(cd "${1:-$top/build}" && pwd)
name=e2e-probe
source "$top/tools/e2e-netns.sh" e2e "$build"
source "$top/tools/e2e-lib.sh"
password=$(ORVEX_USERS="$work/users" "$top/tools/orvex-passwd" --random orvex)
other=$(ORVEX_USERS="$work/users" "$top/tools/orvex-passwd" --random guest)
{ cat "$top/platform/host/orvex.prop"; echo "kv.orvex.auth=$work/users"; } >"$work/probe.prop"
listen() { for _ in $(seq 50); do (exec 3<>/dev/tcp/127.0.0.1/8080) 2>/dev/null && return; sleep 0.1; done; }
stop() {
  kill -TERM "$pid"
  timeout 10 tail -s 0.1 --pid="$pid" -f /dev/null || fail "orvex still running 10 s after SIGTERM"
  pid=
}
start env ORVEX_PROP_FILE="$work/probe.prop" "$build/orvex"
listen
python3 "$top/tools/probe.py" keep "$work/kept.json" --user "orvex:$password" || fail "no answer to keep"
stop
start env ORVEX_PROP_FILE="$work/probe.prop" "$build/orvex"
listen
rc=0
timeout -k 5 90 python3 "$top/tools/probe.py" --user "orvex:$password" --other "guest:$other" \
  --kept "$work/kept.json" | tee "$work/probe.out" || rc=$?
[[ $rc -eq 0 ]] || fail "the probe found a hole (exit $rc)"
kill -0 "$pid" 2>/dev/null || fail "orvex died under the probe"
ok "$(tail -1 "$work/probe.out")"
stop
rm -rf "$work"
