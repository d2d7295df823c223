#pragma once

#include <string>

namespace platform {
namespace host {

// What the host captures, chosen by the host properties orvex.host.video (main window),
// orvex.host.video.sub (sub window) and orvex.host.audio, read at every capture start.
// Thread contract: a plain value; the functions below may run on any thread.
struct SourceChoice {
    enum Kind { kPattern, kTone, kNone, kX11, kV4l2, kPulse, kAlsa, kGst, kWayland, kPipeWire };
    Kind kind = kPattern;
    // The part after "kind:" (display, device, pulse source or pipeline); may be empty.
    std::string arg;
    // The property value as the operator wrote it, for log lines.
    std::string text;

    // Whether GStreamer delivers this source.
    bool live() const { return kind >= kX11; }
    // Whether its pictures come through PipeWire (GstSource::startScreen).
    bool throughPipeWire() const { return kind == kWayland || kind == kPipeWire; }
};

constexpr const char* kVideoProperty = "orvex.host.video";
constexpr const char* kSubVideoProperty = "orvex.host.video.sub";
constexpr const char* kAudioProperty = "orvex.host.audio";

// Parses a video value: pattern, x11[:DISPLAY], wayland, screen (wayland or x11, whichever the
// session is), pipewire:NODE, v4l2[:DEVICE], gst:PIPELINE or none. False when the value is
// none of those.
bool ParseVideoSource(const std::string& value, SourceChoice* out);
// What "screen" means for a session with these WAYLAND_DISPLAY and XDG_SESSION_TYPE values
// (either may be null): kWayland when either says Wayland, else kX11.
SourceChoice::Kind ScreenKind(const char* wayland_display, const char* session_type);
// Parses an audio value: tone, pulse[:SOURCE], alsa[:DEVICE], gst:PIPELINE or none.
bool ParseAudioSource(const std::string& value, SourceChoice* out);

// Reads the property (whole value) and parses it; an unknown value logs one line and gives
// the default (the pattern, the tone).
SourceChoice ChooseVideoSource(bool sub);
SourceChoice ChooseAudioSource();

// GStreamer descriptions ending in an appsink named "orvexsink": raw I420 frames of exactly
// width x height at fps, the picture scaled with its aspect kept (black borders), and
// 48000 Hz stereo S16LE PCM. Empty for kinds GStreamer does not deliver.
std::string VideoPipeline(const SourceChoice& source, int width, int height, int fps);
// For a source whose library may end the process it runs in (the X screen), the same
// pipeline ending in "fdsink fd=3", to run in a child process (GstSource::startInChild);
// empty for sources that run in this process.
std::string ChildVideoPipeline(const SourceChoice& source, int width, int height, int fps);
// The end of a video pipeline, from the first converter to the appsink, for pictures that come
// through PipeWire (GstSource::startScreen): I420 of exactly width x height, as they come.
std::string VideoConversion(int width, int height);
std::string AudioPipeline(const SourceChoice& source);

}  // namespace host
}  // namespace platform
