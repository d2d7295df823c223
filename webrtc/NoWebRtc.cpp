// WebRTC playback's entry points in a build without it (the television's default, which has
// neither OpenSSL's DTLS, libsrtp nor libopus): a kv.orvex.webrtc that asks for it is answered
// with one line, not a port.
#include "base/OrvexLog.h"
#include "platform/LogPort.h"
#include "webrtc/WebRtc.h"

WhepEndpoint* StartWebRtc(const config::Settings& settings, stream::CaptureDemand*) {
    if (!settings.webrtc_text.empty()) {
        OrvexLogPriority(platform::kLogWarn, "orvex:::webrtc",
                         "kv.orvex.webrtc=%s: this build has no WebRTC playback; no port is opened",
                         settings.webrtc_text.c_str());
    }
    return nullptr;
}

void StopWebRtc() {}
