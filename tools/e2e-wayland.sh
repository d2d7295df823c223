#!/usr/bin/env bash
# End to end with a Wayland screen: a session of its own (a session bus, PipeWire and
# WirePlumber, GNOME's compositor headless with one 1280x720 monitor and no GPU), a Wayland
# window of a known colour filling the screen, orvex casting it (orvex.host.video=wayland,
# through GNOME's ScreenCast service, as the portal there offers none) and a stock ffmpeg that
# decodes the stream: the colour, the frame rate of a still screen, a change of colour, and the
# compositor stopped and started again while a client plays. Runs in its own network namespace.
#   tools/e2e-wayland.sh [BUILD_DIR]           the check (needs root: namespace, port 554)
#   tools/e2e-wayland.sh [BUILD_DIR] measure   CPU and memory of the casting, frame rate, and
#                                              the delay from a picture drawn to it decoded,
#                                              beside gst-rtsp-server (tools/cast_peer.py)
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
build=$(cd "${1:-$top/build}" && pwd)
mode=${2:-check}

source "$top/tools/e2e-netns.sh" capture-e2e "$build" "$mode"

colour=30a050  # the screen's colour, RGB
second=2060c0  # and the one it changes to

work=$(mktemp -d)
pids=()
cleanup() {
  for p in "${pids[@]}"; do kill "$p" 2>/dev/null || true; done
  wait 2>/dev/null || true
  # The desktop portal, started by the bus, mounts its document store in the runtime folder.
  umount -l "$work/run/doc" 2>/dev/null || true
  [[ -n "${ORVEX_E2E_KEEP:-}" ]] || rm -rf "$work"
}
trap cleanup EXIT
fail() { echo "e2e-wayland: FAILED: $* (work: $work)"; tail -n 20 "$work/orvex.log" 2>/dev/null || true; exit 1; }
ok() { echo "e2e-wayland: ok: $*"; }
started=$(date +%s)

# The session: its sockets (bus, PipeWire, Wayland) live in its runtime folder; the config
# folder is where a portal's restore token would go.
export XDG_RUNTIME_DIR="$work/run" HOME="$work/home" XDG_CONFIG_HOME="$work/home/.config"
mkdir -m 700 -p "$XDG_RUNTIME_DIR" "$HOME"
export DBUS_SESSION_BUS_ADDRESS="unix:path=$XDG_RUNTIME_DIR/bus"
dbus-daemon --session --nofork --address="$DBUS_SESSION_BUS_ADDRESS" >"$work/dbus.log" 2>&1 &
pids+=($!)
for _ in $(seq 50); do [[ -S $XDG_RUNTIME_DIR/bus ]] && break; sleep 0.1; done
pipewire >"$work/pipewire.log" 2>&1 &
pids+=($!)
for _ in $(seq 50); do [[ -S $XDG_RUNTIME_DIR/pipewire-0 ]] && break; sleep 0.1; done
wireplumber >"$work/wireplumber.log" 2>&1 &
pids+=($!)

# The compositor, headless; `compositor` again starts it anew after it was stopped.
export WAYLAND_DISPLAY=wayland-0
mutter=
compositor() {
  mutter --wayland --headless --no-x11 --virtual-monitor 1280x720 >>"$work/mutter.log" 2>&1 &
  mutter=$!
  pids+=($mutter)
  for _ in $(seq 100); do
    gdbus introspect --session -d org.gnome.Mutter.ScreenCast -o /org/gnome/Mutter/ScreenCast \
      >/dev/null 2>&1 && return 0
    sleep 0.1
  done
  fail "mutter did not start: $(tail -3 "$work/mutter.log")"
}
compositor

# A full-screen window of one colour (RGB hex) that paints once: the screen is then still.
painter=
paint() {
  local old=$painter
  gst-launch-1.0 -q videotestsrc pattern=solid-color foreground-color=0xff$1 is-live=true \
    ! "video/x-raw,width=1280,height=720,framerate=1/100" ! waylandsink fullscreen=true \
    >"$work/paint.log" 2>&1 &
  painter=$!
  pids+=($painter)
  # The new window covers the old before the old goes.
  sleep 0.5
  [[ -n $old ]] && { kill "$old" 2>/dev/null || true; wait "$old" 2>/dev/null || true; }
  return 0
}
paint "$colour"

source "$top/tools/e2e-capture-start.sh"
start_capturing wayland tone

if [[ $mode == measure ]]; then
  # orvex casting the screen, then gst-rtsp-server casting the same screen with the same
  # encoder and settings (tools/cast_peer.py, a screen cast session of its own): CPU and memory
  # of each (no child process here), and the delay from a picture drawn to it decoded.
  name=e2e-wayland
  source "$top/tools/e2e-cast-measure.sh"
  measure_scenes "$orvex" wayland "orvex (no child process)" "$(url 1280 720)"
  measure_delay wayland "through a window, mutter, PipeWire, orvex and ffmpeg" "$(url 1280 720)"
  kill "$orvex"; wait "$orvex" 2>/dev/null || true
  start_peer wayland
  measure_scenes "$peer" wayland "gst-rtsp-server with the same encoder" rtsp://127.0.0.1/skyvo.0
  measure_delay wayland "through a window, mutter, PipeWire, gst-rtsp-server and ffmpeg" \
    rtsp://127.0.0.1/skyvo.0
  exit 0
fi

# A client plays 12 s, each picture scaled to one pixel and stamped when it arrives: the still
# screen's colour and rate over seconds 1-6, then the colour changes and must show within 2 s.
python3 - "$(url 1280 720)" "$colour" "$second" "$work" <<'PY' || fail "colour, rate or change"
import os, subprocess, sys, time
url, first, second, work = sys.argv[1:5]
ff = subprocess.Popen(["ffmpeg", "-hide_banner", "-nostats", "-loglevel", "error",
                       "-rtsp_transport", "udp", "-i", url, "-t", "12", "-vf",
                       "scale=1:1,format=rgb24", "-fps_mode", "passthrough", "-f", "rawvideo",
                       "-"], stdout=subprocess.PIPE, stdin=subprocess.DEVNULL)
near = lambda rgb, want: all(abs(rgb[c] - bytes.fromhex(want)[c]) <= 12 for c in range(3))
frames, changed = [], None
while True:
    rgb = ff.stdout.read(3)
    if len(rgb) < 3:
        break
    now = time.monotonic()
    frames.append((now, rgb))
    if changed is None and now - frames[0][0] >= 6:
        # A second window of the other colour over the first; the change counts from here.
        changed = now
        paint = subprocess.Popen(
            ["gst-launch-1.0", "-q", "videotestsrc", "pattern=solid-color",
             "foreground-color=0xff" + second, "is-live=true", "!",
             "video/x-raw,width=1280,height=720,framerate=1/100", "!", "waylandsink",
             "fullscreen=true"], stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
        open(os.path.join(work, "painter"), "w").write(str(paint.pid))
ff.wait()
t0 = frames[0][0]
still = [rgb for t, rgb in frames if 1 <= t - t0 < 6]
mean = [sum(f[c] for f in still) / max(1, len(still)) for c in range(3)]
fps = len(still) / 5
seen = next((t for t, rgb in frames if changed and t > changed and near(rgb, second)), None)
print("e2e-wayland: ok: still screen: %.1f fps, mean colour #%02x%02x%02x (screen #%s)"
      % (fps, *[round(m) for m in mean], first))
print("e2e-wayland: ok: colour change seen after %s" %
      ("%.2f s" % (seen - changed) if seen else "never"))
sys.exit(0 if fps >= 27 and all(abs(m - w) <= 12 for m, w in zip(mean, bytes.fromhex(first)))
         and seen is not None and seen - changed <= 2 else 1)
PY
pids+=($(cat "$work/painter"))
grep -q "video from wayland" "$work/orvex.log" || fail "orvex did not cast the screen"
ok "the screen came through GNOME's ScreenCast service and PipeWire, in orvex itself"
painter=$(cat "$work/painter")
ffprobe -v error -rtsp_transport udp -select_streams v -show_entries \
  stream=color_range,color_space,color_transfer,color_primaries -of csv=p=0 "$(url 1280 720)" \
  >"$work/probe" 2>&1 || true
grep -q "^tv,smpte170m,smpte170m,smpte170m" "$work/probe" || fail "colour description: $(cat "$work/probe")"
ok "colour description: $(cat "$work/probe") (BT.601, limited range, as converted)"
sleep 1

# The compositor goes away while a client plays (the window with it) and comes back 4 s later:
# orvex stays up, the picture goes on ("no signal") at the asked rate, and the screen comes back
# in a new screen cast session without a new PLAY.
timeout -k 5 50 ffmpeg -y -hide_banner -nostats -loglevel error -rtsp_transport udp \
  -i "$(url 640 368)" -map 0:v -t 26 -vf scale=1:1,format=rgb24 -fps_mode passthrough \
  -f rawvideo "$work/rgb" -map 0:v -t 26 -fps_mode passthrough -f framecrc "$work/crc" \
  >"$work/restart.log" 2>&1 &
client=$!
sleep 4
kill "$mutter"
wait "$mutter" 2>/dev/null || true
sleep 4
compositor
paint "$colour"
wait "$client" || fail "ffmpeg across the compositor's restart: $(tail -3 "$work/restart.log")"
kill -0 "$orvex" 2>/dev/null || fail "orvex ended with the compositor"
python3 - "$work/rgb" "$work/crc" "$colour" <<'PY' || fail "picture across the compositor's restart"
import sys
rgb = open(sys.argv[1], "rb").read()
crc = open(sys.argv[2]).read().splitlines()
num, den = (int(x) for x in next(l for l in crc if l.startswith("#tb 0:")).split(":")[1].split("/"))
pts = [int(l.split(",")[1]) * num / den for l in crc if l.strip() and not l.startswith("#")]
pts = [t - pts[0] for t in pts]
want = bytes.fromhex(sys.argv[3])
near = [all(abs(rgb[3 * i + c] - want[c]) <= 12 for c in range(3)) for i in range(len(pts))]
rates = [sum(1 for t in pts if s <= t < s + 1) for s in range(1, int(pts[-1]))]
lost = [t for t, ok in zip(pts, near) if not ok and t > 3]
if not lost:
    sys.exit("the screen never went away")
back = [t for i, t in enumerate(pts) if t > lost[0] and all(near[i:])]
if not back:
    sys.exit("the screen did not come back (%d frames, \"no signal\" from %.1f s)" % (len(pts), lost[0]))
print("e2e-wayland: ok: compositor stopped at ~4 s and started at ~8 s: %d frames, at least %d a "
      "second, \"no signal\" from %.1f s, the screen back at %.1f s (%.1f s after the restart)"
      % (len(pts), min(rates), lost[0], back[0], back[0] - 8.0))
sys.exit(0 if min(rates) >= 25 and back[0] - 8.0 <= 10 else 1)
PY
grep -q "video source wayland stopped" "$work/orvex.log" || fail "no line saying the screen was lost"
grep -q "video source wayland is back" "$work/orvex.log" || fail "no line saying the screen is back"
ok "$(grep -h "video source wayland stopped" "$work/orvex.log" | head -1 | sed 's/.*MediaRecorder: //')"

kill -TERM "$orvex"
timeout 15 tail --pid="$orvex" -f /dev/null || fail "orvex still running 15 s after SIGTERM"
echo "e2e-wayland: passed in $(( $(date +%s) - started )) s"
