#include "config/Settings.h"

#include "base/OrvexLog.h"
#include "platform/Ports.h"

namespace config {
namespace {

// One line, as `id`'s entry says, for a refused value.
void LogRefusal(Property id, const PropertyValue& value) {
    if (value.refusal.empty()) return;
    const PropertyDef& def = Def(id);
    if (def.priority == kTraceLine) {
        OrvexLog(def.tag, "%s", value.refusal.c_str());
    } else {
        OrvexLogPriority(def.priority, def.tag, "%s", value.refusal.c_str());
    }
}

PropertyValue Read(platform::PropertyPort& port, Property id) {
    PropertyValue value = ReadProperty(port, Def(id));
    LogRefusal(id, value);
    return value;
}

}  // namespace

Settings ReadSettings(platform::PropertyPort& port) {
    Settings s;
    s.allow = Read(port, Property::kAllow).text;
    s.auth_file = Read(port, Property::kAuth).text;
    const PropertyValue bind = Read(port, Property::kBind);
    s.bind = bind.text;
    s.bind_refused = bind.refused;
    const PropertyValue http = Read(port, Property::kHttp);
    s.http_text = http.text;
    s.http_port = static_cast<unsigned>(http.number);
    // Only a web viewer reads its limit: without one, a bad limit is not worth a line.
    if (s.http_port != 0) s.http_max = static_cast<int>(Read(port, Property::kHttpMax).number);
    const PropertyValue webrtc = Read(port, Property::kWebRtc);
    s.webrtc_text = webrtc.text;
    s.webrtc_port = static_cast<int>(webrtc.number);
    s.publish = Read(port, Property::kPublish).text;
    s.audio_payload_type = static_cast<int>(Read(port, Property::kAudioPayloadType).number);
    s.wake_on_write = Read(port, Property::kWake).number != 0;
    s.audio_clock_samples = Read(port, Property::kAudioClock).number != 0;
    s.aac_inline = Read(port, Property::kAacEncoder).number != 0;
    s.report_latency = Read(port, Property::kLatency).number != 0;
    return s;
}

PropertyValue Reread(Property id) { return Read(platform::Properties(), id); }

}  // namespace config
