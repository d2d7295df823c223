#!/usr/bin/env bash
# End to end on this machine, with stock clients. First orvex started as the README's run
# command starts it (the shipped host properties: audio packets carry the SDP's payload type
# 97; a password made at the first start, taken from the URL by every client): ffprobe, ffmpeg
# and GStreamer play picture and sound, a raw RTP client checks the
# packets, ffmpeg measures frame rate and A/V offset per capture size, SIGTERM stops it. Then
# with kv.orvex.audiopt and kv.orvex.wake removed, as on the television: the audio packets
# carry 98 again and idle threads poll. Last, a stock encoder's stream through orvex-feed
# while a second service runs in a network namespace of its own.
#   tools/e2e.sh [BUILD_DIR]      (needs root for port 554)
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
build=$(cd "${1:-$top/build}" && pwd)
name=e2e
source "$top/tools/e2e-lib.sh"
export XDG_CONFIG_HOME="$work/config"  # where run.sh keeps the credentials it makes
creds=
url() { echo "rtsp://${creds}127.0.0.1/skyvo.0?width=$1&height=$2&cameraid=hd0&win=main&sub=0&dumpvideo=0&dumpaudio=0&specialcase=none&framerate=30"; }

# SIGTERM while a client plays: a clean exit with the elapsed time line, within $1 s (waiting
# threads are woken with kv.orvex.wake=event; polling ones time out as on the television).
stop() {
  local limit=${1:-15}
  python3 "$top/tools/rtsp_check.py" packets "$(url 640 480)" 8 >/dev/null 2>&1 &
  sleep 3
  local begin status=0 took
  begin=$(date +%s%N)
  kill -TERM "$pid"
  timeout 15 tail -s 0.01 --pid="$pid" -f /dev/null || fail "orvex still running 15 s after SIGTERM"
  took=$(( ($(date +%s%N) - begin) / 1000000 ))
  wait "$pid" || status=$?
  [[ $status -eq 0 ]] || fail "exit status $status after SIGTERM"
  grep -q '\*\*\*\*\*\*elapse time is' "$work/stdout" || fail "no elapsed time line"
  (( took <= limit * 1000 )) || fail "SIGTERM took $took ms (limit $limit s)"
  ok "SIGTERM: exit 0 after $took ms; $(grep -o 'elapse time is [0-9-]* ms' "$work/stdout")"
  pid=
  wait || true
}

packets() {  # expected audio payload type
  local line
  line=$(python3 "$top/tools/rtsp_check.py" packets "$(url 1280 720)" 4) || fail "raw RTP packets: $line"
  grep -q "^video .*payload_types=\[96\] ssrc=\[10\]" <<<"$line" &&
    grep -q "^audio .*payload_types=\[$1\] ssrc=\[10\]" <<<"$line" || fail "raw RTP packets: $line"
  ok "raw RTP: H.264 (96) and AAC ($1) packets, SSRC 10"
}

measure() {  # width height
  local line fps
  line=$(python3 "$top/tools/rtsp_check.py" measure "$(url "$1" "$2")" 10) || fail "measure $1x$2: $line"
  fps=$(grep -o 'fps=[0-9.]*' <<<"$line" | cut -d= -f2)
  awk -v f="$fps" 'BEGIN { exit !(f >= 27 && f <= 33) }' || fail "frame rate at $1x$2: $line"
  ok "$1x$2: $line"
}

out=$("$build/orvex" -v 2>/dev/null) || fail "orvex -v exit status"
grep -q "skyvoap version:1.6.1.android," <<<"$out" || fail "orvex -v text"
ok "orvex -v"

if [[ $build == "$top/build" ]]; then
  start env -u ORVEX_PROP_FILE "$top/tools/run.sh"
  play_url=$(cat "$XDG_CONFIG_HOME/orvex/play-url") || fail "run.sh made no credentials"
  creds=$(sed -n 's|^rtsp://\([^@/]*@\).*|\1|p' <<<"$play_url")
  grep -q "^run: made .*users.htdigest" "$work/stdout" && grep -qF "ffplay -rtsp_transport udp 'rtsp://$creds" "$work/stdout" ||
    fail "run.sh did not print the URL with the credentials"
  [[ $(stat -c %a "$XDG_CONFIG_HOME/orvex/users.htdigest") == 600 ]] || fail "credentials file mode"
  ok "run.sh: credentials made (mode 0600), URL printed with them"
else
  start env ORVEX_PROP_FILE="$top/platform/host/orvex.prop" "$build/orvex"
fi

status=0
"$build/orvex" >"$work/second" 2>/dev/null || status=$?
[[ $status -eq 1 ]] && grep -q "open rtstp server failed !" "$work/second" || fail "port 554 taken: status $status"
grep -q "0.0.0.0:554 is held by another process" "$work/orvex.log" || fail "port 554 taken: no line saying so"
ok "second instance refused (port 554 taken), with a line saying by what and what to do"

streams=$(timeout -k 5 30 ffprobe -v error -rtsp_transport udp \
  -show_entries stream=codec_name,width,height,sample_rate,channels -of csv=p=0 "$(url 1280 720)")
grep -q "^h264,1280,720" <<<"$streams" && grep -q "^aac,48000,2" <<<"$streams" || fail "ffprobe: $streams"
ok "ffprobe: $(tr '\n' ' ' <<<"$streams")"
sleep 1

# Stock ffmpeg on both tracks must end by itself: it does only when the audio stream starts.
begin=$(date +%s)
log=$(timeout -k 5 25 ffmpeg -hide_banner -nostats -rtsp_transport udp -i "$(url 1280 720)" \
  -t 10 -f null - 2>&1) || fail "ffmpeg did not end by itself within 25 s (status $?)"
frames=$(grep -o 'frame= *[0-9]*' <<<"$log" | tail -1 | grep -o '[0-9]*$')
audio_kb=$(grep -o 'audio:[0-9]*kB' <<<"$log" | tail -1 | grep -o '[0-9]*')
errors=$(grep -ciE 'error|concealing' <<<"$log" || true)
grep -q "Stream #0:1 -> #0:1 (aac (native)" <<<"$log" &&
  grep -q "Audio: pcm_s16le, 48000 Hz, stereo" <<<"$log" || fail "ffmpeg did not decode AAC 48000 Hz stereo"
[[ ${frames:-0} -ge 270 && ${frames:-0} -le 330 && ${audio_kb:-0} -gt 1000 && $errors -eq 0 ]] ||
  fail "ffmpeg: $frames frames, ${audio_kb:-0} kB of audio, $errors errors"
ok "ffmpeg ended after $(( $(date +%s) - begin )) s: $frames H.264 frames and ${audio_kb} kB of 48 kHz stereo PCM from AAC in 10 s of media, no errors"
sleep 1

# GStreamer with decodebin on both pads: the pipeline prerolls only when both branches get data.
gst=$(timeout -s INT -k 5 10 gst-launch-1.0 -e -v rtspsrc location="$(url 1280 720)" protocols=udp \
  name=s s. ! decodebin ! fakesink name=vsink silent=false s. ! decodebin ! fakesink name=asink \
  silent=false 2>&1) || true
vbufs=$(grep -c "vsink: last-message = chain" <<<"$gst" || true)
abufs=$(grep -c "asink: last-message = chain" <<<"$gst" || true)
grep -qE "^ERROR" <<<"$gst" && fail "gstreamer error: $(grep -E '^ERROR' <<<"$gst" | head -2)"
grep -q "New clock" <<<"$gst" || fail "gstreamer never reached PLAYING"
grep -q "vsink.GstPad:sink: caps = video/x-raw.*width=(int)1280, height=(int)720" <<<"$gst" &&
  grep -q "asink.GstPad:sink: caps = audio/x-raw.*rate=(int)48000, channels=(int)2" <<<"$gst" ||
  fail "gstreamer caps: $(grep -E 'sink.GstPad:sink: caps' <<<"$gst" | head -2)"
[[ $vbufs -ge 30 && $abufs -ge 30 ]] || fail "gstreamer decoded $vbufs video and $abufs audio buffers"
ok "GStreamer rtspsrc ! decodebin (both pads): PLAYING, $vbufs 1280x720 frames, $abufs 48 kHz stereo buffers"
sleep 1

packets 97
sleep 1
line=$(python3 "$top/tools/rtsp_check.py" stamps "$(url 640 480)" 10) || fail "audio time stamps: $line"
ok "audio RTP time stamps step by one AAC frame: $line"
sleep 1
for size in "640 480" "1280 720" "1920 1080"; do
  measure $size
  sleep 1
done
stop 1

creds=
# As on the television: no kv.orvex.audiopt, so the audio packets carry 98; no kv.orvex.wake;
# no kv.orvex.aacenc (the encoder and audio sender have threads of their own).
grep -v -e '^kv.orvex.audiopt=' -e '^kv.orvex.wake=' -e '^kv.orvex.aacenc=' \
  "$top/platform/host/orvex.prop" >"$work/tv.prop"
start env ORVEX_PROP_FILE="$work/tv.prop" "$build/orvex"
packets 98
sleep 1
measure 1280 720
stop

# A stock encoder's stream (access unit delimiters and SEI, as x264, NVENC and cameras write)
# fed through orvex-feed: every picture must decode. Beside it, a second service with the test
# pattern runs in a network namespace of its own; both use the binder's default sockets, which
# the namespaces keep apart: neither may see the other's pictures.
ffmpeg -v error -f lavfi -i testsrc2=size=640x480:rate=30 -t 4 -c:v libx264 -preset veryfast \
  -x264-params aud=1:keyint=15 -f h264 "$work/x264.h264"
sed -e 's/^orvex.host.video=.*/orvex.host.video=none/' "$top/platform/host/orvex.prop" >"$work/feed.prop"
start env -u ORVEX_BINDER_DIR ORVEX_PROP_FILE="$work/feed.prop" "$build/orvex"
unshare -n sh -c 'ip link set lo up && exec "$@"' sh env -u ORVEX_BINDER_DIR \
  ORVEX_PROP_FILE="$top/platform/host/orvex.prop" "$build/orvex" >"$work/second.out" 2>&1 &
second=$!
# Fed from after the PLAY, so the client sees the stream from its first parameter sets.
(sleep 2; exec env -u ORVEX_BINDER_DIR "$build/orvex-feed" --loop "$work/x264.h264" 2>"$work/feed.log") &
feeder=$!
log=$(timeout -k 5 25 ffmpeg -hide_banner -nostats -rtsp_transport udp -i "$(url 640 480)" \
  -map 0:v -t 6 -f null - 2>&1) || true
kill "$feeder" 2>/dev/null || true
wait "$feeder" 2>/dev/null || true
frames=$(grep -o 'frame= *[0-9]*' <<<"$log" | tail -1 | grep -o '[0-9]*$')
errors=$(grep -ciE 'error|concealing|non-existing|missing picture' <<<"$log" || true)
[[ ${frames:-0} -ge 170 && $errors -eq 0 ]] ||
  fail "x264 stream with delimiters and SEI via orvex-feed: ${frames:-0} frames, $errors errors: $(grep -iE 'error|concealing' <<<"$log" | head -3)"
ok "x264 stream with delimiters and SEI via orvex-feed: $frames frames in 6 s decoded, no errors"
# The first still serves its binder name; the second's pictures must reach its own clients.
second_log=$(nsenter --net="/proc/$second/ns/net" timeout -k 5 20 ffmpeg -hide_banner -nostats \
  -rtsp_transport udp -i "$(url 640 480)" -map 0:v -t 3 -f null - 2>&1) || true
kill -TERM "$second" 2>/dev/null || true
wait "$second" 2>/dev/null || true
second_frames=$(grep -o 'frame= *[0-9]*' <<<"$second_log" | tail -1 | grep -o '[0-9]*$')
[[ ${second_frames:-0} -ge 80 ]] && grep -q 'Video: h264.*640x480' <<<"$second_log" ||
  fail "a second service in a network namespace of its own: ${second_frames:-0} frames: $(tail -3 <<<"$second_log") $(tail -3 "$work/second.out")"
ok "a second service in a network namespace of its own streams its own pattern: $second_frames frames in 3 s"
stop 1

# Another encoder's High-profile stream, joined while it flows: DESCRIBE announces the stream's
# own parameter sets (kv.orvex.sdp=live) and the client starts at its next key picture
# (kv.orvex.join=key), so every picture it gets decodes, over RTSP and from /stream.mp4. The
# RTSP client's first unit is an SPS, though its PLAY starts a capture the feed runs ahead of.
for slices in 1 4; do
  ffmpeg -y -v error -f lavfi -i testsrc2=size=1280x720:rate=30 -t 4 -c:v libx264 -preset veryfast \
    -profile:v high -x264-params "aud=1:keyint=30:slices=$slices" -f h264 "$work/high.h264"
  start env ORVEX_PROP_FILE="$work/feed.prop" "$build/orvex"
  "$build/orvex-feed" --loop "$work/high.h264" 2>"$work/feed.log" &
  feeder=$!
  sleep 2.5
  line=$(python3 "$top/tools/rtsp_check.py" first "$(url 1280 720)" 3) ||
    fail "x264 High, $slices slice(s), the client that starts the capture: $line"
  ok "x264 High, $slices slice(s), the client that starts the capture: $line"
  sleep 0.5
  join_check "$(url 1280 720)" 140 \
    "x264 High profile 1280x720, $slices slice(s) a picture, joined mid-stream over RTSP"
  log=$(timeout -k 5 25 ffmpeg -hide_banner -nostats -i "http://127.0.0.1:8080/stream.mp4" \
    -map 0:v -t 5 -f null - 2>&1) || true
  frames=$(grep -o 'frame= *[0-9]*' <<<"$log" | tail -1 | grep -o '[0-9]*$')
  errors=$(grep -ciE 'error|concealing|non-existing|missing|no frame' <<<"$log" || true)
  [[ ${frames:-0} -ge 140 && $errors -eq 0 ]] ||
    fail "x264 High, $slices slice(s), joined from /stream.mp4: ${frames:-0} frames, $errors complaints"
  ok "x264 High profile, $slices slice(s) a picture, joined mid-stream from /stream.mp4: $frames frames of 5 s, no complaint"
  kill "$feeder" 2>/dev/null || true
  wait "$feeder" 2>/dev/null || true
  stop 1
done

echo "e2e: $pass passed, 0 failed"
rm -rf "$work"
