#!/usr/bin/env bash
# End to end on this machine: starts the built orvex on port 554 with the shipped host
# properties, plays it with ffprobe/ffmpeg, GStreamer and a raw RTP client, measures frame
# rate and A/V offset per capture size, then stops it with SIGTERM.
#   tools/e2e.sh [BUILD_DIR]      (needs root for port 554)
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
build=${1:-$top/build}
"$top/tools/install-deps.sh" e2e

work=$(mktemp -d)
export ORVEX_PROP_FILE="$top/platform/host/orvex.prop"
export ORVEX_LOG="file:$work/orvex.log"
export ORVEX_BINDER_DIR="$work/binder"
url() { echo "rtsp://127.0.0.1/skyvo.0?width=$1&height=$2&cameraid=hd0&win=main&sub=0&dumpvideo=0&dumpaudio=0&specialcase=none&framerate=30"; }
fail() { echo "e2e: FAILED: $*"; tail -n 20 "$work/stdout" || true; exit 1; }
pass=0
ok() { echo "e2e: ok: $*"; pass=$((pass + 1)); }

out=$("$build/orvex" -v 2>/dev/null) || fail "orvex -v exit status"
grep -q "skyvoap version:1.6.1.android," <<<"$out" || fail "orvex -v text"
ok "orvex -v"

"$build/orvex" >"$work/stdout" 2>"$work/stderr" &
pid=$!
trap 'kill -9 $pid 2>/dev/null || true' EXIT
for _ in $(seq 100); do
  (exec 3<>/dev/tcp/127.0.0.1/554) 2>/dev/null && break
  sleep 0.1
done
sleep 0.5
kill -0 "$pid" 2>/dev/null || fail "orvex did not start (port 554 in use, or no privileges?)"

status=0
"$build/orvex" >"$work/second" 2>/dev/null || status=$?
[[ $status -eq 1 ]] && grep -q "open rtstp server failed !" "$work/second" || fail "port 554 taken: status $status"
ok "second instance refused (port 554 taken)"

streams=$(timeout -k 5 30 ffprobe -v error -rtsp_transport udp \
  -show_entries stream=codec_name,width,height,sample_rate,channels -of csv=p=0 "$(url 1280 720)")
grep -q "^h264,1280,720" <<<"$streams" && grep -q "^aac,48000,2" <<<"$streams" || fail "ffprobe: $streams"
ok "ffprobe: $(tr '\n' ' ' <<<"$streams")"
sleep 1

# Video only: the audio packets carry payload type 98 where the SDP says 97, and ffmpeg
# keeps to the SDP's type (the raw client below checks the audio packets).
log=$(timeout -k 5 40 ffmpeg -hide_banner -nostats -rtsp_transport udp -i "$(url 1280 720)" \
  -map 0:v -t 10 -f null - 2>&1) || fail "ffmpeg exit status"
frames=$(grep -o 'frame= *[0-9]*' <<<"$log" | tail -1 | grep -o '[0-9]*$')
errors=$(grep -ciE 'error while decoding|concealing' <<<"$log" || true)
[[ ${frames:-0} -ge 270 && ${frames:-0} -le 330 && $errors -eq 0 ]] || fail "ffmpeg: $frames frames, $errors errors"
ok "ffmpeg decoded $frames H.264 frames in 10 s of media, no decoder errors"
sleep 1

# The audio pad gets no data (its payload type is not the SDP's), so the pipeline never ends
# by itself: it runs for 8 s and the decoder's output caps are what is checked.
gst=$(timeout -k 5 8 gst-launch-1.0 -v rtspsrc location="$(url 1280 720)" protocols=udp name=s \
  s. ! rtph264depay ! h264parse ! avdec_h264 ! fakesink s. ! fakesink 2>&1) || true
grep -q "avdec_h264.*video/x-raw.*width=(int)1280, height=(int)720" <<<"$gst" \
  || fail "gstreamer: $(grep -iE 'error|warn' <<<"$gst" | head -3)"
grep -qiE "^ERROR" <<<"$gst" && fail "gstreamer error: $(grep -E '^ERROR' <<<"$gst" | head -2)"
ok "GStreamer rtspsrc ! rtph264depay ! avdec_h264 decodes 1280x720"
sleep 1

python3 "$top/tools/rtsp_check.py" packets "$(url 1280 720)" 4 || fail "raw RTP packets"
ok "raw RTP: H.264 (96) and AAC (98) packets, SSRC 10"
sleep 1

for size in "640 480" "1280 720" "1920 1080"; do
  line=$(python3 "$top/tools/rtsp_check.py" measure "$(url $size)" 10) || fail "measure $size: $line"
  fps=$(grep -o 'fps=[0-9.]*' <<<"$line" | cut -d= -f2)
  awk -v f="$fps" 'BEGIN { exit !(f >= 27 && f <= 33) }' || fail "frame rate at $size: $line"
  ok "${size/ /x}: $line"
  sleep 1
done

# SIGTERM while a client plays: a clean exit within 15 s with the elapsed time line.
python3 "$top/tools/rtsp_check.py" packets "$(url 640 480)" 8 >/dev/null 2>&1 &
sleep 3
start=$(date +%s)
kill -TERM "$pid"
status=0
timeout 15 tail --pid="$pid" -f /dev/null || fail "orvex still running 15 s after SIGTERM"
wait "$pid" || status=$?
[[ $status -eq 0 ]] || fail "exit status $status after SIGTERM"
grep -q '\*\*\*\*\*\*elapse time is' "$work/stdout" || fail "no elapsed time line"
ok "SIGTERM: exit 0 after $(( $(date +%s) - start )) s; $(grep -o 'elapse time is [0-9-]* ms' "$work/stdout")"
wait || true
echo "e2e: $pass passed, 0 failed"
rm -rf "$work"
