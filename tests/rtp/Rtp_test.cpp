#include "rtp/Rtp.h"

#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <vector>

namespace {

using Bytes = std::vector<unsigned char>;

Bytes Packet(const Rtp& rtp) {
    const Buffer& b = rtp.packet();
    return Bytes(b.GetStart(), b.GetStart() + b.GetLength());
}

int BoundPort(const Socket& s) {
    sockaddr_in a{};
    socklen_t len = sizeof a;
    getsockname(s.descriptor(), reinterpret_cast<sockaddr*>(&a), &len);
    return ntohs(a.sin_port);
}

TEST(RtpTest, HeaderBytesForMarkerAndPayloadType) {
    struct Case {
        int marker;
        unsigned char pt;
        unsigned char byte1;
    };
    const Case cases[] = {{1, 96, 0xE0}, {0, 96, 0x60},  {0, 98, 0x62},
                          {5, 0, 0x80},  {0, 200, 0xC8}, {1, 200, 0xC8}};
    for (const Case& c : cases) {
        Rtp rtp(1500);
        unsigned char payload[3] = {1, 2, 3};
        ASSERT_TRUE(rtp.CreateRtpPacket(payload, 3, c.pt, 0x01020304, 10, c.marker));
        EXPECT_EQ(Packet(rtp), (Bytes{0x80, c.byte1, 0, 0, 1, 2, 3, 4, 0, 0, 0, 10, 1, 2, 3}))
            << int(c.pt) << " " << c.marker;
    }
}

TEST(RtpTest, SequenceCountsFromZeroAndWraps) {
    Rtp rtp(1500);
    unsigned char p = 0;
    std::vector<int> seen;
    for (int i = 0; i < 2; ++i) {
        rtp.CreateRtpPacket(&p, 1, 96, 0, 0, 0);
        seen.push_back((Packet(rtp)[2] << 8) | Packet(rtp)[3]);
    }
    rtp.set_sequence(65535);
    for (int i = 0; i < 2; ++i) {
        rtp.CreateRtpPacket(&p, 1, 96, 0, 0, 0);
        seen.push_back((Packet(rtp)[2] << 8) | Packet(rtp)[3]);
    }
    EXPECT_EQ(seen, (std::vector<int>{0, 1, 65535, 0}));
}

class UdpPairTest : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_TRUE(receiver.Open("127.0.0.1", 0));
        ASSERT_TRUE(sender.Open("127.0.0.1", 0));
        ASSERT_TRUE(sender.Connect("127.0.0.1", BoundPort(receiver)));
    }
    void SendRaw(const Bytes& b) {
        ASSERT_EQ(sender.Socket::Write(const_cast<unsigned char*>(b.data()),
                                       static_cast<int>(b.size()), 0),
                  static_cast<int>(b.size()));
    }
    Rtp receiver{1500};
    Rtp sender{1500};
};

TEST_F(UdpPairTest, WriteThenReadRoundTrips) {
    unsigned char payload[4] = {9, 8, 7, 6};
    EXPECT_EQ(sender.Write(payload, 4, 96, 90000, 10, 1, 0), 4);
    unsigned char got[16] = {};
    signed char pt = 0;
    unsigned short seq = 1;
    int ts = 0;
    unsigned ssrc = 0;
    EXPECT_EQ(receiver.Read(got, sizeof got, &pt, &seq, &ts, &ssrc, 0), 4);
    EXPECT_EQ(static_cast<unsigned char>(pt), 224);  // byte 1 whole: marker and type 96
    EXPECT_EQ(seq, 0);
    EXPECT_EQ(ts, 90000);
    EXPECT_EQ(ssrc, 10u);
    EXPECT_EQ(got[3], 6);
}

TEST_F(UdpPairTest, ReadAcceptsOnlyPlainVersionTwoHeaders) {
    unsigned char got[64];
    SendRaw({0x80, 0x60, 0, 1, 0, 0, 0, 0, 0, 0, 0, 0});
    EXPECT_EQ(receiver.Read(got, sizeof got, nullptr, nullptr, nullptr, nullptr, 0), 0);
    SendRaw({0x90, 0x60, 0, 1, 0, 0, 0, 0, 0, 0, 0, 0, 1});
    EXPECT_EQ(receiver.Read(got, sizeof got, nullptr, nullptr, nullptr, nullptr, 0), -1);
    SendRaw({0x80, 0x60, 0, 1});
    EXPECT_EQ(receiver.Read(got, sizeof got, nullptr, nullptr, nullptr, nullptr, 0), -1);
    // A payload larger than the caller's buffer is cut to it.
    Bytes big(12 + 40, 0x11);
    big[0] = 0x80;
    SendRaw(big);
    EXPECT_EQ(receiver.Read(got, 8, nullptr, nullptr, nullptr, nullptr, 0), 8);
}

TEST(UdpTest, OpenTwiceKeepsTheFirstBinding) {
    Udp udp(1500);
    ASSERT_TRUE(udp.Open("127.0.0.1", 0));
    int port = BoundPort(udp);
    EXPECT_EQ(ntohs(udp.GetBindAddr().sin_port), port);  // the system's choice is learnt
    EXPECT_FALSE(udp.Open("127.0.0.1", 0));
    EXPECT_EQ(BoundPort(udp), port);
}

TEST(UdpTest, WriteNeedsAConnection) {
    Udp udp(1500);
    unsigned char b = 0;
    EXPECT_EQ(udp.Write(&b, 1, 0), -1);  // not open
    ASSERT_TRUE(udp.Open("127.0.0.1", 0));
    EXPECT_EQ(udp.Write(&b, 1, 0), -1);  // open, not connected
}

TEST(UdpTest, EmptyHostBindsWildcardAndTurnsBroadcastOn) {
    Udp udp(1500);
    ASSERT_TRUE(udp.Open("", 0));
    EXPECT_EQ(udp.GetBindAddr().sin_addr.s_addr, htonl(INADDR_ANY));
    int on = 0;
    socklen_t len = sizeof on;
    getsockopt(udp.descriptor(), SOL_SOCKET, SO_BROADCAST, &on, &len);
    EXPECT_EQ(on, 1);
    Udp plain(1500);
    ASSERT_TRUE(plain.Open("127.0.0.1", 0));
    getsockopt(plain.descriptor(), SOL_SOCKET, SO_BROADCAST, &on, &len);
    EXPECT_EQ(on, 0);
}

TEST(UdpTest, MulticastHostBindsWildcardLoopsAndJoins) {
    Udp udp(1500);
    if (!udp.Open("239.1.2.3", 0)) GTEST_SKIP() << "no multicast-capable interface here";
    EXPECT_EQ(udp.GetBindAddr().sin_addr.s_addr, htonl(INADDR_ANY));
    int loop = 0;
    socklen_t len = sizeof loop;
    getsockopt(udp.descriptor(), IPPROTO_IP, IP_MULTICAST_LOOP, &loop, &len);
    EXPECT_EQ(loop, 1);
    // Joined: a second join of the same group on the same socket is refused.
    ip_mreq group{};
    group.imr_multiaddr.s_addr = inet_addr("239.1.2.3");
    group.imr_interface.s_addr = htonl(INADDR_ANY);
    EXPECT_NE(setsockopt(udp.descriptor(), IPPROTO_IP, IP_ADD_MEMBERSHIP, &group, sizeof group), 0);
}

}  // namespace
