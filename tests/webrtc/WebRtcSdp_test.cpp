#include "webrtc/WebRtcSdp.h"

#include <gtest/gtest.h>

#include <fstream>
#include <sstream>
#include <string>

namespace {

using webrtc::WebRtcAnswerParams;
using webrtc::WebRtcOffer;

// Test files beside this one: Chromium 156's offer for addTransceiver('video', {direction:
// 'recvonly'}) and the same for audio, captured once (VP8, VP9, H.264 in four profiles each in
// modes 0 and 1, AV1, each with its rtx; extmap 5 playout-delay and 9 mid); a Firefox-shaped
// one written by hand (session-level fingerprint, a=fmtp and a=rtcp-fb before the a=rtpmap
// they qualify, extmap with a direction, a data channel, LF line ends); and the answers.
std::string TestFile(const char* name) {
    std::ifstream in(std::string(ORVEX_WEBRTC_TESTDATA "/") + name, std::ios::binary);
    std::stringstream s;
    s << in.rdbuf();
    return s.str();
}

std::string ChromiumOffer() { return TestFile("chromium-156-offer.sdp"); }

WebRtcAnswerParams Params() {
    WebRtcAnswerParams p;
    p.ice_ufrag = "orvx";
    p.ice_pwd = "0123456789abcdefghijklmn";
    p.fingerprint_sha256 =
        "AB:CD:EF:01:23:45:67:89:AB:CD:EF:01:23:45:67:89:AB:CD:EF:01:23:45:67:89:AB:CD:EF:01:23:"
        "45:67:89";
    p.address = "192.168.1.20";
    p.port = 8443;
    p.video_ssrc = 0x11223344;
    p.audio_ssrc = 0x55667788;
    p.cname = "orvex";
    p.stream_id = "orvex";
    p.h264_profile_level_id = "42e01f";
    p.session_id = 1234567890123;
    return p;
}

std::string Describe(const WebRtcOffer::Media& m) {
    std::ostringstream s;
    s << m.kind << " mid=" << m.mid << " " << m.direction << (m.accepted ? " accepted" : "")
      << " pt=" << m.payload_type << " rtx=" << m.rtx_payload_type
      << " plid=" << m.h264_profile_level_id << (m.nack ? " nack" : "") << (m.pli ? " pli" : "")
      << (m.fir ? " fir" : "") << (m.rtcp_rsize ? " rsize" : "")
      << " delay=" << m.playout_delay_extension << " midx=" << m.mid_extension;
    return s.str();
}

TEST(WebRtcSdpTest, ChromiumOfferRead) {
    WebRtcOffer offer;
    std::string why;
    ASSERT_TRUE(webrtc::ReadWebRtcOffer(ChromiumOffer(), 0x42, 0xe0, &offer, &why)) << why;
    EXPECT_EQ(offer.ice_ufrag, "G4J7");
    EXPECT_EQ(offer.ice_pwd, "viUu2WX0dqj6tvJxzIjgM8Lm");
    EXPECT_EQ(offer.fingerprint_algorithm, "sha-256");
    ASSERT_EQ(offer.fingerprint.size(), 32u);
    EXPECT_EQ(offer.fingerprint[0], 0xc1);
    EXPECT_EQ(offer.fingerprint[31], 0x19);
    EXPECT_EQ(offer.setup, "actpass");
    EXPECT_TRUE(offer.bundle);
    EXPECT_TRUE(offer.rtcp_mux);
    ASSERT_EQ(offer.media.size(), 2u);
    EXPECT_EQ(Describe(offer.media[0]),
              "video mid=0 recvonly accepted pt=108 rtx=109 plid=42e01f nack pli fir rsize "
              "delay=5 midx=9");
    EXPECT_EQ(Describe(offer.media[1]),
              "audio mid=1 recvonly accepted pt=111 rtx=-1 plid= rsize delay=-1 midx=9");
}

// The stream's own profile chooses among Chromium's mode-1 types 102 (42001f), 108 (42e01f),
// 116 (4d001f) and 41 (f4001f); the mode-0 types 104, 114, 39, 43 never.
TEST(WebRtcSdpTest, H264TypeFollowsTheStreamsProfile) {
    struct Case {
        const char* name;
        int profile_idc, constraints;
        int payload_type, rtx;
    };
    const Case cases[] = {
        {"constrained baseline: the exact 42e0", 0x42, 0xe0, 108, 109},
        {"baseline without constraints: 4200, not 42e0 which asks for more", 0x42, 0x00, 102, 103},
        {"main with constraint_set1: 4d00 asks for nothing it lacks", 0x4d, 0x40, 116, 117},
        {"high, not offered: constrained baseline", 0x64, 0x00, 108, 109},
        {"high 4:4:4: f400", 0xf4, 0x00, 41, 42},
        {"reserved low bits are not constraints", 0x42, 0xe3, 108, 109},
    };
    const std::string sdp = ChromiumOffer();
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        WebRtcOffer offer;
        std::string why;
        ASSERT_TRUE(webrtc::ReadWebRtcOffer(sdp, c.profile_idc, c.constraints, &offer, &why));
        EXPECT_EQ(offer.media[0].payload_type, c.payload_type);
        EXPECT_EQ(offer.media[0].rtx_payload_type, c.rtx);
    }
}

TEST(WebRtcSdpTest, Answers) {
    struct Case {
        const char* name;
        const char* offer;
        int profile_idc, constraints;
        const char* address;
        uint32_t rtx_ssrc;
        const char* answer;
    };
    const Case cases[] = {
        {"chromium: constrained baseline 108 with rtx 109 and its FID group",
         "chromium-156-offer.sdp", 0x42, 0xe0, "192.168.1.20", 0x99aabbcc,
         "chromium-156-answer.sdp"},
        {"firefox-shaped: the data channel refused, IPv6, rtx without an SSRC",
         "firefox-shaped-offer.sdp", 0x64, 0x00, "fd00::20", 0, "firefox-shaped-answer.sdp"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        WebRtcOffer offer;
        std::string why;
        ASSERT_TRUE(
            webrtc::ReadWebRtcOffer(TestFile(c.offer), c.profile_idc, c.constraints, &offer, &why))
            << why;
        WebRtcAnswerParams p = Params();
        p.address = c.address;
        p.rtx_ssrc = c.rtx_ssrc;
        EXPECT_EQ(webrtc::WriteWebRtcAnswer(offer, p), TestFile(c.answer));
    }
}

TEST(WebRtcSdpTest, FirefoxShapedOfferRead) {
    WebRtcOffer offer;
    std::string why;
    ASSERT_TRUE(
        webrtc::ReadWebRtcOffer(TestFile("firefox-shaped-offer.sdp"), 0x64, 0x00, &offer, &why))
        << why;
    EXPECT_EQ(offer.ice_ufrag, "9c2f1e0a");
    EXPECT_EQ(offer.fingerprint[0], 0x7d);
    ASSERT_EQ(offer.media.size(), 3u);
    EXPECT_EQ(Describe(offer.media[0]),
              "video mid=0 recvonly accepted pt=126 rtx=127 plid=42e01f nack pli fir rsize "
              "delay=6 midx=3");
    EXPECT_EQ(Describe(offer.media[1]),
              "audio mid=1 recvonly accepted pt=109 rtx=-1 plid= delay=-1 midx=3");
    EXPECT_EQ(Describe(offer.media[2]),
              "application mid=2 sendrecv pt=-1 rtx=-1 plid= delay=-1 midx=-1");
}

const char kMinimal[] =
    "v=0\r\n"
    "o=- 1 2 IN IP4 127.0.0.1\r\n"
    "s=-\r\n"
    "t=0 0\r\n"
    "a=group:BUNDLE v a\r\n"
    "a=ice-ufrag:u\r\n"
    "a=ice-pwd:p\r\n"
    "a=fingerprint:sha-256 "
    "00:11:22:33:44:55:66:77:88:99:AA:BB:CC:DD:EE:FF:00:11:22:33:44:55:66:77:88:99:AA:BB:CC:DD:"
    "EE:FF\r\n"
    "a=setup:actpass\r\n"
    "m=video 9 UDP/TLS/RTP/SAVPF 96\r\n"
    "a=mid:v\r\n"
    "a=recvonly\r\n"
    "a=rtcp-mux\r\n"
    "a=rtpmap:96 H264/90000\r\n"
    "a=fmtp:96 packetization-mode=1;profile-level-id=42e01f\r\n"
    "a=rtcp-fb:* nack\r\n"
    "m=audio 9 UDP/TLS/RTP/SAVPF 0\r\n"
    "a=mid:a\r\n"
    "a=recvonly\r\n"
    "a=rtcp-mux\r\n"
    "a=rtpmap:0 PCMU/8000\r\n";

std::string Replace(std::string s, const std::string& from, const std::string& to) {
    const size_t at = s.find(from);
    if (at != std::string::npos) s.replace(at, from.size(), to);
    return s;
}

std::string Repeat(const std::string& s, int times) {
    std::string out;
    for (int i = 0; i < times; ++i) out += s;
    return out;
}

// The minimal offer with `extra` data channel sections after its two.
std::string WithDataChannels(int extra) {
    return kMinimal + Repeat("m=application 9 UDP/DTLS/SCTP webrtc-datachannel\r\n", extra);
}

TEST(WebRtcSdpTest, OfferShapes) {
    struct Case {
        const char* name;
        std::string sdp;
        const char* why;         // empty: accepted
        std::string media = "";  // Describe of each section, "|" between, when accepted
    };
    const std::string m = kMinimal;
    const Case cases[] = {
        {"minimal: rtcp-fb:* applies, audio without Opus refused", m, "",
         "video mid=v recvonly accepted pt=96 rtx=-1 plid=42e01f nack delay=-1 midx=-1|"
         "audio mid=a recvonly pt=-1 rtx=-1 plid= delay=-1 midx=-1"},
        {"sendrecv video is taken", Replace(m, "a=recvonly", "a=sendrecv"), "",
         "video mid=v sendrecv accepted pt=96 rtx=-1 plid=42e01f nack delay=-1 midx=-1|"
         "audio mid=a recvonly pt=-1 rtx=-1 plid= delay=-1 midx=-1"},
        {"a second video is refused",
         Replace(m, "m=audio 9 UDP/TLS/RTP/SAVPF 0\r\na=mid:a",
                 "m=video 9 UDP/TLS/RTP/SAVPF 96\r\na=mid:a\r\na=rtpmap:96 H264/90000\r\n"
                 "a=fmtp:96 packetization-mode=1"),
         "",
         "video mid=v recvonly accepted pt=96 rtx=-1 plid=42e01f nack delay=-1 midx=-1|"
         "video mid=a recvonly pt=96 rtx=-1 plid=420010 delay=-1 midx=-1"},
        {"extmap ids beyond the one-byte form are ignored",
         Replace(m, "a=mid:v\r\n",
                 "a=mid:v\r\na=extmap:15 urn:ietf:params:rtp-hdrext:sdes:mid\r\n"
                 "a=extmap:16 http://www.webrtc.org/experiments/rtp-hdrext/playout-delay\r\n"),
         "",
         "video mid=v recvonly accepted pt=96 rtx=-1 plid=42e01f nack delay=-1 midx=-1|"
         "audio mid=a recvonly pt=-1 rtx=-1 plid= delay=-1 midx=-1"},
        {"32 media sections", WithDataChannels(30), "",
         "video mid=v recvonly accepted pt=96 rtx=-1 plid=42e01f nack delay=-1 midx=-1|"
         "audio mid=a recvonly pt=-1 rtx=-1 plid= delay=-1 midx=-1" +
             Repeat("|application mid= sendrecv pt=-1 rtx=-1 plid= delay=-1 midx=-1", 30)},
        {"33 media sections", WithDataChannels(31), "The offer has more than 32 media sections."},
        {"not SDP", "GET / HTTP/1.1\r\n\r\n", "The offer is not SDP."},
        {"empty", "", "The offer is not SDP."},
        {"over 64 KiB", m + std::string(65536, 'x'), "The offer is larger than 64 KiB."},
        {"a NUL inside", Replace(m, "a=mid:v", std::string("a=mid:v\0", 8)),
         "The offer holds control characters."},
        {"a lone CR inside a line", Replace(m, "a=mid:v", "a=mid:v\rm=x"), "The offer is not SDP."},
        {"no ice-pwd", Replace(m, "a=ice-pwd:p\r\n", ""),
         "The offer has no ice-ufrag and ice-pwd."},
        {"only a sha-1 fingerprint", Replace(m, "sha-256", "sha-1"),
         "The offer has no sha-256 fingerprint."},
        {"fingerprint of 31 bytes", Replace(m, ":EE:FF\r\n", ":EE\r\n"),
         "The offer has no sha-256 fingerprint."},
        {"fingerprint not hex", Replace(m, "00:11", "0G:11"),
         "The offer has no sha-256 fingerprint."},
        {"passive DTLS role", Replace(m, "a=setup:actpass", "a=setup:passive"),
         "The offer's DTLS role is passive, as ours."},
        {"H.264 in mode 0 only", Replace(m, "packetization-mode=1", "packetization-mode=0"),
         "The offer has no video in H.264 with packetization-mode=1."},
        {"profile-level-id not 6 hex digits", Replace(m, "42e01f", "42e01"),
         "The offer has no video in H.264 with packetization-mode=1."},
        {"VP8 only", Replace(m, "H264/90000", "VP8/90000"),
         "The offer has no video in H.264 with packetization-mode=1."},
        {"video refused by the offerer (port 0)", Replace(m, "m=video 9", "m=video 0"),
         "The offer has no video in H.264 with packetization-mode=1."},
        {"video without a mid", Replace(m, "a=mid:v\r\n", ""),
         "The offer's H.264 video has no usable a=mid."},
        {"RTCP on its own port", Replace(m, "a=rtcp-mux\r\n", ""),
         "The offer does not multiplex RTCP with RTP (a=rtcp-mux)."},
        {"video that only sends", Replace(m, "a=recvonly", "a=sendonly"),
         "The offer's H.264 video does not receive (neither recvonly nor sendrecv)."},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        WebRtcOffer offer;
        std::string why;
        const bool ok = webrtc::ReadWebRtcOffer(c.sdp, 0x42, 0xe0, &offer, &why);
        EXPECT_EQ(why, c.why);
        EXPECT_EQ(ok, *c.why == '\0');
        if (!ok) continue;
        std::string described;
        for (const WebRtcOffer::Media& media : offer.media) {
            described += (described.empty() ? "" : "|") + Describe(media);
        }
        EXPECT_EQ(described, c.media);
    }
}

TEST(WebRtcSdpTest, AnswerGroupsOnlyWhenTheOfferDid) {
    WebRtcOffer offer;
    std::string why;
    ASSERT_TRUE(webrtc::ReadWebRtcOffer(Replace(kMinimal, "a=group:BUNDLE v a\r\n", ""), 0x42, 0xe0,
                                        &offer, &why))
        << why;
    EXPECT_FALSE(offer.bundle);
    const std::string answer = webrtc::WriteWebRtcAnswer(offer, Params());
    EXPECT_EQ(answer.substr(0, answer.find("m=")),
              "v=0\r\no=- 1234567890123 1 IN IP4 0.0.0.0\r\ns=-\r\nt=0 0\r\na=ice-lite\r\n");
}

}  // namespace
