#!/usr/bin/env bash
# Many WebRTC viewers at once: orvex with the shipped host properties (test pattern, WebRTC on
# 8189, HTTP on 8080) at 1280x720@30, one RTSP client (ffmpeg), and VIEWERS viewers of
# bench/webrtc_viewers.cpp for SECONDS, viewer 0 stalled STALL_LEN s from second STALL_FROM.
# Prints each viewer's fps, the RTSP client's, orvex's CPU (user+system over the run, % of one
# core) and its RSS (VmRSS, VmHWM), and the load.
#   bench/webrtc_viewers.sh [BUILD_DIR] [VIEWERS] [SECONDS] [STALL_FROM] [STALL_LEN]   (as root)
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
build=$(cd "${1:-$top/build}" && pwd)
viewers=${2:-16}
seconds=${3:-30}
stall_from=${4:-10}
stall_len=${5:-10}
if [[ -z ${ORVEX_BENCH_NETNS:-} ]]; then
  exec env ORVEX_BENCH_NETNS=1 unshare -n bash -c 'ip link set lo up && exec "$0" "$@"' \
    "$0" "$build" "$viewers" "$seconds" "$stall_from" "$stall_len"
fi
work=$(mktemp -d)
pids=()
cleanup() {
  for p in "${pids[@]}"; do kill "$p" 2>/dev/null || true; done
  wait 2>/dev/null || true
  [[ -n ${ORVEX_KEEP:-} ]] && echo "webrtc_viewers: kept $work" || rm -rf "$work"
}
trap cleanup EXIT
env HOME="$work" ORVEX_BINDER_DIR="$work/binder" ORVEX_LOG="file:$work/orvex.log" \
  ORVEX_PROP_FILE="$top/platform/host/orvex.prop" "$build/orvex" >"$work/stdout" 2>&1 &
pid=$!
pids+=($pid)
for _ in $(seq 100); do (exec 3<>/dev/tcp/127.0.0.1/8080) 2>/dev/null && break; sleep 0.1; done
(exec 3<>/dev/tcp/127.0.0.1/8080) 2>/dev/null ||
  { echo "webrtc_viewers: orvex did not start: $(tail -3 "$work/orvex.log")"; exit 1; }
url="rtsp://127.0.0.1/skyvo.0?width=1280&height=720&framerate=30&cameraid=hd0&win=main&sub=0"
url+="&dumpvideo=0&dumpaudio=0&specialcase=none"
# The RTSP client plays from before the viewers come until after they go; its fps is over the
# viewers' seconds, from its frame counts at their start and end.
ffmpeg -hide_banner -nostdin -rtsp_transport udp -i "$url" -f null - >"$work/ffmpeg.log" 2>&1 &
pids+=($!)
sleep 3
ticks() { awk '{ print $14 + $15 }' /proc/"$pid"/stat; }
frames() { tr '\r' '\n' <"$work/ffmpeg.log" | grep -o 'frame= *[0-9]*' | tail -1 | grep -o '[0-9]*$'; }
# The tool's set-up and one second of warm-up come before its counted seconds.
"$build/bench/webrtc_viewers" 127.0.0.1 8080 "$viewers" "$seconds" \
  --stall "0:$stall_from:$stall_len" >"$work/viewers.log" 2>&1 &
tool=$!
pids+=($tool)
while ! grep -qs counting_in_ms "$work/viewers.log" && kill -0 "$tool" 2>/dev/null; do
  sleep 0.05
done
sleep 0.5
t0=$(ticks) f0=$(frames) s0=$(date +%s.%N)
sleep "$seconds"
t1=$(ticks) f1=$(frames) s1=$(date +%s.%N)
wait "$tool" || true
hz=$(getconf CLK_TCK)
cat "$work/viewers.log"
awk -v f0="${f0:-0}" -v f1="${f1:-0}" -v s0="$s0" -v s1="$s1" -v t0="$t0" -v t1="$t1" -v hz="$hz" \
  'BEGIN { printf "rtsp_fps=%.1f orvex_cpu=%.1f%%", (f1 - f0) / (s1 - s0), 100 * (t1 - t0) / hz / (s1 - s0) }'
echo " $(awk '/^VmRSS|^VmHWM/ { printf "%s=%s kB ", $1, $2 }' /proc/"$pid"/status)load:$(uptime | sed 's/.*load average://')"
