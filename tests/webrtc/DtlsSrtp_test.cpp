// One viewer's DTLS-SRTP session against a plain OpenSSL client playing the browser: the
// handshake in memory, SRTP both ways through the client's own libsrtp contexts, and what a
// wrong certificate, a close or hostile datagrams do to it.
#include "webrtc/DtlsSrtp.h"

#include <gtest/gtest.h>
#include <stdlib.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <thread>

#include "DtlsTestClient.h"

namespace webrtc {
namespace {

using test::Datagrams;
using test::DtlsTestClient;

const char* kBoth = "SRTP_AEAD_AES_128_GCM:SRTP_AES128_CM_SHA1_80";

class DtlsSrtpTest : public ::testing::Test {
protected:
    static void SetUpTestSuite() {
        char dir[] = "/tmp/orvex-dtls-XXXXXX";
        ASSERT_NE(mkdtemp(dir), nullptr);
        std::string why;
        cert_ = DtlsCertificate::LoadOrCreate(std::string(dir) + "/cert.pem", &why).release();
        std::filesystem::remove_all(dir);
        ASSERT_NE(cert_, nullptr) << why;
    }
    static void TearDownTestSuite() { delete cert_; }

    static Datagrams Feed(DtlsSrtpSession& s, const Datagrams& in) {
        Datagrams out;
        const auto send = [&](const uint8_t* p, size_t n) { out.emplace_back(p, p + n); };
        for (const auto& d : in) s.Feed(d.data(), d.size(), send);
        return out;
    }
    // Flights back and forth until neither side has more to say.
    static void Handshake(DtlsSrtpSession& s, DtlsTestClient& c, Datagrams to_server = {}) {
        if (to_server.empty()) to_server = c.Step({});
        for (int flight = 0; flight < 8 && !to_server.empty(); ++flight) {
            const Datagrams to_client = Feed(s, to_server);
            for (const auto& d : to_client) EXPECT_LE(d.size(), kDtlsMtu);
            to_server = c.Step(to_client);
        }
    }

    static DtlsCertificate* cert_;
};
DtlsCertificate* DtlsSrtpTest::cert_ = nullptr;

// An RTP packet as the H.264 sender writes one (V=2, PT 96, seq, timestamp, SSRC), 1200 bytes.
std::vector<uint8_t> RtpPacket(uint16_t seq) {
    std::vector<uint8_t> p = {
        0x80, 0x60, uint8_t(seq >> 8), uint8_t(seq), 0x00, 0x01, 0x5f, 0x90, 0x12, 0x34,
        0x56, 0x78};
    for (size_t i = p.size(); i < 1200; ++i) p.push_back(uint8_t(i * 7 + seq));
    return p;
}

TEST_F(DtlsSrtpTest, HandshakeKeysSrtpBothWays) {
    const struct {
        const char* name;
        const char* offer;
        const char* chosen;
        size_t rtp_trailer;   // the auth tag
        size_t rtcp_trailer;  // the tag and the E flag with the SRTCP index
    } cases[] = {
        {"both offered: GCM is preferred", kBoth, "SRTP_AEAD_AES_128_GCM", 16, 20},
        {"GCM alone", "SRTP_AEAD_AES_128_GCM", "SRTP_AEAD_AES_128_GCM", 16, 20},
        {"AES-CM with HMAC-SHA1-80 alone", "SRTP_AES128_CM_SHA1_80", "SRTP_AES128_CM_SHA1_80", 10,
         14},
    };
    // A sender report (RFC 3550 §6.4.1) with no report blocks.
    const std::vector<uint8_t> sr = {0x80, 0xc8, 0x00, 0x06, 0x12, 0x34, 0x56, 0x78, 0xe9, 0x10,
                                     0x20, 0x30, 0x40, 0x50, 0x60, 0x70, 0x00, 0x01, 0x5f, 0x90,
                                     0x00, 0x00, 0x00, 0x2a, 0x00, 0x00, 0xc3, 0x50};
    // Feedback shaped as browsers send it: an empty receiver report, a PLI, a NACK of 7 and 9.
    const std::vector<uint8_t> feedback = {0x80, 0xc9, 0x00, 0x01, 0x00, 0x00, 0x00, 0x01, 0x81,
                                           0xce, 0x00, 0x02, 0x00, 0x00, 0x00, 0x01, 0x12, 0x34,
                                           0x56, 0x78, 0x81, 0xcd, 0x00, 0x03, 0x00, 0x00, 0x00,
                                           0x01, 0x12, 0x34, 0x56, 0x78, 0x00, 0x07, 0x00, 0x02};
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        DtlsTestClient client(c.offer);
        DtlsSrtpSession session(*cert_, client.Fingerprint());
        Handshake(session, client);
        ASSERT_EQ(session.state(), DtlsSrtpSession::State::kConnected) << session.why();
        ASSERT_TRUE(client.connected());
        EXPECT_STREQ(session.srtp_profile(), c.chosen);
        EXPECT_EQ(session.NextTimeoutMs(), -1);
        // The a=fingerprint we announce is the certificate the browser was shown.
        EXPECT_EQ(test::Sha256Text(SSL_get0_peer_certificate(client.ssl())),
                  cert_->Sha256Fingerprint());
        ASSERT_TRUE(client.KeySrtp());

        const std::vector<uint8_t> rtp = RtpPacket(1);
        std::vector<uint8_t> wire(rtp.size() + kSrtpMaxTrailer);
        std::copy(rtp.begin(), rtp.end(), wire.begin());
        size_t len = rtp.size();
        ASSERT_TRUE(session.ProtectRtp(wire.data(), &len, wire.size()));
        EXPECT_EQ(len, rtp.size() + c.rtp_trailer);
        wire.resize(len);
        ASSERT_TRUE(client.UnprotectRtp(&wire));
        EXPECT_EQ(wire, rtp);

        wire.assign(sr.size() + kSrtpMaxTrailer, 0);
        std::copy(sr.begin(), sr.end(), wire.begin());
        len = sr.size();
        ASSERT_TRUE(session.ProtectRtcp(wire.data(), &len, wire.size()));
        EXPECT_EQ(len, sr.size() + c.rtcp_trailer);
        wire.resize(len);
        ASSERT_TRUE(client.UnprotectRtcp(&wire));
        EXPECT_EQ(wire, sr);

        std::vector<uint8_t> in = feedback;
        ASSERT_TRUE(client.ProtectRtcp(&in));
        std::vector<uint8_t> again = in;
        len = in.size();
        ASSERT_TRUE(session.UnprotectRtcp(in.data(), &len));
        EXPECT_EQ(std::vector<uint8_t>(in.begin(), in.begin() + len), feedback);
        len = again.size();
        EXPECT_FALSE(session.UnprotectRtcp(again.data(), &len)) << "a replay is refused";
    }
}

// A NACK asks for a packet sent long ago; its resend has the same sequence number and must
// protect to the same bytes, up to the replay window behind the newest.
TEST_F(DtlsSrtpTest, NackResendsWithinTheWindowProtectAgain) {
    DtlsTestClient client(kBoth);
    DtlsSrtpSession session(*cert_, client.Fingerprint());
    Handshake(session, client);
    ASSERT_EQ(session.state(), DtlsSrtpSession::State::kConnected) << session.why();
    ASSERT_TRUE(client.KeySrtp());
    const auto protect = [&](uint16_t seq, std::vector<uint8_t>* out) {
        *out = RtpPacket(seq);
        size_t len = out->size();
        out->resize(len + kSrtpMaxTrailer);
        const bool ok = session.ProtectRtp(out->data(), &len, out->size());
        out->resize(len);
        return ok;
    };
    std::vector<uint8_t> first, p;
    ASSERT_TRUE(protect(100, &first));  // "lost": the client never sees it
    for (uint16_t seq = 101; seq < 100 + kSrtpReplayWindow; ++seq) ASSERT_TRUE(protect(seq, &p));
    ASSERT_TRUE(protect(100, &p)) << "window - 1 behind";
    EXPECT_EQ(p, first);
    ASSERT_TRUE(client.UnprotectRtp(&p));
    EXPECT_EQ(p, RtpPacket(100));
    ASSERT_TRUE(protect(100 + kSrtpReplayWindow, &p));
    EXPECT_FALSE(protect(100, &p)) << "a whole window behind";
}

// What the browser's address sends after the handshake is outside bytes too.
TEST_F(DtlsSrtpTest, MalformedPacketsAreRefusedWhenConnected) {
    DtlsTestClient client(kBoth);
    DtlsSrtpSession session(*cert_, client.Fingerprint());
    Handshake(session, client);
    ASSERT_EQ(session.state(), DtlsSrtpSession::State::kConnected) << session.why();
    const struct {
        const char* name;
        std::vector<uint8_t> bytes;
    } srtcp[] = {
        {"empty", {}},
        {"a header alone", {0x80, 0xc9, 0x00, 0x01}},
        {"a receiver report without tag or index", {0x80, 0xc9, 0x00, 0x01, 0, 0, 0, 1}},
        {"a tag's worth of zeros", std::vector<uint8_t>(8 + kSrtpMaxTrailer, 0)},
        {"a whole packet with a forged tag", std::vector<uint8_t>(100, 0x81)},
    };
    for (const auto& c : srtcp) {
        SCOPED_TRACE(c.name);
        std::vector<uint8_t> p = c.bytes;
        p.reserve(1);
        size_t len = p.size();
        EXPECT_FALSE(session.UnprotectRtcp(p.data(), &len));
    }
    uint8_t rtp[64] = {0x80, 0x60, 0, 1, 0, 0, 0, 0, 0x12, 0x34, 0x56, 0x78};
    size_t len = 11;  // one short of a fixed header
    EXPECT_FALSE(session.ProtectRtp(rtp, &len, sizeof(rtp)));
    len = 12 + 1;
    EXPECT_FALSE(session.ProtectRtp(rtp, &len, len + kSrtpMaxTrailer - 1)) << "no room for a tag";
    EXPECT_EQ(len, 13u);
    rtp[0] = 0x8f;  // fifteen CSRCs the packet does not hold
    len = 20;
    EXPECT_FALSE(session.ProtectRtp(rtp, &len, sizeof(rtp)));
}

TEST_F(DtlsSrtpTest, PeersThatMustNotConnect) {
    DtlsTestClient other(kBoth);
    const struct {
        const char* name;
        const char* offer;
        bool wrong_fingerprint;
        const char* why;
    } cases[] = {
        {"certificate not the offer's", kBoth, true, "fingerprint"},
        {"no use_srtp offered", nullptr, false, "no SRTP profile"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        DtlsTestClient client(c.offer);
        DtlsSrtpSession session(*cert_,
                                c.wrong_fingerprint ? other.Fingerprint() : client.Fingerprint());
        Handshake(session, client);
        EXPECT_EQ(session.state(), DtlsSrtpSession::State::kFailed);
        EXPECT_NE(session.why().find(c.why), std::string::npos) << session.why();
        uint8_t rtp[64] = {0x80, 0x60};
        size_t len = 12;
        EXPECT_FALSE(session.ProtectRtp(rtp, &len, sizeof(rtp)));
    }
    DtlsSrtpSession short_digest(*cert_, std::vector<uint8_t>(20, 1));
    EXPECT_EQ(short_digest.state(), DtlsSrtpSession::State::kFailed);
}

// Datagrams that are not a ClientHello, or only part of one: never connected, never a crash.
// Those a real peer could send by mistake (not DTLS at all, records that fail to parse) leave
// the session able to handshake with the next real ClientHello; a fatal alert or a handshake
// message that parses wrong ends it with a reason.
TEST_F(DtlsSrtpTest, HostileDatagramsNeverConnect) {
    DtlsTestClient probe(kBoth);
    const std::vector<uint8_t> hello = probe.Step({}).at(0);
    const auto cut = [&](size_t n) {
        return std::vector<uint8_t>(hello.begin(), hello.begin() + n);
    };
    std::vector<uint8_t> long_record = hello;
    long_record[12] += 40;  // the record says it is longer than the datagram
    std::vector<uint8_t> short_fragment = hello;
    short_fragment[13 + 11] -= 1;  // fragment_length one short of what the record holds
    constexpr auto kUsable = DtlsSrtpSession::State::kHandshaking;
    constexpr auto kEnded = DtlsSrtpSession::State::kFailed;
    const struct {
        const char* name;
        std::vector<uint8_t> datagram;
        DtlsSrtpSession::State after;
    } cases[] = {
        {"STUN binding request (first byte 0)",
         {0x00, 0x01, 0x00, 0x00, 0x21, 0x12, 0xa4, 0x42},
         kUsable},
        {"RTP (first byte 0x80)", RtpPacket(5), kUsable},
        {"one byte of a handshake record", {22}, kUsable},
        {"a record header alone", cut(13), kUsable},
        {"the hello cut after its handshake header", cut(25), kUsable},
        {"the hello cut in half", cut(hello.size() / 2), kUsable},
        {"the hello short of its last byte", cut(hello.size() - 1), kUsable},
        {"a record longer than its datagram", long_record, kUsable},
        {"zeros", std::vector<uint8_t>(100, 0), kUsable},
        {"a handshake fragment shorter than its record", short_fragment, kEnded},
        {"a fatal alert (handshake_failure)",
         {21, 0xfe, 0xfd, 0, 0, 0, 0, 0, 0, 0, 0, 0, 2, 2, 40},
         kEnded},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        DtlsTestClient client(kBoth);
        DtlsSrtpSession session(*cert_, client.Fingerprint());
        const Datagrams out = Feed(session, {c.datagram});
        EXPECT_EQ(session.state(), c.after) << session.why();
        if (c.after == kEnded) {
            EXPECT_NE(session.why(), "");
            for (const auto& d : out) EXPECT_EQ(d.at(0), 21) << "only an alert goes back";
            continue;
        }
        EXPECT_EQ(out, Datagrams{});
        Handshake(session, client);
        EXPECT_EQ(session.state(), DtlsSrtpSession::State::kConnected) << session.why();
    }
}

TEST_F(DtlsSrtpTest, ACloseEitherWayEndsTheSession) {
    {
        DtlsTestClient client(kBoth);
        DtlsSrtpSession session(*cert_, client.Fingerprint());
        Handshake(session, client);
        ASSERT_TRUE(client.connected());
        SSL_shutdown(client.ssl());
        Feed(session, client.Step({}));
        EXPECT_EQ(session.state(), DtlsSrtpSession::State::kFailed);
        EXPECT_NE(session.why().find("close_notify"), std::string::npos) << session.why();
    }
    DtlsTestClient client(kBoth);
    DtlsSrtpSession session(*cert_, client.Fingerprint());
    Handshake(session, client);
    Datagrams out;
    session.Close([&](const uint8_t* p, size_t n) { out.emplace_back(p, p + n); });
    EXPECT_EQ(session.state(), DtlsSrtpSession::State::kFailed);
    client.Step(out);
    EXPECT_TRUE(client.closed_by_peer());
}

// A flight lost on the way is sent again when its sender's timer runs out: our first flight
// (OnTimeout), or the browser's last one when our Finished was lost (answered in Feed, the
// session being connected already). Each waits out a first retransmission timer (1 s); they
// assert what is sent, not when.
TEST_F(DtlsSrtpTest, ALostFlightIsSentAgain) {
    const auto sleep_ms = [](int ms) {
        std::this_thread::sleep_for(std::chrono::milliseconds(ms));
    };
    {
        SCOPED_TRACE("our first flight lost");
        DtlsTestClient client(kBoth);
        DtlsSrtpSession session(*cert_, client.Fingerprint());
        EXPECT_EQ(session.NextTimeoutMs(), -1);
        ASSERT_FALSE(Feed(session, client.Step({})).empty());
        const int wait = session.NextTimeoutMs();
        ASSERT_GT(wait, 0);
        Datagrams again;
        const auto send = [&](const uint8_t* p, size_t n) { again.emplace_back(p, p + n); };
        EXPECT_EQ(session.OnTimeout(send), DtlsSrtpSession::State::kHandshaking);
        EXPECT_TRUE(again.empty()) << "not due yet";
        sleep_ms(wait + 20);
        session.OnTimeout(send);
        ASSERT_FALSE(again.empty());
        Handshake(session, client, client.Step(again));
        EXPECT_EQ(session.state(), DtlsSrtpSession::State::kConnected) << session.why();
    }
    {
        SCOPED_TRACE("our last flight lost");
        DtlsTestClient client(kBoth);
        DtlsSrtpSession session(*cert_, client.Fingerprint());
        const Datagrams last = client.Step(Feed(session, client.Step({})));
        ASSERT_FALSE(Feed(session, last).empty());
        ASSERT_EQ(session.state(), DtlsSrtpSession::State::kConnected) << session.why();
        ASSERT_FALSE(client.connected());
        const int wait = client.NextTimeoutMs();
        ASSERT_GT(wait, 0);
        sleep_ms(wait + 20);
        const Datagrams resent = Feed(session, client.OnTimeout());
        ASSERT_FALSE(resent.empty()) << "the session answers the repeated flight";
        client.Step(resent);
        EXPECT_TRUE(client.connected());
        EXPECT_EQ(session.state(), DtlsSrtpSession::State::kConnected) << session.why();
    }
}

}  // namespace
}  // namespace webrtc
