#!/usr/bin/python3
"""A screen cast by gst-rtsp-server with the encoder and settings orvex uses (OpenH264 at
2048 kbit/s, a key frame every 2 s, 1280x720@30, the 1 kHz tone as AAC), so that the measure
modes of tools/e2e-wayland.sh and tools/e2e-capture.sh can put its CPU, memory and delay
beside orvex's. Serves rtsp://127.0.0.1:554/skyvo.0.

    cast_peer.py wayland   GNOME's ScreenCast service (a session of its own) through PipeWire
    cast_peer.py x11       $DISPLAY through ximagesrc

Run it with Debian's interpreter (the GStreamer bindings are Debian's). It prints "serving"
once the server listens, and every problem of the media pipeline to standard error: a
pipeline that cannot start is a failed measurement, not a quiet one."""
import sys

import gi
gi.require_version("Gst", "1.0")
gi.require_version("GstRtspServer", "1.0")
from gi.repository import Gio, GLib, Gst, GstRtspServer  # noqa: E402

# As orvex's conversion: BT.601, limited range, I420 of exactly the asked size at the asked rate.
TAIL = (" ! videoconvert ! videoscale add-borders=true ! videorate"
        " ! video/x-raw,format=I420,colorimetry=bt601,width=1280,height=720,framerate=30/1"
        ",pixel-aspect-ratio=1/1"
        " ! openh264enc bitrate=2048000 gop-size=60 ! h264parse"
        " ! rtph264pay name=pay0 pt=96 config-interval=-1"
        " audiotestsrc wave=sine freq=1000 is-live=true ! audio/x-raw,rate=48000,channels=2"
        " ! voaacenc bitrate=128000 ! rtpmp4gpay name=pay1 pt=97")


def serve(head):
    factory = GstRtspServer.RTSPMediaFactory()
    factory.set_launch("( " + head + TAIL + " )")
    factory.set_shared(True)
    # The system's monotonic clock, the one PipeWire stamps its buffers with: under a clock of
    # pipewiresrc's own the pictures' running times were off, videorate made up hundreds of
    # copies at once and the stream ran ahead of real time.
    factory.set_clock(Gst.SystemClock.obtain())

    def configured(_factory, media):
        # Errors of the media pipeline go to the log, each once.
        def on_message(_bus, message):
            if message.type == Gst.MessageType.ERROR:
                err, debug = message.parse_error()
                print("cast_peer: pipeline error: %s (%s)" % (err.message, debug),
                      file=sys.stderr, flush=True)
            elif message.type == Gst.MessageType.WARNING:
                err, _ = message.parse_warning()
                print("cast_peer: pipeline warning: %s" % err.message, file=sys.stderr,
                      flush=True)
        bus = media.get_element().get_bus()
        bus.add_signal_watch()
        bus.connect("message", on_message)
    factory.connect("media-configure", configured)
    server = GstRtspServer.RTSPServer()
    server.set_service("554")
    server.get_mount_points().add_factory("/skyvo.0", factory)
    if server.attach(None) == 0:
        sys.exit("cast_peer: cannot listen on port 554")
    print("serving: " + head, flush=True)
    return server


def wayland(loop):
    bus = Gio.bus_get_sync(Gio.BusType.SESSION, None)

    def call(path, iface, method, args, reply):
        return bus.call_sync("org.gnome.Mutter.ScreenCast", path, iface, method, args,
                             GLib.VariantType(reply), Gio.DBusCallFlags.NONE, 5000, None)
    session = call("/org/gnome/Mutter/ScreenCast", "org.gnome.Mutter.ScreenCast",
                   "CreateSession", GLib.Variant("(a{sv})", ({},)), "(o)").unpack()[0]
    # cursor-mode 1: the pointer drawn into the picture, as orvex asks.
    stream = call(session, "org.gnome.Mutter.ScreenCast.Session", "RecordMonitor",
                  GLib.Variant("(sa{sv})", ("", {"cursor-mode": GLib.Variant("u", 1)})),
                  "(o)").unpack()[0]
    held = []

    def added(_conn, _sender, _path, _iface, _signal, params):
        node = params.unpack()[0]
        # As orvex: the last picture again each second while the screen is still.
        held.append(serve("pipewiresrc path=%d keepalive-time=1000" % node))
    bus.signal_subscribe(None, "org.gnome.Mutter.ScreenCast.Stream", "PipeWireStreamAdded",
                         stream, None, Gio.DBusSignalFlags.NONE, added)
    call(session, "org.gnome.Mutter.ScreenCast.Session", "Start", None, "()")
    loop.run()


def main():
    Gst.init(None)
    loop = GLib.MainLoop()
    if sys.argv[1:] == ["wayland"]:
        wayland(loop)
    elif sys.argv[1:] == ["x11"]:
        # Every frame read, as orvex's child reads them (damage events would skip still ones).
        server = serve("ximagesrc use-damage=false")  # noqa: F841 (kept for the loop's life)
        loop.run()
    else:
        sys.exit(__doc__)


if __name__ == "__main__":
    main()
