#include "platform/host/capture/HostSources.h"

#include <cstdlib>
#include <cstring>
#include <string>

#include "platform/Ports.h"

namespace platform {
namespace host {
namespace {

// Splits "kind" or "kind:arg"; true when the kind is `name` (then *arg is what follows).
bool Is(const std::string& value, const char* name, std::string* arg) {
    size_t colon = value.find(':');
    if (value.compare(0, colon, name) != 0) return false;
    *arg = colon == std::string::npos ? std::string() : value.substr(colon + 1);
    return true;
}

// The property's whole value: a host property file holds pipelines longer than Get can copy.
std::string WholeProperty(const char* key, const char* default_value) {
    std::string value;
    return Properties().Lookup(key, &value) ? value : default_value;
}

std::string Quoted(const std::string& s) {
    std::string out = "\"";
    for (char c : s) {
        if (c == '"' || c == '\\') out += '\\';
        out += c;
    }
    return out + "\"";
}

SourceChoice Choose(const char* key, const char* default_value,
                    bool (*parse)(const std::string&, SourceChoice*)) {
    std::string value = WholeProperty(key, default_value);
    SourceChoice choice;
    if (parse(value, &choice)) return choice;
    std::string line =
        std::string(key) + ": unknown value \"" + value + "\", using " + default_value;
    Log().Write(kLogIdSystem, kLogError, "orvex:::host", line.c_str());
    parse(default_value, &choice);
    return choice;
}

}  // namespace

namespace {

// One accepted form of a source value: "name" alone, or "name:arg" when it takes an argument.
struct SourceForm {
    const char* name;
    SourceChoice::Kind kind;
    bool takes_arg;
    bool needs_arg;
    const char* default_arg;  // for "name" or "name:" alone
};

template <size_t N>
bool ParseSource(const std::string& value, const SourceForm (&forms)[N], SourceChoice* out) {
    for (const SourceForm& form : forms) {
        std::string arg;
        bool match = form.takes_arg ? Is(value, form.name, &arg) : value == form.name;
        if (!match || (form.needs_arg && arg.empty())) continue;
        out->kind = form.kind;
        out->arg = arg.empty() ? form.default_arg : arg;
        out->text = value;
        return true;
    }
    return false;
}

constexpr SourceForm kVideoForms[] = {
    {"pattern", SourceChoice::kPattern, false, false, ""},
    {"none", SourceChoice::kNone, false, false, ""},
    {"x11", SourceChoice::kX11, true, false, ""},  // no display: $DISPLAY
    {"wayland", SourceChoice::kWayland, false, false, ""},
    {"screen", SourceChoice::kX11, false, false, ""},  // or kWayland: see ParseVideoSource
    {"pipewire", SourceChoice::kPipeWire, true, true, ""},
    {"v4l2", SourceChoice::kV4l2, true, false, "/dev/video0"},
    {"gst", SourceChoice::kGst, true, true, ""},
};

constexpr SourceForm kAudioForms[] = {
    {"tone", SourceChoice::kTone, false, false, ""},
    {"none", SourceChoice::kNone, false, false, ""},
    {"pulse", SourceChoice::kPulse, true, false, ""},  // no source: the default sink's monitor
    {"alsa", SourceChoice::kAlsa, true, false, ""},
    {"gst", SourceChoice::kGst, true, true, ""},
};

}  // namespace

bool ParseVideoSource(const std::string& value, SourceChoice* out) {
    if (!ParseSource(value, kVideoForms, out)) return false;
    if (value == "screen")
        out->kind = ScreenKind(getenv("WAYLAND_DISPLAY"), getenv("XDG_SESSION_TYPE"));
    return true;
}

SourceChoice::Kind ScreenKind(const char* wayland_display, const char* session_type) {
    bool wayland = (wayland_display != nullptr && wayland_display[0] != '\0') ||
                   (session_type != nullptr && strcmp(session_type, "wayland") == 0);
    return wayland ? SourceChoice::kWayland : SourceChoice::kX11;
}

bool ParseAudioSource(const std::string& value, SourceChoice* out) {
    return ParseSource(value, kAudioForms, out);
}

SourceChoice ChooseVideoSource(bool sub) {
    return Choose(sub ? kSubVideoProperty : kVideoProperty, "pattern", &ParseVideoSource);
}

SourceChoice ChooseAudioSource() { return Choose(kAudioProperty, "tone", &ParseAudioSource); }

namespace {

std::string ConversionTo(int width, int height, int fps, const char* sink) {
    // BT.601 with limited range, as the pattern: what the encoder's colour description says.
    // videorate comes after the converters, so that a picture repeated to hold the rate is
    // converted once.
    return "videoconvert ! videoscale add-borders=true ! videorate ! "
           "video/x-raw,format=I420,colorimetry=bt601,width=" +
           std::to_string(width) + ",height=" + std::to_string(height) +
           ",framerate=" + std::to_string(fps) + "/1,pixel-aspect-ratio=1/1 ! " + sink;
}

constexpr char kAppSink[] = "appsink name=orvexsink max-buffers=2 drop=true";

// The head of a video pipeline and its conversion to I420 of exactly width x height at fps,
// ending in `sink`.
std::string VideoPipelineTo(const SourceChoice& source, int width, int height, int fps,
                            const char* sink) {
    std::string head;
    switch (source.kind) {
        case SourceChoice::kX11:
            // Without a name ximagesrc opens $DISPLAY. Damage events would leave out frames
            // of a still screen; every frame is wanted.
            head = "ximagesrc use-damage=false";
            if (!source.arg.empty()) head += " display-name=" + Quoted(source.arg);
            break;
        case SourceChoice::kV4l2:
            head = "v4l2src device=" + Quoted(source.arg);
            break;
        case SourceChoice::kGst:
            head = source.arg;
            break;
        default:
            return std::string();
    }
    return head + " ! " + ConversionTo(width, height, fps, sink);
}

}  // namespace

std::string VideoPipeline(const SourceChoice& source, int width, int height, int fps) {
    return VideoPipelineTo(source, width, height, fps, kAppSink);
}

std::string VideoConversion(int width, int height) {
    // No videorate: PipeWire sends a picture when the screen changes, often without a time
    // stamp videorate would accept, and the recorder sends the last picture again anyway.
    return "videoconvert ! videoscale add-borders=true ! "
           "video/x-raw,format=I420,colorimetry=bt601,width=" +
           std::to_string(width) + ",height=" + std::to_string(height) +
           ",pixel-aspect-ratio=1/1 ! " + kAppSink;
}

std::string ChildVideoPipeline(const SourceChoice& source, int width, int height, int fps) {
    // Xlib ends the process whose X server goes away.
    if (source.kind != SourceChoice::kX11) return std::string();
    return VideoPipelineTo(source, width, height, fps, "fdsink fd=3 sync=false");
}

std::string AudioPipeline(const SourceChoice& source) {
    std::string head;
    switch (source.kind) {
        case SourceChoice::kPulse:
            // The monitor of the default sink is what the machine plays.
            head =
                "pulsesrc device=" + Quoted(source.arg.empty() ? "@DEFAULT_MONITOR@" : source.arg);
            break;
        case SourceChoice::kAlsa:
            head = "alsasrc";
            if (!source.arg.empty()) head += " device=" + Quoted(source.arg);
            break;
        case SourceChoice::kGst:
            head = source.arg;
            break;
        default:
            return std::string();
    }
    return head +
           " ! audioconvert ! audioresample ! "
           "audio/x-raw,format=S16LE,rate=48000,channels=2,layout=interleaved ! "
           "appsink name=orvexsink max-buffers=50 drop=true";
}

}  // namespace host
}  // namespace platform
