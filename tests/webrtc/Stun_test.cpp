#include "webrtc/Stun.h"

#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <sys/un.h>

#include <cstring>
#include <string>
#include <vector>

#include "Hex.h"  // beside this file

namespace {

using webrtc::StunBindingRequest;
using webrtc::StunRead;

// RFC 5769 §2.1, password "VOkJxbRl1RmTxUk/WvJxBt"; USERNAME padded with blanks, not zeros.
const std::string kRfcRequest =
    "00010058 2112a442 b7e7a701 bc34d686 fa87dfae 80220010 5354554e 20746573 7420636c 69656e74"
    "00240004 6e0001ff 80290008 932ff9b1 51263b36 00060009 6576746a 3a683676 59202020"
    "00080014 9aeaa70c bfd8cb56 781ef2b5 b2d3f249 c1b571a2 80280004 e57a3bcf";
// RFC 5769 §2.2 and §2.3: the responses to it, XOR-MAPPED-ADDRESS 192.0.2.1:32853 and
// [2001:db8:1234:5678:11:2233:4455:6677]:32853.
const std::string kRfcResponse4 =
    "0101003c 2112a442 b7e7a701 bc34d686 fa87dfae 8022000b 74657374 20766563 746f7220"
    "00200008 0001a147 e112a643 00080014 2b91f599 fd9e90c3 8c7489f9 2af9ba53 f06be7d7"
    "80280004 c07d4c96";
const std::string kRfcResponse6 =
    "01010048 2112a442 b7e7a701 bc34d686 fa87dfae 8022000b 74657374 20766563 746f7220"
    "00200014 0002a147 0113a9fa a5d3f179 bc25f4b5 bed2b9d9 00080014 a382954e 4be67bf1"
    "1784c97c 8292c275 bfe3ed41 80280004 c8fb0b4c";
const char kRfcPassword[] = "VOkJxbRl1RmTxUk/WvJxBt";

// Chromium 156's checks of an ICE-lite answer with ufrag "orvx" and password kChromiumPassword,
// captured on loopback: USERNAME, GOOG-NETWORK-INFO (0xc057, comprehension-optional),
// ICE-CONTROLLING, PRIORITY, then the nominating one with USE-CANDIDATE.
const std::string kChromiumCheck =
    "0001004c 2112a442 4e792f75 636f6f41 64556a2b 00060009 6f727678 3a4a6e72 54000000"
    "c0570004 000003e7 802a0008 1811cca5 fdc589f3 00240004 6e001eff 00080014 6c78046a"
    "e2a53c30 47cb3fdb e78f156e e34be3b5 80280004 b5a9c753";
const std::string kChromiumNomination =
    "00010050 2112a442 42534959 47346c6d 454b4672 00060009 6f727678 3a4a6e72 54000000"
    "c0570004 000003e7 802a0008 1811cca5 fdc589f3 00250000 00240004 6e001eff 00080014"
    "0c84fa68 2705aa16 6d8dff10 c1ba83d6 81c214d2 80280004 22108a57";
const char kChromiumPassword[] = "0123456789abcdefghijklmn";
// What came next on the same port: the start of its DTLS ClientHello.
const std::string kChromiumDtls =
    "16feff00 00000000 00000004 a3010005 85000000 00000004 97fefdd7 ded5724f";

TEST(WebRtcStunTest, ReadBindingRequests) {
    struct Case {
        const char* name;
        std::string bytes;
        StunRead result;
        // Checked when kOk.
        const char* username = "";
        bool use_candidate = false, has_integrity = false, has_fingerprint = false;
        uint32_t priority = 0;
        bool ice_controlling = false;
        uint64_t tie_breaker = 0;
    };
    const Case cases[] = {
        {"RFC 5769 sample request: SOFTWARE skipped, ICE-CONTROLLED", kRfcRequest, StunRead::kOk,
         "evtj:h6vY", false, true, true, 0x6e0001ff, false, 0x932ff9b151263b36},
        {"chromium check: unknown optional attribute skipped", kChromiumCheck, StunRead::kOk,
         "orvx:JnrT", false, true, true, 0x6e001eff, true, 0x1811cca5fdc589f3},
        {"chromium nomination: USE-CANDIDATE", kChromiumNomination, StunRead::kOk, "orvx:JnrT",
         true, true, true, 0x6e001eff, true, 0x1811cca5fdc589f3},
        {"bare request: no attributes at all", "00010000 2112a442 000102030405060708090a0b",
         StunRead::kOk, "", false, false, false, 0, false, 0},
        {"attributes after MESSAGE-INTEGRITY are ignored",
         "0001001c 2112a442 000102030405060708090a0b 00080014 00000000 00000000 00000000 "
         "00000000 00000000 00250000",
         StunRead::kOk, "", false, true, false, 0, false, 0},
        {"DTLS on the same port is not STUN", kChromiumDtls, StunRead::kNotStun},
        {"RFC 5769 response is not a request", kRfcResponse4, StunRead::kNotBindingRequest},
        {"Binding indication is not a request", "00110000 2112a442 000102030405060708090a0b",
         StunRead::kNotBindingRequest},
        {"wrong magic cookie", "00010000 2112a443 000102030405060708090a0b", StunRead::kNotStun},
        {"length not a multiple of 4", "00010002 2112a442 000102030405060708090a0b 0000",
         StunRead::kNotStun},
        {"length beyond the datagram", "00010008 2112a442 000102030405060708090a0b 00250000",
         StunRead::kNotStun},
        {"header cut short", "00010000 2112a442 0001020304", StunRead::kNotStun},
        {"USERNAME overruns the message",
         "00010008 2112a442 000102030405060708090a0b 00060010 61626364", StunRead::kMalformed},
        {"USERNAME's padding overruns the message",
         "00010008 2112a442 000102030405060708090a0b 00060005 61626364", StunRead::kMalformed},
        {"PRIORITY of 2 bytes", "00010008 2112a442 000102030405060708090a0b 00240002 6e000000",
         StunRead::kMalformed},
        {"USE-CANDIDATE with a value",
         "00010008 2112a442 000102030405060708090a0b 00250004 00000000", StunRead::kMalformed},
        {"ICE-CONTROLLING of 4 bytes",
         "00010008 2112a442 000102030405060708090a0b 802a0004 00000000", StunRead::kMalformed},
        {"MESSAGE-INTEGRITY of 16 bytes",
         "00010014 2112a442 000102030405060708090a0b 00080010 00000000 00000000 00000000 "
         "00000000",
         StunRead::kMalformed},
        {"unknown comprehension-required attribute",
         "00010008 2112a442 000102030405060708090a0b 00030004 00000000", StunRead::kMalformed},
        {"FINGERPRINT not last",
         "0001000c 2112a442 000102030405060708090a0b 80280004 00000000 00250000",
         StunRead::kMalformed},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        const std::vector<uint8_t> m = Hex(c.bytes);
        StunBindingRequest req;
        ASSERT_EQ(webrtc::ReadStunBindingRequest(m.data(), m.size(), &req), c.result);
        if (c.result != StunRead::kOk) continue;
        EXPECT_EQ(req.username, c.username);
        EXPECT_EQ(req.use_candidate, c.use_candidate);
        EXPECT_EQ(req.has_integrity, c.has_integrity);
        EXPECT_EQ(req.has_fingerprint, c.has_fingerprint);
        EXPECT_EQ(req.priority, c.priority);
        EXPECT_EQ(req.ice_controlling, c.ice_controlling);
        EXPECT_EQ(req.tie_breaker, c.tie_breaker);
        EXPECT_EQ(0, memcmp(req.transaction, m.data() + 8, 12));
    }
}

// A flipped bit is refused, or (when it lengthens an attribute over the rest) leaves a request
// without its FINGERPRINT: never a fingerprinted request.
TEST(WebRtcStunTest, EveryFlippedBitOfTheFingerprintedPartIsCaught) {
    const std::vector<uint8_t> good = Hex(kChromiumNomination);
    StunBindingRequest req;
    // From the first attribute up to the CRC itself; the header's flips are the demux's.
    for (size_t bit = 20 * 8; bit < good.size() * 8; ++bit) {
        std::vector<uint8_t> m = good;
        m[bit / 8] ^= uint8_t(1 << (bit % 8));
        const StunRead r = webrtc::ReadStunBindingRequest(m.data(), m.size(), &req);
        ASSERT_TRUE(r != StunRead::kOk || !req.has_fingerprint) << "bit " << bit;
    }
}

TEST(WebRtcStunTest, Integrity) {
    struct Case {
        const char* name;
        std::string bytes;
        const char* password;
        bool ok;
    };
    const Case cases[] = {
        {"RFC 5769 request", kRfcRequest, kRfcPassword, true},
        {"RFC 5769 IPv4 response", kRfcResponse4, kRfcPassword, true},
        {"RFC 5769 IPv6 response", kRfcResponse6, kRfcPassword, true},
        {"chromium check", kChromiumCheck, kChromiumPassword, true},
        {"chromium nomination", kChromiumNomination, kChromiumPassword, true},
        {"wrong password", kChromiumCheck, kRfcPassword, false},
        {"empty password", kChromiumCheck, "", false},
        {"no MESSAGE-INTEGRITY", "00010008 2112a442 000102030405060708090a0b 00250000",
         kChromiumPassword, false},
        {"MESSAGE-INTEGRITY overruns",
         "00010008 2112a442 000102030405060708090a0b 00080014 00000000", kChromiumPassword, false},
        {"not STUN", kChromiumDtls, kChromiumPassword, false},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        const std::vector<uint8_t> m = Hex(c.bytes);
        EXPECT_EQ(webrtc::CheckStunIntegrity(m.data(), m.size(), c.password), c.ok);
    }
    // A changed username (with the CRC left as it was) no longer matches the hash.
    std::vector<uint8_t> m = Hex(kChromiumCheck);
    m[24] ^= 1;
    EXPECT_FALSE(webrtc::CheckStunIntegrity(m.data(), m.size(), kChromiumPassword));
}

sockaddr_storage Address(const char* ip, uint16_t port) {
    sockaddr_storage a = {};
    if (strchr(ip, ':') != nullptr) {
        auto* in6 = reinterpret_cast<sockaddr_in6*>(&a);
        in6->sin6_family = AF_INET6;
        in6->sin6_port = htons(port);
        inet_pton(AF_INET6, ip, &in6->sin6_addr);
    } else {
        auto* in = reinterpret_cast<sockaddr_in*>(&a);
        in->sin_family = AF_INET;
        in->sin_port = htons(port);
        inet_pton(AF_INET, ip, &in->sin_addr);
    }
    return a;
}

// Expected bytes from Python's hmac and zlib.crc32; the XOR-MAPPED-ADDRESS values are RFC
// 5769's, and the chromium answer is the one it took to reach "connected".
TEST(WebRtcStunTest, WriteBindingSuccess) {
    struct Case {
        const char* name;
        std::string request;
        const char* from;
        uint16_t port;
        const char* password;
        std::string response;
    };
    const Case cases[] = {
        {"IPv4, RFC 5769's transaction and address", kRfcRequest, "192.0.2.1", 32853, kRfcPassword,
         "0101002c 2112a442 b7e7a701 bc34d686 fa87dfae 00200008 0001a147 e112a643 00080014"
         "74c9371e bf314854 8518699c 3e3174c2 0dd9e68a 80280004 fae4043a"},
        {"IPv6, RFC 5769's transaction and address", kRfcRequest,
         "2001:db8:1234:5678:11:2233:4455:6677", 32853, kRfcPassword,
         "01010038 2112a442 b7e7a701 bc34d686 fa87dfae 00200014 0002a147 0113a9fa a5d3f179"
         "bc25f4b5 bed2b9d9 00080014 ee33a055 5319eec1 0ad5fbfd f8733d19 6e552b3c 80280004"
         "5ded7186"},
        {"chromium's nomination", kChromiumNomination, "127.0.0.1", 45065, kChromiumPassword,
         "0101002c 2112a442 42534959 47346c6d 454b4672 00200008 0001911b 5e12a443 00080014"
         "cd28e61a d2bb2f33 520c8283 6480cb4e d52f8f72 80280004 bafa38d6"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        const std::vector<uint8_t> m = Hex(c.request);
        StunBindingRequest req;
        ASSERT_EQ(webrtc::ReadStunBindingRequest(m.data(), m.size(), &req), StunRead::kOk);
        const sockaddr_storage from = Address(c.from, c.port);
        const std::vector<uint8_t> want = Hex(c.response);
        uint8_t out[128];
        const size_t n = webrtc::WriteStunBindingSuccess(
            req, reinterpret_cast<const sockaddr*>(&from), c.password, out, sizeof out);
        EXPECT_EQ(std::vector<uint8_t>(out, out + n), want);
        EXPECT_EQ(webrtc::WriteStunBindingSuccess(req, reinterpret_cast<const sockaddr*>(&from),
                                                  c.password, out, want.size() - 1),
                  0u);
    }
    const std::vector<uint8_t> m = Hex(kRfcRequest);
    StunBindingRequest req;
    webrtc::ReadStunBindingRequest(m.data(), m.size(), &req);
    sockaddr_un local = {};
    local.sun_family = AF_UNIX;
    uint8_t out[128];
    EXPECT_EQ(webrtc::WriteStunBindingSuccess(req, reinterpret_cast<const sockaddr*>(&local), "pw",
                                              out, sizeof out),
              0u);
}

TEST(WebRtcStunTest, LocalUfragOf) {
    EXPECT_EQ(webrtc::LocalUfragOf("orvx:JnrT"), "orvx");
    EXPECT_EQ(webrtc::LocalUfragOf("a:b:c"), "a");
    EXPECT_EQ(webrtc::LocalUfragOf("nocolon"), "nocolon");
    EXPECT_EQ(webrtc::LocalUfragOf(":JnrT"), "");
}

}  // namespace
