#!/usr/bin/env bash
# Glass-to-glass delay of the host test pattern in headless chromium over WebRTC beside MSE,
# on loopback and across a lossy link (tools/lossy_link.py between two network namespaces:
# LOSS % of packets lost, 15 +- 5 ms each way, TCP and UDP alike): RUNS runs of SECONDS each,
# one line per run with p50, p95 and the freezes (over 200 ms without a new picture).
#   bench/webrtc_delay.sh [BUILD_DIR] [RUNS] [SECONDS] [LOSS]      (as root)
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
build=$(cd "${1:-$top/build}" && pwd)
runs=${2:-3}
seconds=${3:-30}
loss=${4:-2}
"$top/tools/install-deps.sh" e2e
work=$(mktemp -d)
server=orvex-delay-s$$
viewer=orvex-delay-v$$
pids=()
cleanup() {
  for p in "${pids[@]}"; do kill "$p" 2>/dev/null || true; done
  wait 2>/dev/null || true
  ip netns del "$server" 2>/dev/null || true
  ip netns del "$viewer" 2>/dev/null || true
  [[ -n ${ORVEX_KEEP:-} ]] && echo "webrtc_delay: kept $work" || rm -rf "$work"
}
trap cleanup EXIT
ip netns add "$server"
ip netns add "$viewer"
python3 "$top/tools/lossy_link.py" "$server" 10.77.0.1 "$viewer" 10.77.0.2 --loss "$loss" \
  --delay 15 --jitter 5 >"$work/link.log" 2>&1 &
pids+=($!)
ip netns exec "$server" env HOME="$work" ORVEX_BINDER_DIR="$work/binder" \
  ORVEX_LOG="file:$work/orvex.log" ORVEX_PROP_FILE="$top/platform/host/orvex.prop" \
  "$build/orvex" >"$work/stdout" 2>&1 &
pids+=($!)
ip netns exec "$server" bash -c \
  'for _ in $(seq 100); do (exec 3<>/dev/tcp/127.0.0.1/8080) 2>/dev/null && exit 0; sleep 0.1; done; exit 1' ||
  { echo "webrtc_delay: orvex did not start: $(tail -3 "$work/orvex.log")"; exit 1; }
query="width=1280&height=720&framerate=30"
echo "webrtc_delay: $runs runs of $seconds s each; load: $(uptime | sed 's/.*load/load/')"
for link in loopback lossy; do
  for run in $(seq "$runs"); do
    for transport in webrtc mse; do
      if [[ $link == loopback ]]; then
        where=(ip netns exec "$server")
        url="http://127.0.0.1:8080/?$query&transport=$transport"
      else
        where=(ip netns exec "$viewer")
        url="http://10.77.0.1:8080/?$query&transport=$transport"
      fi
      line=$("${where[@]}" python3 "$top/tools/web_check.py" latency "$url" "$seconds" 2>&1 |
        tail -1) || true
      echo "webrtc_delay: $link ($([[ $link == lossy ]] && echo "$loss% lost, 15 +- 5 ms" || echo "no loss")) $transport run $run: $line"
    done
  done
done
echo "webrtc_delay: $(tail -1 "$work/link.log")"
