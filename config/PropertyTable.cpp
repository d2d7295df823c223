#include "config/PropertyTable.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "auth/AddressRules.h"
#include "platform/LogPort.h"

namespace config {
namespace {

using P = Property;
using T = PropertyType;
using W = TakesEffect;

constexpr const char* kFlavours[] = {"sa", "px", "dqx", nullptr};  // PlatformFlavour's order
constexpr const char* kConfig = "globalconfig";
constexpr const char* kWeb = "orvex:::web";
constexpr const char* kAccess = "orvex:::access";
constexpr int kError = platform::kLogError;
constexpr int kWarn = platform::kLogWarn;

// tools/check-properties.py and cmake/PropertyKeys.cmake read the keys from this source: each
// entry begins with its Property (P::) and its key, on one line.
// clang-format off
constexpr PropertyDef kTable[] = {
    {P::kFlavour, "kelvo.build.kelvotv", T::kChoice, "", nullptr, nullptr, 0, 0, 0, kFlavours,
     W::kAtFirstUse, "capture (PlatformFlavour): which vendor interfaces the television has",
     nullptr, 0, nullptr},
    {P::kAacEncoder, "kv.orvex.aacenc", T::kSwitch, "", "thread", "inline", 0, 0, 0, nullptr,
     W::kAtStart, "capture, audio sender: encode and send AAC in the thread that reads the sound", kConfig,
     kTraceLine,
     "kv.orvex.aacenc=\"%s\" is neither thread nor inline; the encoder keeps its own thread"},
    {P::kAllow, "kv.orvex.allow", T::kText, "", nullptr, nullptr, 0, 0, 0, nullptr,
     W::kAtStart, "auth (AccessGate): CIDR[,CIDR...] that may connect; it logs what it refuses",
     nullptr, 0, nullptr},
    {P::kAudioClock, "kv.orvex.audioclock", T::kSwitch, "", "write", "samples", 0, 0, 0, nullptr,
     W::kAtStart, "Global_Config: stamp AAC frames by their samples", kConfig, kTraceLine,
     "kv.orvex.audioclock=\"%s\" is neither write nor samples; audio is stamped at write time"},
    // The television's own clients expect 98, although the SDP announces 97.
    {P::kAudioPayloadType, "kv.orvex.audiopt", T::kNumber, "", nullptr, nullptr, 96, 127, 98,
     nullptr, W::kAtStart, "Global_Config: the payload type audio RTP packets carry", kConfig,
     kTraceLine,
     "kv.orvex.audiopt=\"%s\" is not a payload type from 96 to 127; audio RTP keeps 98"},
    {P::kAuth, "kv.orvex.auth", T::kText, "", nullptr, nullptr, 0, 0, 0, nullptr, W::kAtStart,
     "auth (AccessGate): the htdigest users file; it logs an unreadable one", nullptr, 0,
     nullptr},
    // A value that is not an address opens nothing rather than everything.
    {P::kBind, "kv.orvex.bind", T::kAddress, "", nullptr, nullptr, 0, 0, 0, nullptr,
     W::kAtStart, "RTSP listener, web viewer, start line: the one address to listen on",
     kAccess, kError, "kv.orvex.bind=\"%s\" is not an IPv4 address; not listening"},
    {P::kDumpToSd, "kv.orvex.dumptosd", T::kNonZero, "0", nullptr, nullptr, 0, 0, 0, nullptr,
     W::kAtPlay, "capture: dump files go to the SD card", nullptr, 0, nullptr},
    // Unset on the television: no web viewer, no port.
    {P::kHttp, "kv.orvex.http", T::kNumber, "", nullptr, nullptr, 1, 65535, 0, nullptr,
     W::kAtStart, "web viewer: its TCP port", kWeb, kError,
     "kv.orvex.http=\"%s\" is not a port number; no web viewer"},
    {P::kHttpMax, "kv.orvex.http.max", T::kNumber, "16", nullptr, nullptr, 1, 64, 16, nullptr,
     W::kAtStart, "web viewer: viewers at once", kWeb, kWarn,
     "kv.orvex.http.max=\"%s\" is not 1 to 64; 16 viewers at most"},
    {P::kJoin, "kv.orvex.join", T::kSwitch, "", "now", "key", 0, 0, 0, nullptr, W::kAtPlay,
     "H.264 sender: a new client starts at the next key picture", kConfig, kTraceLine,
     "kv.orvex.join=\"%s\" is neither now nor key; clients join at once"},
    {P::kLatency, "kv.orvex.latency", T::kSwitch, "", "0", "1", 0, 0, 0, nullptr, W::kAtStart,
     "H.264 sender: log frame waits every 300 frames", kConfig, kTraceLine,
     "kv.orvex.latency=\"%s\" is neither 0 nor 1; no latency report"},
    // The host reads its text too: "debug" or non-zero is its debug level (HostLog).
    {P::kLog, "kv.orvex.log", T::kNonZero, "0", nullptr, nullptr, 0, 0, 0, nullptr, W::kAtPlay,
     "capture: its debug logging; platform/host: its log level at start", nullptr, 0, nullptr},
    {P::kPublish, "kv.orvex.publish", T::kText, "", nullptr, nullptr, 0, 0, 0, nullptr,
     W::kAtStart, "publisher: rtmp:// and srt:// URLs; it logs the ones it leaves out", nullptr,
     0, nullptr},
    {P::kSdp, "kv.orvex.sdp", T::kSwitch, "", nullptr, "live", 0, 0, 0, nullptr, W::kAtPlay,
     "DESCRIBE: the live stream's parameter sets instead of the fixed ones", nullptr, 0,
     nullptr},
    {P::kWake, "kv.orvex.wake", T::kSwitch, "", "poll", "event", 0, 0, 0, nullptr, W::kAtStart,
     "send threads, AAC encoder, run-flag loops: sleep until woken", kConfig, kTraceLine,
     "kv.orvex.wake=\"%s\" is neither poll nor event; idle loops keep polling"},
    // Unset on the television: no WebRTC. 0 is any free port.
    {P::kWebRtc, "kv.orvex.webrtc", T::kNumber, "", nullptr, nullptr, 0, 65535, -1, nullptr,
     W::kAtStart, "WebRTC playback: its UDP port", "orvex:::webrtc", kError,
     "kv.orvex.webrtc=\"%s\" is not a UDP port number; no WebRTC"},
    // The host's sources are parsed, and refused with a line, by platform/host/capture.
    {P::kHostAudio, "orvex.host.audio", T::kWholeText, "tone", nullptr, nullptr, 0, 0, 0,
     nullptr, W::kAtPlay, "platform/host (HostSources): the sound source", nullptr, 0, nullptr},
    {P::kHostLog, "orvex.host.log", T::kText, "stderr", nullptr, nullptr, 0, 0, 0, nullptr,
     W::kAtStart, "platform/host (HostPlatform): the log sink (stderr, syslog, file:PATH)", nullptr, 0, nullptr},
    {P::kHostLogLevel, "orvex.host.log.level", T::kText, "", nullptr, nullptr, 0, 0, 0, nullptr,
     W::kAtStart, "platform/host (HostLog): the least priority logged; it refuses unknown ones", nullptr, 0,
     nullptr},
    {P::kHostVideo, "orvex.host.video", T::kWholeText, "pattern", nullptr, nullptr, 0, 0, 0,
     nullptr, W::kAtPlay, "platform/host (HostSources): the main window's picture source", nullptr, 0, nullptr},
    {P::kHostVideoSub, "orvex.host.video.sub", T::kWholeText, "pattern", nullptr, nullptr, 0, 0,
     0, nullptr, W::kAtPlay, "platform/host (HostSources): the sub window's picture source", nullptr, 0, nullptr},
    // Read-only on the television; read at each capture choice as the television always has.
    {P::kBoard, "ro.board.platform", T::kText, "android", nullptr, nullptr, 0, 0, 0, nullptr,
     W::kAtPlay, "capture rules, web viewer: the chip (1920x1080 is refused on tarvo)", nullptr,
     0, nullptr},
};
// clang-format on

static_assert(sizeof kTable / sizeof kTable[0] == kPropertyCount, "one entry per Property");

constexpr bool InIdOrder() {
    for (size_t i = 0; i < kPropertyCount; ++i) {
        if (static_cast<size_t>(kTable[i].id) != i) return false;
    }
    return true;
}
static_assert(InIdOrder(), "the table is indexed by Property");

std::string Refusal(const PropertyDef& def, const std::string& text) {
    if (def.refusal == nullptr) return "";
    char line[512];
    snprintf(line, sizeof line, def.refusal, text.c_str());
    return line;
}

}  // namespace

const PropertyDef& Def(Property id) { return kTable[static_cast<size_t>(id)]; }

const PropertyDef* Defs() { return kTable; }

const PropertyDef* FindDef(const std::string& key) {
    for (const PropertyDef& def : kTable) {
        if (key == def.key) return &def;
    }
    return nullptr;
}

PropertyValue ParseProperty(const PropertyDef& def, const std::string& text) {
    PropertyValue value;
    value.text = text;
    const char* c = value.text.c_str();
    switch (def.type) {
        case T::kText:
        case T::kWholeText:
            return value;
        case T::kSwitch:
            if (def.on != nullptr && value.text == def.on) {
                value.number = 1;
            } else if (!value.text.empty() && def.off != nullptr && value.text != def.off) {
                value.refused = true;
            }
            break;
        case T::kNumber: {
            value.number = def.fallback;
            if (value.text.empty()) return value;
            char* end = nullptr;
            const long n = strtol(c, &end, 10);
            if (end == c || *end != '\0' || n < def.min || n > def.max) {
                value.refused = true;
            } else {
                value.number = n;
            }
            break;
        }
        case T::kNonZero:
            value.number = atoi(c) != 0 ? 1 : 0;
            return value;
        case T::kChoice:
            for (long i = 0; def.choices[i] != nullptr; ++i) {
                if (value.text == def.choices[i]) value.number = i + 1;
            }
            return value;
        case T::kAddress: {
            uint32_t parsed = 0;
            value.refused = !value.text.empty() && !auth::ParseIpv4(value.text, &parsed);
            break;
        }
    }
    if (value.refused) value.refusal = Refusal(def, value.text);
    return value;
}

PropertyValue ReadProperty(platform::PropertyPort& port, const PropertyDef& def) {
    if (def.type == T::kWholeText) {
        std::string text;
        return ParseProperty(def, port.Lookup(def.key, &text) ? text : def.unset);
    }
    char text[platform::kPropertyValueMax] = {};
    port.Get(def.key, text, def.unset);
    return ParseProperty(def, text);
}

}  // namespace config
