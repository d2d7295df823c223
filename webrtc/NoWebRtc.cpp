// WebRTC playback's entry points in a build without it (the television's default, which has
// neither OpenSSL's DTLS, libsrtp nor libopus): a kv.orvex.webrtc that asks for it is answered
// with one line, not a port.
#include "base/OrvexLog.h"
#include "platform/LogPort.h"
#include "platform/Ports.h"
#include "webrtc/WebRtc.h"

WhepEndpoint* StartWebRtc(stream::CaptureDemand*) {
    char value[platform::kPropertyValueMax] = {};
    platform::Properties().Get("kv.orvex.webrtc", value, "");
    if (value[0] != '\0') {
        OrvexLogPriority(platform::kLogWarn, "orvex:::webrtc",
                         "kv.orvex.webrtc=%s: this build has no WebRTC playback; no port is opened",
                         value);
    }
    return nullptr;
}

void StopWebRtc() {}
