#include "webrtc/RtpExtension.h"

#include <cstring>

#include "codec/H264Packetiser.h"

namespace webrtc {
namespace {

constexpr size_t kRtpHeaderSize = 12;
constexpr size_t kMaxMid = 16;  // a one-byte element's length field holds 1..16

// RFC 8285 §4.2: id 0 is padding and 15 is reserved.
bool UsableId(int id) { return id >= 1 && id <= 14; }

}  // namespace

size_t WriteRtpHeaderWithExtensions(uint8_t* p, bool marker, uint8_t payload_type, uint16_t seq,
                                    uint32_t ts, uint32_t ssrc, int playout_delay_id, int mid_id,
                                    std::string_view mid) {
    const bool delay = UsableId(playout_delay_id);
    const bool with_mid = UsableId(mid_id) && !mid.empty() && mid.size() <= kMaxMid;
    // The system's one RTP header writer, with 7 bits of payload type; then the X bit.
    WriteRtpHeader(p, marker, payload_type & 0x7f, seq, ts, ssrc);
    if (!delay && !with_mid) return kRtpHeaderSize;
    p[0] |= 0x10;

    uint8_t* e = p + kRtpHeaderSize + 4;
    size_t used = 0;
    if (delay) {
        // Element header: id, then length - 1; min and max delay, 12 bits each, both 0.
        e[used++] = uint8_t(playout_delay_id << 4 | (3 - 1));
        e[used++] = 0;
        e[used++] = 0;
        e[used++] = 0;
    }
    if (with_mid) {
        e[used++] = uint8_t(mid_id << 4 | (mid.size() - 1));
        memcpy(e + used, mid.data(), mid.size());
        used += mid.size();
    }
    while (used % 4 != 0) e[used++] = 0;  // id 0: padding (RFC 8285 §4.2)

    uint8_t* x = p + kRtpHeaderSize;
    x[0] = 0xbe;
    x[1] = 0xde;
    x[2] = uint8_t((used / 4) >> 8);
    x[3] = uint8_t(used / 4);
    return kRtpHeaderSize + 4 + used;
}

}  // namespace webrtc
