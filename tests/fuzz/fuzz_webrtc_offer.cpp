// Arbitrary bytes as the body of a POST to /whep: an offer is refused with one sentence or
// answered, and every answer line is printable text ending in CRLF (offered values reach it),
// with exactly one accepted video.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>
#include <string_view>

#include "webrtc/WebRtcSdp.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    // The first byte picks the stream's profile, so every branch of the H.264 choice is reached.
    if (size < 1) return 0;
    static const int kProfiles[][2] = {{0x42, 0xe0}, {0x42, 0x00}, {0x4d, 0x40}, {0x64, 0x00}};
    const int* profile = kProfiles[data[0] % 4];
    const std::string_view sdp(reinterpret_cast<const char*>(data + 1), size - 1);
    webrtc::WebRtcOffer offer;
    std::string why;
    if (!webrtc::ReadWebRtcOffer(sdp, profile[0], profile[1], &offer, &why)) {
        if (why.empty() || why.back() != '.') abort();
        return 0;
    }
    int videos = 0;
    for (const webrtc::WebRtcOffer::Media& m : offer.media) {
        if (m.accepted && m.kind == "video") ++videos;
        if (m.accepted && (m.payload_type < 0 || m.payload_type > 127)) abort();
    }
    if (videos != 1 || offer.fingerprint.size() != 32) abort();
    webrtc::WebRtcAnswerParams p;
    p.ice_ufrag = "u";
    p.ice_pwd = "p";
    p.fingerprint_sha256 = "AB";
    p.address = "192.168.1.20";
    p.port = 8443;
    p.video_ssrc = 1;
    p.audio_ssrc = 2;
    p.rtx_ssrc = 3;
    p.cname = "c";
    p.stream_id = "s";
    p.h264_profile_level_id = "42e01f";
    p.session_id = 4;
    const std::string answer = webrtc::WriteWebRtcAnswer(offer, p);
    for (size_t i = 0; i < answer.size(); ++i) {
        const unsigned char c = answer[i];
        if (c == '\r' && (i + 1 == answer.size() || answer[i + 1] != '\n')) abort();
        if (c == '\n' && (i == 0 || answer[i - 1] != '\r')) abort();
        if (c < 0x20 && c != '\r' && c != '\n' && c != '\t') abort();
    }
    if (answer.size() < 2 || answer.compare(answer.size() - 2, 2, "\r\n") != 0) abort();
    return 0;
}
