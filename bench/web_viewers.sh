#!/usr/bin/env bash
# Many web viewers at once: orvex serves the 1280x720@30 host pattern to N-1 `ffmpeg -i
# http://.../stream.mp4` readers, one headless chromium playing the page, and one RTSP client
# (ffmpeg over UDP) for SECONDS; then one more reader connects and stops reading for 20 s while
# the others go on. Prints each viewer's frame rate, orvex's CPU and its RSS over time.
#   bench/web_viewers.sh [BUILD_DIR] [SECONDS] [VIEWERS]    (as root; defaults: build, 30, 8)
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
build=$(cd "${1:-$top/build}" && pwd)
seconds=${2:-30}
viewers=${3:-8}
source "$top/tools/e2e-netns.sh" e2e "$build" "$seconds" "$viewers"
work=$(mktemp -d)
pids=()
trap 'kill ${pids[*]} 2>/dev/null || true; kill -9 $orvex 2>/dev/null || true; rm -rf "$work"' EXIT
{ cat "$top/platform/host/orvex.prop"; echo "kv.orvex.http=8080"; } >"$work/orvex.prop"
ORVEX_PROP_FILE="$work/orvex.prop" ORVEX_LOG="file:$work/orvex.log" ORVEX_BINDER_DIR="$work/binder" \
  "$build/orvex" >/dev/null 2>&1 &
orvex=$!
for _ in $(seq 100); do (exec 3<>/dev/tcp/127.0.0.1/8080) 2>/dev/null && break; sleep 0.1; done
query="width=1280&height=720&framerate=30"
rtsp="rtsp://127.0.0.1/skyvo.0?$query&cameraid=hd0&win=main&sub=0&dumpvideo=0&dumpaudio=0&specialcase=none"

# orvex's CPU seconds (user + system) and RSS in MB, now.
cpu() { awk '{printf "%.2f", ($14 + $15) / 100}' "/proc/$orvex/stat"; }
rss() { awk '/VmRSS/ {printf "%.1f", $2 / 1024}' "/proc/$orvex/status"; }
# A reader's frames per second over the stream time it read, from ffmpeg's last stats line.
fps() { grep -o 'frame= *[0-9]*' "$1" | tail -1 | awk -v s="$seconds" '{printf "%.1f", $2 / s}'; }

curl -s -m 3 -o /dev/null "http://127.0.0.1:8080/stream.mp4?$query" || true  # capture on
for i in $(seq $((viewers - 1))); do
  ffmpeg -hide_banner -nostdin -i "http://127.0.0.1:8080/stream.mp4?$query" -t "$seconds" \
    -f null - >"$work/http$i.log" 2>&1 &
  pids+=($!)
done
python3 "$top/tools/web_check.py" play "http://127.0.0.1:8080/?$query" "$seconds" --fps 30 \
  >"$work/browser.log" 2>&1 &
pids+=($!)
ffmpeg -hide_banner -nostdin -rtsp_transport udp -i "$rtsp" -t "$seconds" -f null - \
  >"$work/rtsp.log" 2>&1 &
pids+=($!)
sleep 2
cpu0=$(cpu)
rss_samples=()
for _ in $(seq $((seconds - 4))); do sleep 1; rss_samples+=("$(rss)"); done
cpu1=$(cpu)
wait "${pids[@]}" || true
pids=()
echo "web_viewers: $((viewers - 1)) ffmpeg readers, one chromium page, one RTSP client, ${seconds} s of 1280x720@30"
for i in $(seq $((viewers - 1))); do echo "  http reader $i: $(fps "$work/http$i.log") fps"; done
echo "  chromium: $(tail -n 1 "$work/browser.log")"
echo "  rtsp client: $(fps "$work/rtsp.log") fps"
echo "  orvex CPU: $(awk -v a="$cpu0" -v b="$cpu1" -v s=$((seconds - 4)) 'BEGIN {printf "%.1f%% of one core", (b - a) * 100 / s}')"
echo "  orvex RSS MB each second: ${rss_samples[*]}"

# One reader stops reading for 20 s; two others read meanwhile.
python3 - "$work" <<'PY' &
import socket, sys, time
s = socket.create_connection(("127.0.0.1", 8080))
s.setsockopt(socket.SOL_SOCKET, socket.SO_RCVBUF, 4096)
s.sendall(b"GET /stream.mp4?width=1280&height=720&framerate=30 HTTP/1.1\r\nHost: x\r\n\r\n")
s.recv(1024)
time.sleep(20)
s.close()
PY
stalled=$!
sleep 1
rss0=$(rss)
for i in 1 2; do
  ffmpeg -hide_banner -nostdin -i "http://127.0.0.1:8080/stream.mp4?$query" -t 15 -f null - \
    >"$work/beside$i.log" 2>&1 &
  pids+=($!)
done
wait "${pids[@]}" || true
pids=()
rss1=$(rss)
wait "$stalled" || true
seconds=15
echo "one reader stalled for 20 s: the two beside it $(fps "$work/beside1.log") and $(fps "$work/beside2.log") fps; RSS $rss0 -> $rss1 MB"
grep -h "web viewer .* \(left\|reads too slowly\)" "$work/orvex.log" | tail -n 3 | sed 's/^/  log: /'
kill -TERM "$orvex"; wait "$orvex" || true
