#include "net/Socket.h"

#include <arpa/inet.h>
#include <gtest/gtest.h>

#include <thread>

#include "net/Tcp.h"
#include "rtsp/Rtsp.h"
#include "tests/rtsp/SocketPair.h"

namespace {

class SocketTest : public ::testing::Test {
protected:
    SocketTest() { Socket::SetReadinessWaitMs(100); }
    ~SocketTest() override { Socket::SetReadinessWaitMs(10000); }
};

TEST_F(SocketTest, QuietPeerTimesOutWithZeroAndClosedPeerReadsMinusOne) {
    RtspWire wire;
    unsigned char c;
    EXPECT_EQ(wire.server->Read(&c, 1, 1), 0);  // the timeout argument is ignored
    wire.CloseClient();
    EXPECT_EQ(wire.server->Read(&c, 1, 2000000), -1);
    EXPECT_EQ(wire.server->Read(nullptr, 1, 0), -1);
}

TEST_F(SocketTest, OpenBindsWildcardForUnusableHosts) {
    for (const char* host : {"0.0.0.0", "", "239.1.1.1", "not-an-address"}) {
        Tcp tcp;
        ASSERT_TRUE(tcp.Open(host, 0)) << host;
        sockaddr_in bound = tcp.GetBindAddr();
        EXPECT_EQ(bound.sin_addr.s_addr, htonl(INADDR_ANY)) << host;
        EXPECT_TRUE(tcp.opened());
    }
    Tcp loop;
    ASSERT_TRUE(loop.Open("127.0.0.1", 0));
    EXPECT_EQ(loop.GetBindAddr().sin_addr.s_addr, inet_addr("127.0.0.1"));
}

TEST_F(SocketTest, CloseLeavesDescriptorZeroAndIsIdempotent) {
    Tcp never;
    EXPECT_EQ(never.descriptor(), -1);
    never.Close();
    EXPECT_EQ(never.descriptor(), 0);
    Tcp tcp;
    ASSERT_TRUE(tcp.Open("127.0.0.1", 0));
    tcp.Close();
    EXPECT_EQ(tcp.descriptor(), 0);
    EXPECT_FALSE(tcp.opened());
    tcp.Close();
    EXPECT_EQ(tcp.descriptor(), 0);
}

TEST_F(SocketTest, ReadLineKeepsMaxlenPlusOneAndWaitsThroughQuietPeriods) {
    RtspWire wire;
    std::thread late([&] {
        std::this_thread::sleep_for(std::chrono::milliseconds(250));  // > two waits
        wire.Send("ABCDEFG\nxy\r");
    });
    std::string line;
    EXPECT_EQ(wire.server->ReadLine(&line, 3, 0), 4);
    EXPECT_EQ(line, "ABCD");
    late.join();
    EXPECT_EQ(wire.server->ReadLine(&line, 3, 0), 2);
    EXPECT_EQ(line, "xy");
    EXPECT_EQ(wire.server->ReadLine(nullptr, 3, 0), -1);
}

// Line framing of requests: (bytes sent, lines read until the peer closes).
TEST_F(SocketTest, RtspReadSplitsLinesAndDropsTheByteAfterCr) {
    struct Case {
        const char* name;
        std::string bytes;
        std::vector<std::string> lines;
    };
    const Case cases[] = {
        {"crlf", "OPTIONS x RTSP/1.0\r\nCSeq: 1\r\n\r\n", {"OPTIONS x RTSP/1.0", "CSeq: 1", ""}},
        {"lf only", "A\nB\n\n", {"A", "B", ""}},
        {"lone cr eats next", "AB\rCD\n", {"AB", "D"}},
        {"cr at end", "AB\r", {"AB"}},
    };
    for (const Case& c : cases) {
        RtspWire wire;
        wire.Send(c.bytes);
        wire.CloseClient();
        std::vector<std::string> got;
        std::string line;
        for (int n; (n = wire.server->Read(line)) >= 0;) got.push_back(line);
        EXPECT_EQ(got, c.lines) << c.name;
    }
}

TEST_F(SocketTest, ParseMrlTable) {
    struct Case {
        std::string mrl;
        bool ok;
        std::string host, path;
        int port;
    };
    const Case cases[] = {
        {"rtsp://192.168.1.20:8554/skyvo?width=1280", true, "192.168.1.20", "skyvo?width=1280",
         8554},
        {"rtsp://10.0.0.1/skyvo", true, "10.0.0.1", "skyvo", 554},
        {"rtsp://10.0.0.1", true, "10.0.0.1", "", 554},
        {"rtsp://h:8554", true, "h:8554", "", 554},  // no '/' after the ':'
        {"rtsp://h/a:99/b", true, "h", "a/b", 99},   // ':' in the path delimits a port
        {"rtsp://h:abc/x", true, "h", "x", 0},       // atoi of a non-number
        {"x rtsp://h/p", true, "h", "p", 554},       // found anywhere
        {"RTSP://h/p", false, "", "", 0},
        {"http://h/p", false, "", "", 0},
        {"rtsp:/", false, "", "", 0},
    };
    RtspWire wire;
    for (const Case& c : cases) {
        std::string host = "untouched", path = "untouched";
        int port = -7;
        ASSERT_EQ(wire.server->ParseMrl(c.mrl, &host, &path, &port), c.ok) << c.mrl;
        if (!c.ok) {
            EXPECT_EQ(host, "untouched");
            continue;
        }
        EXPECT_EQ(host, c.host) << c.mrl;
        EXPECT_EQ(path, c.path) << c.mrl;
        EXPECT_EQ(port, c.port) << c.mrl;
    }
    EXPECT_TRUE(wire.server->ParseMrl("rtsp://h/p", nullptr, nullptr, nullptr));
}

}  // namespace
