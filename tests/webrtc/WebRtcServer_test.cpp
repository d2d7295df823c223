// One viewer's whole way through the WebRTC endpoint over real UDP on loopback: the offer
// answered, a STUN check, the DTLS handshake as a browser makes it, then the stream's pictures
// and sound as SRTP packets, a NACK answered with the same bytes, and the session ended.
#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "platform/fake/FakePlatform.h"
#include "stream/FrameTap.h"
#include "stream/StreamFacts.h"
#include "tests/webrtc/DtlsTestClient.h"
#include "tests/webrtc/StunRequest.h"
#include "webrtc/WebRtcServer.h"

namespace webrtc {
namespace {

using test::BindingRequest;
using test::Put16;
using Bytes = std::vector<uint8_t>;

std::string ReadFile(const std::string& path) {
    std::ifstream in(path);
    std::stringstream text;
    text << in.rdbuf();
    return text.str();
}

// The value of the first "a=NAME:" line of an SDP text.
std::string Attribute(const std::string& sdp, const std::string& name) {
    const size_t at = sdp.find("a=" + name + ":");
    if (at == std::string::npos) return "";
    const size_t from = at + name.size() + 3;
    return sdp.substr(from, sdp.find("\r\n", from) - from);
}

class Viewer {
public:
    explicit Viewer(uint16_t port) {
        fd_ = socket(AF_INET, SOCK_DGRAM, 0);
        sockaddr_in to{};
        to.sin_family = AF_INET;
        to.sin_port = htons(port);
        to.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        connect(fd_, reinterpret_cast<sockaddr*>(&to), sizeof to);
    }
    ~Viewer() { close(fd_); }
    void Send(const Bytes& b) { send(fd_, b.data(), b.size(), 0); }
    // The next datagram within `ms`; empty when none came.
    Bytes Receive(int ms = 2000) {
        pollfd p{fd_, POLLIN, 0};
        if (poll(&p, 1, ms) != 1) return {};
        Bytes b(2048);
        const ssize_t n = recv(fd_, b.data(), b.size(), 0);
        b.resize(n > 0 ? static_cast<size_t>(n) : 0);
        return b;
    }

private:
    int fd_ = -1;
};

uint16_t Sequence(const Bytes& rtp) { return static_cast<uint16_t>(rtp[2] << 8 | rtp[3]); }
uint8_t PayloadType(const Bytes& rtp) { return rtp[1] & 0x7f; }
bool Marker(const Bytes& rtp) { return (rtp[1] & 0x80) != 0; }
// The payload behind the header and its extension block.
Bytes Payload(const Bytes& rtp) {
    size_t at = 12;
    if (rtp[0] & 0x10) at += 4 + 4 * static_cast<size_t>(rtp[14] << 8 | rtp[15]);
    return Bytes(rtp.begin() + static_cast<long>(at), rtp.end());
}

Bytes AnnexB(Bytes nal) {
    nal.insert(nal.begin(), {0, 0, 0, 1});
    return nal;
}

TEST(WebRtcServerTest, OneViewerFromOfferToPicturesSoundNackAndEnd) {
    platform::fake::FakePlatform fake;
    const std::string home = testing::TempDir() + "webrtc-server-test";
    WebRtcServer::Options options;
    options.port = 0;
    options.certificate_path = home + "/cert.pem";
    WebRtcServer server(nullptr, options);
    ASSERT_TRUE(server.Start());

    // A Baseline stream's parameter sets, so the offer's constrained baseline type is chosen.
    const Bytes sps = {0x67, 0x42, 0xc0, 0x1f, 0xda, 0x01, 0x40,
                       0x16, 0xe8, 0x06, 0xd0, 0xa1, 0x35};
    const Bytes pps = {0x68, 0xce, 0x06, 0xe2};
    Bytes sets = AnnexB(sps);
    const Bytes pps_unit = AnnexB(pps);
    sets.insert(sets.end(), pps_unit.begin(), pps_unit.end());
    stream::Facts().Note(sets.data(), sets.size(), stream::SteadyMs());

    test::DtlsTestClient dtls("SRTP_AEAD_AES_128_GCM:SRTP_AES128_CM_SHA1_80");
    std::string offer =
        ReadFile(std::string(ORVEX_SOURCE_DIR) + "/tests/webrtc/chromium-156-offer.sdp");
    ASSERT_FALSE(offer.empty());
    const std::string theirs = Attribute(offer, "fingerprint");
    offer.replace(offer.find(theirs), theirs.size(),
                  "sha-256 " + test::Sha256Text(SSL_get_certificate(dtls.ssl())));
    // ... the client's certificate is the one it presents
    bool ended = false;
    WhepEndpoint::Reply reply = server.Offer({offer, "", nullptr, "test", [&] { ended = true; }});
    ASSERT_EQ(reply.status, 201u) << reply.body;
    EXPECT_EQ(reply.location.compare(0, 6, "/whep/"), 0);
    const std::string ufrag = Attribute(reply.body, "ice-ufrag");
    const std::string pwd = Attribute(reply.body, "ice-pwd");
    ASSERT_FALSE(ufrag.empty());
    EXPECT_NE(reply.body.find(" " + std::to_string(server.port()) + " typ host"), std::string::npos)
        << reply.body;

    Viewer viewer(server.port());
    viewer.Send(BindingRequest(ufrag + ":browser", pwd));
    const Bytes checked = viewer.Receive();
    ASSERT_GE(checked.size(), 20u);
    EXPECT_EQ(checked[0], 0x01);  // binding success
    EXPECT_EQ(checked[1], 0x01);

    test::Datagrams to_server = dtls.Step({});
    for (int round = 0; round < 10 && !dtls.connected(); ++round) {
        for (const Bytes& d : to_server) viewer.Send(d);
        test::Datagrams from_server;
        for (Bytes d = viewer.Receive(500); !d.empty(); d = viewer.Receive(50))
            from_server.push_back(d);
        to_server = dtls.Step(from_server);
    }
    for (const Bytes& d : to_server) viewer.Send(d);
    ASSERT_TRUE(dtls.connected());
    ASSERT_TRUE(dtls.KeySrtp());

    // A key picture of one 3000-byte slice: SPS, PPS, then the slice in FU-A pieces of at most
    // 1200 bytes of RTP, the marker on the last.
    Bytes idr(3000, 0xab);
    idr[0] = 0x65;
    std::vector<Bytes> packets, sent;  // as decrypted, and as they came
    for (int attempt = 0; attempt < 50 && packets.empty(); ++attempt) {
        for (const Bytes* nal : std::initializer_list<const Bytes*>{&sps, &pps, &idr}) {
            const Bytes unit = AnnexB(*nal);
            TapVideoFrame(unit.data(), unit.size());
        }
        const Bytes next = AnnexB({0x41, 0x9a, 0x01});  // ends the picture
        TapVideoFrame(next.data(), next.size());
        for (Bytes d = viewer.Receive(100); !d.empty(); d = viewer.Receive(100)) {
            if (d[0] < 128 || (d[1] >= 192 && d[1] <= 223)) continue;  // not RTP
            sent.push_back(d);
            ASSERT_TRUE(dtls.UnprotectRtp(&d));
            packets.push_back(d);
            if (Marker(d) && PayloadType(d) != 111) break;
        }
    }
    ASSERT_GE(packets.size(), 5u);
    EXPECT_EQ(Payload(packets[0]), sps);
    EXPECT_EQ(Payload(packets[1]), pps);
    size_t carried = 0;
    for (size_t i = 2; i < packets.size(); ++i) {
        EXPECT_LE(packets[i].size(), 1200u);
        EXPECT_EQ(Sequence(packets[i]), static_cast<uint16_t>(Sequence(packets[0]) + i));
        EXPECT_EQ(Marker(packets[i]), i + 1 == packets.size());
        carried += Payload(packets[i]).size() - 2;  // FU indicator and header
    }
    EXPECT_EQ(carried, idr.size() - 1);  // the NAL header travels in the FU header

    // A NACK of the second piece: the very same bytes again (which the viewer's SRTP would
    // refuse as a replay here, where the first copy was not lost).
    // (RTCP generic NACK, RFC 4585 §6.2.1: PID and an empty bitmask.)
    const uint32_t media_ssrc = static_cast<uint32_t>(packets[2][8] << 24 | packets[2][9] << 16 |
                                                      packets[2][10] << 8 | packets[2][11]);
    Bytes nack = {0x81, 205, 0, 3, 0, 0, 0, 1, 0, 0, 0, 0, 0, 0, 0, 0};
    for (int i = 0; i < 4; ++i) nack[8 + i] = static_cast<uint8_t>(media_ssrc >> (24 - 8 * i));
    Put16(nack, 12, Sequence(packets[3]));
    ASSERT_TRUE(dtls.ProtectRtcp(&nack));
    viewer.Send(nack);
    bool resent = false;
    for (Bytes d = viewer.Receive(500); !d.empty() && !resent; d = viewer.Receive(500)) {
        resent = d == sent[3];
    }
    EXPECT_TRUE(resent);

    // 20 ms of sound: one Opus packet of the offer's Opus type, 960 samples on.
    const int opus = 111;  // the chromium offer's
    std::vector<int16_t> pcm(2 * 960 * 2, 1000);
    std::vector<Bytes> sound;
    for (int block = 0; block < 2; ++block) {
        TapAudioPcm(reinterpret_cast<const uint8_t*>(pcm.data()) + block * 3840, 3840, 0);
    }
    for (Bytes d = viewer.Receive(500); !d.empty() && sound.size() < 2; d = viewer.Receive(500)) {
        if (d[0] < 128 || (d[1] >= 192 && d[1] <= 223) || !dtls.UnprotectRtp(&d)) continue;
        if (PayloadType(d) == opus) sound.push_back(d);
    }
    ASSERT_EQ(sound.size(), 2u);
    const auto time_of = [](const Bytes& rtp) {
        return static_cast<uint32_t>(rtp[4] << 24 | rtp[5] << 16 | rtp[6] << 8 | rtp[7]);
    };
    EXPECT_EQ(time_of(sound[1]) - time_of(sound[0]), 960u);
    EXPECT_EQ(Sequence(sound[1]), static_cast<uint16_t>(Sequence(sound[0]) + 1));
    EXPECT_GT(Payload(sound[0]).size(), 2u);

    EXPECT_TRUE(server.End(reply.location.substr(6)));
    EXPECT_TRUE(ended);
    EXPECT_EQ(server.sessions(), 0);
    EXPECT_FALSE(server.End(reply.location.substr(6)));
    server.Stop();
}

}  // namespace
}  // namespace webrtc
