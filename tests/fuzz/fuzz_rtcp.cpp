// Arbitrary bytes as an RTCP datagram after SRTCP unprotect: read whole or refused, never more
// NACKed numbers than the list holds. The same bytes also drive the RTP header writer, whose
// header must be a multiple of 4 within its bound.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string_view>

#include "webrtc/Rtcp.h"
#include "webrtc/RtpExtension.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    webrtc::RtcpFeedback f;
    if (webrtc::ReadRtcp(data, size, &f)) {
        if (f.nacked_count < 0 || f.nacked_count > webrtc::kMaxNacked) abort();
        if (size % 4 != 0) abort();  // only whole 32-bit packets are read
    }
    webrtc::LooksLikeRtcp(data, size);
    if (size >= 4) {
        uint8_t header[webrtc::kMaxRtpHeaderWithExtensions];
        const int delay_id = int(data[0] & 0x0f) - 1;  // -1..14
        const int mid_id = int(data[1] & 0x0f) - 1;
        const std::string_view mid(reinterpret_cast<const char*>(data + 4),
                                   size - 4 < 20 ? size - 4 : 20);
        const size_t n = webrtc::WriteRtpHeaderWithExtensions(header, data[2] & 1, data[3] & 0x7f,
                                                              1, 2, 3, delay_id, mid_id, mid);
        if (n % 4 != 0 || n < 12 || n > sizeof header) abort();
    }
    return 0;
}
