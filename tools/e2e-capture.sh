#!/usr/bin/env bash
# End to end with real capture: a virtual X screen showing a window of a known colour and a
# PulseAudio null sink playing a known tone, orvex capturing both (orvex.host.video=x11,
# orvex.host.audio=pulse), and a stock ffmpeg client that decodes the stream and must find that
# colour and that tone. Runs in its own network namespace, so port 554 is its own.
#   tools/e2e-capture.sh [BUILD_DIR]            the check (needs root: namespace, port 554)
#   tools/e2e-capture.sh [BUILD_DIR] measure    CPU of orvex and its capture child, their
#                                               memory, bitrate and frame rate while the
#                                               screen moves, at 720p and 1080p (the screen
#                                               1920x1080, or ORVEX_E2E_SCREEN=WxH)
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
build=$(cd "${1:-$top/build}" && pwd)
mode=${2:-check}

source "$top/tools/e2e-netns.sh" capture-e2e "$build" "$mode"

colour=30a050     # the screen's colour, RGB
tone_hz=660       # the tone the machine plays

work=$(mktemp -d)
pids=()
cleanup() {
  for p in "${pids[@]}"; do kill "$p" 2>/dev/null || true; done
  wait 2>/dev/null || true
  [[ -n "${ORVEX_E2E_KEEP:-}" ]] || rm -rf "$work"
}
trap cleanup EXIT
fail() { echo "e2e-capture: FAILED: $* (work: $work)"; tail -n 20 "$work/orvex.log" 2>/dev/null || true; exit 1; }
ok() { echo "e2e-capture: ok: $*"; }

# A virtual screen; Xvfb picks a free display number and writes it to fd 3.
screen_w=1280 screen_h=720
if [[ $mode == measure ]]; then
  screen=${ORVEX_E2E_SCREEN:-1920x1080}
  screen_w=${screen%x*} screen_h=${screen#*x}
fi
Xvfb -displayfd 3 -screen 0 "${screen_w}x${screen_h}x24" -nolisten tcp 3>"$work/display" \
  >"$work/xvfb.log" 2>&1 &
xvfb=$!
pids+=($xvfb)
for _ in $(seq 100); do [[ -s "$work/display" ]] && break; sleep 0.1; done
[[ -s "$work/display" ]] || fail "Xvfb did not start: $(cat "$work/xvfb.log")"
export DISPLAY=":$(cat "$work/display")"
# The X server again, on the same display, after it was stopped.
xvfb_again() {
  Xvfb "$DISPLAY" -screen 0 "${screen_w}x${screen_h}x24" -nolisten tcp >>"$work/xvfb.log" 2>&1 &
  xvfb=$!
  pids+=($xvfb)
  for _ in $(seq 100); do [[ -S /tmp/.X11-unix/X${DISPLAY#:} ]] && break; sleep 0.1; done
}
# No window manager paints the root window here, so a window as large as the screen shows
# the colour.
# Fills the screen with one colour (RGB hex), replacing the previous fill.
drawer=
paint() {
  [[ -n $drawer ]] && { kill "$drawer" 2>/dev/null || true; wait "$drawer" 2>/dev/null || true; }
  gst-launch-1.0 -q videotestsrc pattern=solid-color foreground-color=0xff$1 is-live=true \
    ! "video/x-raw,width=$screen_w,height=$screen_h,framerate=5/1" ! ximagesink \
    >"$work/window.log" 2>&1 &
  drawer=$!
  pids+=($drawer)
}
[[ $mode != measure ]] && paint "$colour"

# A private sound server with only a null sink: its monitor is "what the machine plays".
mkdir -p "$work/pulse"
cat >"$work/pulse/default.pa" <<PA
load-module module-null-sink sink_name=orvexnull
load-module module-native-protocol-unix auth-anonymous=1 socket=$work/pulse/native
set-default-sink orvexnull
PA
# The sound server and a player of the tone on it; `sound_server` again restarts both.
pulse= tone=
sound_server() {
  HOME="$work/pulse" XDG_RUNTIME_DIR="$work/pulse" PULSE_RUNTIME_PATH="$work/pulse/rt" \
    pulseaudio -n -F "$work/pulse/default.pa" --daemonize=no --exit-idle-time=-1 \
    --disallow-exit --disable-shm=yes >>"$work/pulse.log" 2>&1 &
  pulse=$!
  pids+=($pulse)
  for _ in $(seq 100); do pactl info >/dev/null 2>&1 && break; sleep 0.1; done
  pactl info >/dev/null 2>&1 || fail "pulseaudio did not start: $(tail -3 "$work/pulse.log")"
  gst-launch-1.0 -q audiotestsrc is-live=true freq=$tone_hz volume=0.4 ! pulsesink \
    >"$work/tone.log" 2>&1 &
  tone=$!
  pids+=($tone)
}
export PULSE_SERVER="unix:$work/pulse/native"
sound_server

source "$top/tools/e2e-capture-start.sh"
if [[ $mode == cast ]]; then
  # The sound as gst-rtsp-server makes it beside: the tone, not the sound server.
  start_capturing x11 tone
  name=e2e-capture
  source "$top/tools/e2e-cast-measure.sh"
  measure_scenes "$orvex" x11 "orvex and its capture child" "$(url 1280 720)"
  measure_delay x11 "through a window, Xvfb, ximagesrc in orvex's child, orvex and ffmpeg" \
    "$(url 1280 720)"
  kill "$orvex"; wait "$orvex" 2>/dev/null || true
  start_peer x11
  measure_scenes "$peer" x11 "gst-rtsp-server with the same encoder" rtsp://127.0.0.1/skyvo.0
  measure_delay x11 "through a window, Xvfb, ximagesrc, gst-rtsp-server and ffmpeg" \
    rtsp://127.0.0.1/skyvo.0
  exit 0
fi
start_capturing x11 pulse

if [[ $mode == measure ]]; then
  # Something that moves, drawn by an X client: a small ball (little changes per frame), then
  # colour bars scrolling over the whole screen (every pixel changes).
  hz=$(getconf CLK_TCK)
  for scene in "ball:pattern=ball" "bars:pattern=smpte horizontal-speed=4"; do
    gst-launch-1.0 -q videotestsrc ${scene#*:} is-live=true \
      ! "video/x-raw,width=$screen_w,height=$screen_h,framerate=30/1" ! ximagesink \
      >"$work/scene.log" 2>&1 &
    drawer=$!
    sleep 2
    for size in "1280 720" "1920 1080"; do
      set -- $size
      timeout -k 5 60 ffmpeg -y -hide_banner -nostats -loglevel error -rtsp_transport udp \
        -i "$(url "$1" "$2")" -map 0:v -c copy -t 25 -f h264 "$work/video.h264" </dev/null &
      client=$!
      sleep 8
      # The screen is captured by a gst-launch child: its share counts too.
      child=$(pgrep -P "$orvex" gst-launch-1.0 | head -1)
      cpu0=$(awk '{print $14 + $15}' "/proc/$orvex/stat")
      child0=$(awk '{print $14 + $15}' "/proc/$child/stat" 2>/dev/null || echo 0)
      load0=$(cut -d' ' -f1 /proc/loadavg)
      sleep 10
      cpu1=$(awk '{print $14 + $15}' "/proc/$orvex/stat")
      child1=$(awk '{print $14 + $15}' "/proc/$child/stat" 2>/dev/null || echo 0)
      rss=$(awk '/VmRSS/ {print int($2 / 1024)}' "/proc/$orvex/status")
      child_rss=$(awk '/VmRSS/ {print int($2 / 1024)}' "/proc/$child/status" 2>/dev/null || echo 0)
      wait "$client" || true
      frames=$(ffprobe -v error -count_frames -select_streams v:0 \
        -show_entries stream=nb_read_frames -of csv=p=0 "$work/video.h264")
      bytes=$(stat -c %s "$work/video.h264")
      echo "e2e-capture: measure: ${1}x${2}@30, ${scene%%:*} on a ${screen_w}x${screen_h}" \
        "screen: orvex CPU $(( (cpu1 - cpu0) * 100 / hz / 10 ))% of one core" \
        "+ $(( (child1 - child0) * 100 / hz / 10 ))% in the child, RSS $rss + $child_rss MiB," \
        "$(( bytes * 8 / 25 / 1000 )) kbit/s, $(awk -v f="$frames" 'BEGIN{printf "%.1f", f/25}')" \
        "fps (load average $load0 on $(nproc) cores)"
      grep -h 'frames dropped' "$work/orvex.log" | tail -1 | sed 's/.*MediaRecorder::stop: /  /'
      sleep 2
    done
    kill "$drawer"
    wait "$drawer" 2>/dev/null || true
  done
  exit 0
fi

# Video: the mean colour of the decoded frames (each scaled to one pixel), which ffmpeg converts
# with the colour description the stream carries: the screen's colour, then pure red, green,
# blue and white at an HD and an SD size, each channel within the tolerance.
colour_check() {  # width height colour tolerance
  timeout -k 5 40 ffmpeg -y -hide_banner -nostats -loglevel error -rtsp_transport udp \
    -i "$(url "$1" "$2")" -map 0:v -t 3 -vf scale=1:1,format=rgb24 -fps_mode passthrough \
    -f rawvideo "$work/rgb" \
    || fail "ffmpeg (video) exit status"
  python3 - "$work/rgb" "$3" "$4" "$1x$2" <<'PY' || fail "colour #$3 at $1x$2"
import sys
data = open(sys.argv[1], "rb").read()
want = bytes.fromhex(sys.argv[2])
frames = [data[i:i + 3] for i in range(0, len(data) - 2, 3)][15:]  # skip the first 0.5 s
if len(frames) < 40:
    sys.exit("only %d frames" % len(frames))
mean = [sum(f[c] for f in frames) / len(frames) for c in range(3)]
print("e2e-capture: ok: %s: %d frames, mean colour #%02x%02x%02x (screen #%s)"
      % (sys.argv[4], len(frames), *[round(m) for m in mean], sys.argv[2]))
sys.exit(0 if all(abs(m - w) <= int(sys.argv[3]) for m, w in zip(mean, want)) else 1)
PY
  sleep 1
}
colour_check 1280 720 "$colour" 12
for fill in ff0000 00ff00 0000ff ffffff; do
  paint "$fill"
  sleep 1
  for size in "1280 720" "640 368"; do
    colour_check $size "$fill" 8
  done
done
ffprobe -v error -rtsp_transport udp -select_streams v -show_entries \
  stream=color_range,color_space,color_transfer,color_primaries -of csv=p=0 "$(url 1280 720)" \
  >"$work/probe" 2>&1 || true
grep -q "^tv,smpte170m,smpte170m,smpte170m" "$work/probe" || fail "colour description: $(cat "$work/probe")"
ok "colour description: $(cat "$work/probe") (BT.601, limited range, as converted)"
sleep 1

# Sound: the dominant frequency of the decoded PCM (1 s, mono, 8 kHz), by a plain DFT scan.
timeout -k 5 40 ffmpeg -hide_banner -nostats -loglevel error -rtsp_transport udp \
  -i "$(url 1280 720)" -map 0:a -t 4 -ac 1 -ar 8000 -f s16le "$work/pcm" \
  || fail "ffmpeg (audio) exit status"
python3 - "$work/pcm" "$tone_hz" <<'PY' || fail "tone"
import math, struct, sys
raw = open(sys.argv[1], "rb").read()
samples = struct.unpack("<%dh" % (len(raw) // 2), raw)[8000:16000]  # the second second
if len(samples) < 8000:
    sys.exit("only %d samples" % len(samples))
def power(hz):  # Goertzel
    k = 2 * math.cos(2 * math.pi * hz / 8000)
    s1 = s2 = 0.0
    for x in samples:
        s1, s2 = x + k * s1 - s2, s1
    return s1 * s1 + s2 * s2 - k * s1 * s2
best = max(range(100, 2000, 5), key=power)
rms = math.sqrt(sum(x * x for x in samples) / len(samples))
print("e2e-capture: ok: dominant frequency %d Hz (played %s Hz), rms %.0f" % (best, sys.argv[2], rms))
sys.exit(0 if abs(best - int(sys.argv[2])) <= 10 and rms > 300 else 1)
PY

grep -q "video from x11" "$work/orvex.log" || fail "orvex did not capture the screen"

# The sound server goes away while a client plays, and comes back 4 s later: the picture keeps
# its rate, the sound is silence meanwhile, and the tone returns without a new PLAY.
paint "$colour"
timeout -k 5 40 ffmpeg -y -hide_banner -nostats -loglevel info -rtsp_transport udp -i "$(url 640 480)" \
  -map 0:v -t 20 -f null - -map 0:a -t 20 -ac 1 -ar 8000 -f s16le "$work/pcm" \
  >"$work/restart.log" 2>&1 &
client=$!
sleep 4
kill "$tone" "$pulse"
wait "$tone" "$pulse" 2>/dev/null || true
sleep 4
sound_server
wait "$client" || fail "ffmpeg across the sound server's restart: $(tail -3 "$work/restart.log")"
frames=$(grep -o 'frame= *[0-9]*' "$work/restart.log" | tail -1 | grep -o '[0-9]*$')
[[ ${frames:-0} -ge 500 ]] || fail "picture across the sound server's restart: ${frames:-0} frames in 20 s"
python3 - "$work/pcm" "$tone_hz" <<'PY' || fail "sound after the sound server's restart"
import math, struct, sys
raw = open(sys.argv[1], "rb").read()
pcm = struct.unpack("<%dh" % (len(raw) // 2), raw)
def rms(a, b):
    part = pcm[a * 8000:b * 8000]
    return math.sqrt(sum(x * x for x in part) / max(1, len(part)))
# seconds 1-3 the tone, 6-7 silence (server gone), 17-19 the tone again
before, gone, after = rms(1, 3), rms(6, 7), rms(17, 19)
print("e2e-capture: ok: sound server restarted: rms %.0f before, %.0f while gone, %.0f after" %
      (before, gone, after))
sys.exit(0 if before > 300 and gone < 50 and after > 300 else 1)
PY
grep -q "audio source pulse is back" "$work/orvex.log" || fail "no line saying the sound is back"
ok "the picture kept going across the sound server's restart: $frames frames in 20 s"

# The X server goes away while a client plays and comes back 4 s later on the same display:
# orvex stays up, the picture goes on ("no signal") with the sound, and the screen comes back
# without a new PLAY.
timeout -k 5 50 ffmpeg -y -hide_banner -nostats -loglevel error -rtsp_transport udp \
  -i "$(url 640 368)" -map 0:v -t 26 -vf scale=1:1,format=rgb24 -fps_mode passthrough \
  -f rawvideo "$work/xrgb" -map 0:v -t 26 -fps_mode passthrough -f framecrc "$work/xcrc" \
  -map 0:a -t 26 -ac 1 -ar 8000 -f s16le "$work/xpcm" >"$work/xrestart.log" 2>&1 &
client=$!
sleep 4
kill "$xvfb"
wait "$xvfb" 2>/dev/null || true
sleep 4
xvfb_again
paint "$colour"
wait "$client" || fail "ffmpeg across the X server's restart: $(tail -3 "$work/xrestart.log")"
kill -0 "$orvex" 2>/dev/null || fail "orvex ended with the X server"
python3 - "$work/xrgb" "$work/xcrc" "$work/xpcm" "$colour" <<'PY' || fail "picture across the X server's restart"
import math, struct, sys
rgb = open(sys.argv[1], "rb").read()
lines = [l for l in open(sys.argv[2]) if l.strip() and not l.startswith("#")]
tb = next(l for l in open(sys.argv[2]) if l.startswith("#tb 0:")).split(":")[1].strip()
num, den = (int(x) for x in tb.split("/"))
pts = [int(l.split(",")[1]) * num / den for l in lines]
pts = [t - pts[0] for t in pts]
want = bytes.fromhex(sys.argv[4])
near = [all(abs(rgb[3 * i + c] - want[c]) <= 12 for c in range(3)) for i in range(len(pts))]
rates = [sum(1 for t in pts if s <= t < s + 1) for s in range(1, int(pts[-1]))]
lost = [t for t, ok in zip(pts, near) if not ok and t > 3]
if not lost:
    sys.exit("the screen never went away")
back = min(t for t, ok in zip(pts, near) if ok and t > lost[0] and all(near[i] for i in range(pts.index(t), len(pts))))
pcm = struct.unpack("<%dh" % (len(open(sys.argv[3], "rb").read()) // 2), open(sys.argv[3], "rb").read())
gone = pcm[5 * 8000:8 * 8000]
rms = math.sqrt(sum(x * x for x in gone) / max(1, len(gone)))
print("e2e-capture: ok: X server stopped at ~4 s and started at ~8 s: %d frames, at least %d a "
      "second, \"no signal\" from %.1f s, the screen back at %.1f s (%.1f s after the restart), "
      "sound rms %.0f meanwhile" % (len(pts), min(rates), lost[0], back, back - 8.0, rms))
sys.exit(0 if min(rates) >= 25 and back - 8.0 <= 12 and rms > 300 else 1)
PY
grep -q "video source x11 stopped" "$work/orvex.log" || fail "no line saying the screen was lost"
grep -q "video source x11 is back" "$work/orvex.log" || fail "no line saying the screen is back"
ok "$(grep -h "video source x11 stopped" "$work/orvex.log" | head -1 | sed 's/.*MediaRecorder: //')"

kill -TERM "$orvex"
timeout 15 tail --pid="$orvex" -f /dev/null || fail "orvex still running 15 s after SIGTERM"
sleep 1

# A sound source that cannot start: the picture plays on its own, with one warning.
sed -e 's/^orvex.host.video=x11$/orvex.host.video=pattern/' \
  -e 's/^orvex.host.audio=pulse$/orvex.host.audio=pulse:nosuchsource/' "$work/orvex.prop" \
  >"$work/nosource.prop"
ORVEX_PROP_FILE="$work/nosource.prop" "$build/orvex" >"$work/stdout2" 2>&1 &
orvex=$!
pids+=($orvex)
for _ in $(seq 100); do (exec 3<>/dev/tcp/127.0.0.1/554) 2>/dev/null && break; sleep 0.1; done
sleep 0.5
log=$(timeout -k 5 30 ffmpeg -hide_banner -nostats -rtsp_transport udp -i "$(url 640 480)" \
  -t 10 -f null - 2>&1) || fail "pulse:nosuchsource: ffmpeg: $(tail -2 <<<"$log")"
frames=$(grep -o 'frame= *[0-9]*' <<<"$log" | tail -1 | grep -o '[0-9]*$')
[[ ${frames:-0} -ge 280 ]] || fail "pulse:nosuchsource: ${frames:-0} frames in 10 s"
n=$(grep -c "audio source pulse:nosuchsource cannot start" "$work/orvex.log" || true)
[[ $n -eq 1 ]] || fail "$n lines about pulse:nosuchsource"
ok "pulse:nosuchsource: the picture plays alone ($frames frames in 10 s, with silence); one warning names the source"
kill -TERM "$orvex"
timeout 15 tail --pid="$orvex" -f /dev/null || fail "orvex still running 15 s after SIGTERM"
echo "e2e-capture: passed"
