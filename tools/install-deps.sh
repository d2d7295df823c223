#!/usr/bin/env bash
# Installs the Debian 12 packages a build needs, and only those that are missing.
#   install-deps.sh          what building, running and testing on this machine needs
#   install-deps.sh e2e      that, plus the clients of the end-to-end check (ffmpeg, GStreamer,
#                            a headless chromium for the web viewer, nginx with its RTMP module
#                            and the SRT tools to publish to)
#   install-deps.sh capture-e2e  that, plus a virtual screen and a sound server to capture, and a
#                            headless GNOME compositor with PipeWire and a session bus for the
#                            Wayland screen
#   install-deps.sh bench    that, plus the e2e clients and the peer server bench/peer_cost.sh
#                            serves beside orvex (gst-rtsp-server through Python), and perf
#   install-deps.sh ci       all of it, plus the sanitizer, fuzzing and 32-bit ARM tool chains
#                            and ccache
set -euo pipefail

packages=(cmake ninja-build g++ make pkg-config googletest libgtest-dev libgmock-dev
          libbenchmark-dev libopenh264-dev libvo-aacenc-dev
          libgstreamer1.0-dev libgstreamer-plugins-base1.0-dev gstreamer1.0-plugins-base
          gstreamer1.0-plugins-good gstreamer1.0-alsa
          gstreamer1.0-x gstreamer1.0-tools  # the screen: ximagesrc, in a gst-launch child
          gstreamer1.0-pipewire  # a Wayland screen: pipewiresrc
          libmicrohttpd-dev  # the web viewer's HTTP server
          libavformat-dev libavcodec-dev libavutil-dev  # publishing to media servers
          libssl-dev zlib1g-dev libsrtp2-dev libopus-dev)  # WebRTC playback: DTLS-SRTP, Opus sound
if [[ "${1:-}" == ci ]]; then
  packages+=(clang clang-format libclang-rt-dev g++-arm-linux-gnueabihf qemu-user-static ccache)
fi
if [[ "${1:-}" == ci || "${1:-}" == capture-e2e ]]; then
  packages+=(xvfb gstreamer1.0-x pulseaudio pulseaudio-utils)
  # A Wayland desktop of its own: the session bus, PipeWire with its session manager (which the
  # screen tests need too), the portal (which offers no screen cast without a desktop's
  # backend), GNOME's compositor headless, and gdbus to see it on the bus.
  packages+=(dbus pipewire wireplumber xdg-desktop-portal mutter libglib2.0-bin)
fi
if [[ "${1:-}" == bench ]]; then
  packages+=(gir1.2-gst-rtsp-server-1.0 python3-gi linux-perf iproute2 util-linux)
fi
if [[ "${1:-}" == ci || "${1:-}" == e2e || "${1:-}" == capture-e2e || "${1:-}" == bench ]]; then
  packages+=(ffmpeg gstreamer1.0-tools gstreamer1.0-plugins-base gstreamer1.0-plugins-good
             gstreamer1.0-plugins-bad gstreamer1.0-libav python3 chromium
             nginx libnginx-mod-rtmp srt-tools  # a media server to publish to
             curl iproute2)  # WHEP offers by hand; namespaces and the lossy link
fi

missing=()
for p in "${packages[@]}"; do
  if ! dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q '^install ok installed$'; then
    missing+=("$p")
  fi
done
[[ ${#missing[@]} -eq 0 ]] && exit 0

sudo=()
if [[ $(id -u) -ne 0 ]]; then
  command -v sudo >/dev/null || { echo "install-deps: need root or sudo to install: ${missing[*]}" >&2; exit 1; }
  sudo=(sudo)
fi
echo "install-deps: installing ${missing[*]}"
"${sudo[@]}" apt-get update -qq
DEBIAN_FRONTEND=noninteractive "${sudo[@]}" apt-get install -y -qq --no-install-recommends "${missing[@]}"
