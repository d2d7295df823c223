#!/usr/bin/env bash
# Publishing end to end: orvex (shipped host properties plus kv.orvex.publish) pushes its stream
# to Debian's nginx with the RTMP module, which serves it again as RTMP and as HLS; ffmpeg must
# decode both tracks of both at 30 fps within 10%. Then nginx is stopped for 5 s while an RTSP
# client plays: the client keeps its rate, publishing resumes, and orvex ends with the
# descriptors and threads it had. Last, orvex publishes over SRT to an ffmpeg listener.
# Prints the capture-to-RTMP-reader delay, the reconnect time and orvex's CPU with and without
# publishing.
#   tools/e2e-publish.sh [BUILD_DIR]      (as root: it makes a network namespace of its own)
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
build=$(cd "${1:-$top/build}" && pwd)
name=e2e-publish
source "$top/tools/e2e-netns.sh" e2e "$build"
source "$top/tools/e2e-lib.sh"
check="$top/tools/rtsp_check.py"
hz=$(getconf CLK_TCK)
rtmp=rtmp://127.0.0.1/live/tv
query="cameraid=hd0&win=main&sub=0&dumpvideo=0&dumpaudio=0&specialcase=none&framerate=30"

mkdir -p "$work/hls"
cat >"$work/nginx.conf" <<NGINX
load_module /usr/lib/nginx/modules/ngx_rtmp_module.so;
user root;
daemon off;
worker_processes 1;
error_log $work/error.log;
pid $work/nginx.pid;
events { worker_connections 64; }
rtmp { server { listen 127.0.0.1:1935; application live { live on; wait_key on; hls on; hls_path $work/hls; hls_fragment 1s; } } }
http {
  access_log off;
  types { application/vnd.apple.mpegurl m3u8; video/mp2t ts; }
  server { listen 127.0.0.1:8088; root $work/hls; add_header Cache-Control no-cache; }
}
NGINX
nginx_pid=
nginx_up() {
  nginx -p "$work" -c "$work/nginx.conf" &
  nginx_pid=$!
  for _ in $(seq 50); do (exec 3<>/dev/tcp/127.0.0.1/1935) 2>/dev/null && return; sleep 0.1; done
  fail "nginx did not listen on 1935: $(tail -3 "$work/error.log")"
}
nginx_down() { kill "$nginx_pid" 2>/dev/null || true; wait "$nginx_pid" 2>/dev/null || true; }
trap '[[ -n $pid ]] && kill -9 $pid 2>/dev/null; nginx_down' EXIT

# Waits up to $2 s for the log line $1 to appear (counting from line $3).
wait_log() {
  for _ in $(seq $(($2 * 10))); do
    tail -n +"${3:-1}" "$work/orvex.log" | grep -q "$1" && return 0
    sleep 0.1
  done
  return 1
}
cpu_of() { awk '{print $14 + $15}' "/proc/$1/stat"; }
# orvex's CPU (% of one core) over 5 s while an RTSP client plays 1280x720.
cpu_with_client() {
  timeout -k 5 30 ffmpeg -hide_banner -nostats -loglevel error -rtsp_transport udp -t 9 \
    -i "rtsp://127.0.0.1/skyvo.0?width=1280&height=720&$query" -f null - &
  local client=$!
  sleep 3
  local c0 c1
  c0=$(cpu_of "$pid")
  sleep 5
  c1=$(cpu_of "$pid")
  wait "$client" || true
  echo $(((c1 - c0) * 100 / hz / 5))
}
fps_ok() { awk -v f="$1" 'BEGIN { exit !(f >= 27 && f <= 33) }'; }
field() { sed -n "s/.*$1=\([^ ]*\).*/\1/p" <<<"$2"; }

nginx_up
{ cat "$top/platform/host/orvex.prop"; echo "kv.orvex.publish=$rtmp"; } >"$work/publish.prop"
start env ORVEX_PROP_FILE="$work/publish.prop" "$build/orvex"
wait_log "publish $rtmp: publishing" 10 || fail "orvex did not start publishing"

line=$(python3 "$check" measure "$rtmp" 6) || fail "rtmp: $line"
fps=$(field fps "$line")
fps_ok "$fps" || fail "rtmp: $fps fps: $line"
[[ $(field audio_frames "$line") -gt 100 ]] || fail "rtmp: no sound: $line"
ok "ffmpeg decodes both tracks from nginx over RTMP: $line"

for _ in $(seq 50); do [[ -s $work/hls/tv.m3u8 ]] && break; sleep 0.2; done
line=$(python3 "$check" measure http://127.0.0.1:8088/tv.m3u8 6) || fail "hls: $line"
fps=$(field fps "$line")
fps_ok "$fps" || fail "hls: $fps fps: $line"
[[ $(field audio_frames "$line") -gt 100 ]] || fail "hls: no sound: $line"
ok "ffmpeg decodes both tracks of nginx's HLS playlist: $line"

join_check "rtsp://127.0.0.1/skyvo.0?width=1280&height=720&$query" 162 \
  "an RTSP client joining while the publisher holds capture"

line=$(python3 "$check" latency "$rtmp" 5) || fail "latency: $line"
ok "capture to decoded frame at an RTMP reader through nginx: $line"

cpu_pub=$(cpu_with_client)

# The fault: nginx goes away for 5 s while an RTSP client plays.
sleep 2
fds0=$(ls "/proc/$pid/fd" | wc -l)
threads0=$(ls "/proc/$pid/task" | wc -l)
python3 "$check" measure "rtsp://127.0.0.1/skyvo.0?width=640&height=480&$query" 15 \
  >"$work/client" 2>&1 &
client=$!
sleep 4
nginx_down
sleep 5
from=$(($(wc -l <"$work/orvex.log") + 1))
t0=$(date +%s%N)
nginx_up
wait_log "publish $rtmp: publishing again after" 40 "$from" ||
  fail "publishing did not resume after nginx came back"
reconnect_ms=$((($(date +%s%N) - t0) / 1000000))
# Its rate is what counts here: a UDP client on a busy machine may see a damaged picture.
wait "$client" || true
line=$(cat "$work/client")
fps=$(field fps "$line")
awk -v f="$fps" 'BEGIN { exit !(f >= 28) }' || fail "RTSP client at $fps fps: $line"
ok "an RTSP client kept $fps fps while nginx was away: $line"
line=$(python3 "$check" measure "$rtmp" 4) || fail "rtmp after the fault: $line"
[[ $(field frames "$line") -gt 60 ]] || fail "rtmp after the fault: $line"
ok "publishing resumed $reconnect_ms ms after nginx came back ($(grep -c "publishing again after" "$work/orvex.log") resumption lines): $line"

fds1= threads1=
for _ in $(seq 100); do
  fds1=$(ls "/proc/$pid/fd" | wc -l)
  threads1=$(ls "/proc/$pid/task" | wc -l)
  [[ $fds1 == "$fds0" && $threads1 == "$threads0" ]] && break
  sleep 0.1
done
[[ $fds1 == "$fds0" && $threads1 == "$threads0" ]] ||
  fail "descriptors $fds0 -> $fds1, threads $threads0 -> $threads1"
ok "orvex has the descriptors ($fds1) and threads ($threads1) it had before the fault"
kill "$pid"
wait "$pid" 2>/dev/null || true
nginx_down

# SRT: an ffmpeg listener keeps what it receives for 6 s.
timeout -k 5 30 ffmpeg -hide_banner -nostats -loglevel error \
  -i "srt://127.0.0.1:9000?mode=listener" -t 6 -c copy -f mpegts "$work/srt.ts" &
listener=$!
sleep 1
{ cat "$top/platform/host/orvex.prop"; echo "kv.orvex.publish=srt://127.0.0.1:9000?streamid=tv"; } \
  >"$work/srt.prop"
start env ORVEX_PROP_FILE="$work/srt.prop" "$build/orvex"
wait "$listener" || fail "the SRT listener: $(tail -3 "$work/orvex.log")"
line=$(python3 "$check" measure "$work/srt.ts" 10) || fail "srt: $line"
[[ $(field frames "$line") -gt 120 && $(field audio_frames "$line") -gt 100 ]] || fail "srt: $line"
ok "ffmpeg decodes both tracks received over SRT: $line"
kill "$pid"
wait "$pid" 2>/dev/null || true

# Another encoder's High-profile stream in four slices a picture, fed by orvex-feed and
# published as it is; a reader that joins nginx mid-stream decodes every picture it gets.
ffmpeg -y -v error -f lavfi -i testsrc2=size=1280x720:rate=30 -t 4 -c:v libx264 -preset veryfast \
  -profile:v high -x264-params "aud=1:keyint=30:slices=4" -f h264 "$work/high.h264"
nginx_up
{ sed -e 's/^orvex.host.video=.*/orvex.host.video=none/' "$top/platform/host/orvex.prop"
  echo "kv.orvex.publish=$rtmp"; } >"$work/feed.prop"
start env ORVEX_PROP_FILE="$work/feed.prop" "$build/orvex"
"$build/orvex-feed" --loop "$work/high.h264" 2>"$work/feed.log" &
feeder=$!
wait_log "publish $rtmp: publishing" 10 || fail "orvex did not publish the fed stream"
sleep 2
log=$(timeout -k 5 25 ffmpeg -hide_banner -nostats -i "$rtmp" -map 0:v -t 5 -f null - 2>&1) || true
frames=$(grep -o 'frame= *[0-9]*' <<<"$log" | tail -1 | grep -o '[0-9]*$')
errors=$(grep -ciE 'error|concealing|non-existing|missing|no frame' <<<"$log" || true)
[[ ${frames:-0} -ge 100 && $errors -eq 0 ]] ||
  fail "x264 High in 4 slices through nginx: ${frames:-0} frames, $errors complaints: $(grep -iE 'error|missing' <<<"$log" | head -2)"
ok "x264 High profile, 4 slices a picture, joined mid-stream through nginx over RTMP: $frames frames of 5 s, no complaint"
kill "$feeder" 2>/dev/null || true
wait "$feeder" 2>/dev/null || true
kill "$pid"
wait "$pid" 2>/dev/null || true
nginx_down

# The same RTSP client without publishing, for orvex's CPU.
start env ORVEX_PROP_FILE="$top/platform/host/orvex.prop" "$build/orvex"
cpu_plain=$(cpu_with_client)
ok "orvex CPU with an RTSP client at 1280x720: ${cpu_pub}% of one core publishing to nginx, ${cpu_plain}% without"
echo "$name: $pass checks passed"
