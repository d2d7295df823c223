#include "webrtc/RtpExtension.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <vector>

#include "Hex.h"  // beside this file

namespace {

// Sequence 0x1234, timestamp 0xa0b0c0d0, SSRC 0x11223344 in every case.
TEST(WebRtcRtpExtensionTest, HeaderBytes) {
    struct Case {
        const char* name;
        bool marker;
        uint8_t payload_type;
        int playout_delay_id, mid_id;
        std::string mid;
        const char* bytes;
    };
    const Case cases[] = {
        {"chromium's ids 5 and 9, mid \"0\", marker on H.264 102", true, 102, 5, 9, "0",
         "90e61234 a0b0c0d0 11223344 bede0002 52000000 90300000"},
        {"no marker, Opus 111", false, 111, 5, 9, "1",
         "906f1234 a0b0c0d0 11223344 bede0002 52000000 90310000"},
        {"playout-delay only", false, 96, 5, -1, "0",
         "90601234 a0b0c0d0 11223344 bede0001 52000000"},
        {"mid only", false, 96, -1, 3, "audio",
         "90601234 a0b0c0d0 11223344 bede0002 34617564 696f0000"},
        {"16-byte mid fills the longest header", false, 96, 14, 1, "abcdefghijklmnop",
         "90601234 a0b0c0d0 11223344 bede0006 e2000000 1f616263 64656667 68696a6b 6c6d6e6f "
         "70000000"},
        {"17-byte mid left out", false, 96, 5, 9, "abcdefghijklmnopq",
         "90601234 a0b0c0d0 11223344 bede0001 52000000"},
        {"empty mid left out", false, 96, 5, 9, "", "90601234 a0b0c0d0 11223344 bede0001 52000000"},
        {"id 15 is reserved", false, 96, 15, 0, "0", "80601234 a0b0c0d0 11223344"},
        {"neither: the plain header", false, 96, 0, 0, "0", "80601234 a0b0c0d0 11223344"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        uint8_t p[webrtc::kMaxRtpHeaderWithExtensions + 8];
        memset(p, 0xee, sizeof p);
        const size_t n =
            webrtc::WriteRtpHeaderWithExtensions(p, c.marker, c.payload_type, 0x1234, 0xa0b0c0d0,
                                                 0x11223344, c.playout_delay_id, c.mid_id, c.mid);
        EXPECT_EQ(std::vector<uint8_t>(p, p + n), Hex(c.bytes));
        EXPECT_EQ(n % 4, 0u);
        EXPECT_LE(n, webrtc::kMaxRtpHeaderWithExtensions);
        EXPECT_EQ(p[n], 0xee);  // nothing written past the header
    }
}

}  // namespace
