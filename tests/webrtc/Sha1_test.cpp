#include "webrtc/Sha1.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "Hex.h"  // beside this file

namespace {

std::vector<uint8_t> Bytes(const std::string& s) { return {s.begin(), s.end()}; }

std::vector<uint8_t> Digest(const std::vector<uint8_t>& m, size_t split) {
    webrtc::Sha1 h;
    h.Update(m.data(), split);
    h.Update(m.data() + split, m.size() - split);
    std::vector<uint8_t> d(webrtc::Sha1::kDigestSize);
    h.Final(d.data());
    return d;
}

// FIPS 180-4 examples; each message is also fed in two pieces split at every byte, which is
// where buffering faults show.
TEST(WebRtcSha1Test, KnownDigestsAtEverySplit) {
    struct Case {
        const char* name;
        std::string message;
        const char* digest;
    };
    const Case cases[] = {
        {"empty", "", "da39a3ee5e6b4b0d3255bfef95601890afd80709"},
        {"one block", "abc", "a9993e364706816aba3e25717850c26c9cd0d89d"},
        {"padding spills into a second block",
         "abcdbcdecdefdefgefghfghighijhijkijkljklmklmnlmnomnopnopq",
         "84983e441c3bd26ebaae4aa1f95129e5e54670f1"},
        {"exactly one block of 64", std::string(64, 'a'),
         "0098ba824b5c16427bd7a1122a5a442a25ec644d"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        const std::vector<uint8_t> m = Bytes(c.message);
        for (size_t split = 0; split <= m.size(); ++split) {
            ASSERT_EQ(Digest(m, split), Hex(c.digest)) << "split at " << split;
        }
    }
}

// RFC 2202 §3 test cases 1, 2 and 6 (a key longer than a block is hashed first).
TEST(WebRtcSha1Test, HmacRfc2202) {
    struct Case {
        const char* name;
        std::vector<uint8_t> key;
        std::string data;
        const char* mac;
    };
    const Case cases[] = {
        {"case 1", std::vector<uint8_t>(20, 0x0b), "Hi There",
         "b617318655057264e28bc0b6fb378c8ef146be00"},
        {"case 2", Bytes("Jefe"), "what do ya want for nothing?",
         "effcdf6ae5eb2fa2d27416d5f184df9c259a7c79"},
        {"case 6: 80-byte key", std::vector<uint8_t>(80, 0xaa),
         "Test Using Larger Than Block-Size Key - Hash Key First",
         "aa4ae5e15272d00e95705637ce8a3b55ed402112"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        webrtc::HmacSha1 h(c.key.data(), c.key.size());
        h.Update(reinterpret_cast<const uint8_t*>(c.data.data()), c.data.size());
        std::vector<uint8_t> mac(webrtc::Sha1::kDigestSize);
        h.Final(mac.data());
        EXPECT_EQ(mac, Hex(c.mac));
    }
}

}  // namespace
