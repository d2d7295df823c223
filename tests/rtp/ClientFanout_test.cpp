#include "rtp/ClientFanout.h"

#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <vector>

#include "tests/rtp/UdpReceiver.h"

namespace {

using Bytes = std::vector<unsigned char>;

TEST(PlanSegmentRunsTest, EqualSizesThenOneShorterMakeARun) {
    struct Case {
        const char* proves;
        std::vector<unsigned> lengths;
        unsigned max;
        std::vector<unsigned> runs;  // first, count, size for each run
    };
    const Case cases[] = {
        {"one packet is a run of one", {1412}, 32, {0, 1, 1412}},
        {"FU-A pieces and their short end", {1414, 1414, 1213}, 32, {0, 3, 1414}},
        {"an end of no payload still rides along", {1414, 14}, 32, {0, 2, 1414}},
        {"a longer packet starts a new run", {100, 1414, 1414}, 32, {0, 1, 100, 1, 2, 1414}},
        {"only one shorter packet per run", {1414, 500, 400}, 32, {0, 2, 1414, 2, 1, 400}},
        {"the segment limit cuts a run",
         {1414, 1414, 1414, 1414, 20},
         2,
         {0, 2, 1414, 2, 2, 1414, 4, 1, 20}},
        {"a limit of 0 sends each alone", {10, 10}, 0, {0, 1, 10, 1, 1, 10}},
    };
    for (const Case& c : cases) {
        SegmentRun runs[8];
        unsigned n =
            PlanSegmentRuns(c.lengths.data(), static_cast<unsigned>(c.lengths.size()), c.max, runs);
        std::vector<unsigned> got;
        for (unsigned i = 0; i < n; ++i)
            got.insert(got.end(), {runs[i].first, runs[i].count, runs[i].size});
        EXPECT_EQ(got, c.runs) << c.proves;
    }
}

sockaddr_in Loopback(int port, const char* ip = "127.0.0.1") {
    sockaddr_in a{};
    a.sin_family = AF_INET;
    a.sin_port = htons(static_cast<uint16_t>(port));
    a.sin_addr.s_addr = inet_addr(ip);
    return a;
}

// Packet i is `lengths[i]` bytes of i + 1 after a two-byte index, so a reordered, merged or
// cut datagram shows.
std::vector<Bytes> Packets(const std::vector<unsigned>& lengths) {
    std::vector<Bytes> out;
    for (size_t i = 0; i < lengths.size(); ++i) {
        Bytes p(lengths[i], static_cast<unsigned char>(i + 1));
        p[0] = static_cast<unsigned char>(i >> 8);
        p[1] = static_cast<unsigned char>(i);
        out.push_back(p);
    }
    return out;
}

// Each destination receives exactly the packets queued, in order, one datagram each, whether
// they went as segmented runs (one destination) or as messages in turn (several).
TEST(ClientFanoutTest, EveryDestinationGetsEachPacketWholeAndInOrder) {
    struct Case {
        const char* proves;
        std::vector<unsigned> lengths;
        int destinations;
    };
    const Case cases[] = {
        {"a frame of FU-A pieces to one client", {1414, 1414, 1414, 1213}, 1},
        {"the same to five", {1414, 1414, 1414, 1213}, 5},
        {"more packets than one batch holds", std::vector<unsigned>(70, 1414), 1},
        {"more messages than one call takes", std::vector<unsigned>(30, 1414), 3},
        {"sizes that cannot share a run", {14, 1412, 20, 1414, 1414, 1414, 1413}, 1},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.proves);
        std::vector<UdpReceiver> clients(static_cast<size_t>(c.destinations));
        std::vector<sockaddr_in> targets;
        for (UdpReceiver& r : clients) targets.push_back(Loopback(r.port()));
        int fd = socket(AF_INET, SOCK_DGRAM, 0);
        int big = 4 << 20;  // every packet queued at the receivers before they read
        for (UdpReceiver& r : clients) {
            setsockopt(r.fd(), SOL_SOCKET, SO_RCVBUF, &big, sizeof big);
        }
        ClientFanout fanout(fd, true, "fanout test: send error");
        fanout.SetTargets(targets);
        const bool segmenting = fanout.segmenting();
        const std::vector<Bytes> packets = Packets(c.lengths);
        for (const Bytes& p : packets) fanout.Send(p.data(), static_cast<unsigned>(p.size()));
        fanout.Flush();
        // Loopback takes segmented sends wherever the kernel has them: no silent fallback.
        EXPECT_EQ(fanout.segmenting(), segmenting);
        for (size_t d = 0; d < clients.size(); ++d) {
            for (size_t i = 0; i < packets.size(); ++i) {
                ASSERT_EQ(clients[d].Receive(), packets[i])
                    << "destination " << d << " packet " << i;
            }
            EXPECT_TRUE(clients[d].Receive(20).empty()) << "destination " << d;
        }
        close(fd);
    }
}

// 255.255.255.255 without SO_BROADCAST fails every send (EACCES), segmented or not.
TEST(ClientFanoutTest, AFailingDestinationCostsVideoThePacketAndAudioNothing) {
    struct Case {
        const char* proves;
        bool stop_at_first_failure;
        std::vector<const char*> ips;  // "ok" is the receiver
        size_t packets_at_receiver;
        size_t error_lines;
    };
    const Case cases[] = {
        {"video: a failure first keeps the packet from the rest", true, {"bad", "ok"}, 0, 3},
        {"video: a failure after the receiver costs it nothing", true, {"ok", "bad"}, 3, 3},
        {"audio goes on past a failure", false, {"bad", "ok"}, 3, 3},
        {"a segmented run that fails goes again one by one", true, {"bad"}, 0, 3},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.proves);
        UdpReceiver ok;
        std::vector<sockaddr_in> targets;
        for (const char* ip : c.ips) {
            targets.push_back(std::string(ip) == "ok" ? Loopback(ok.port())
                                                      : Loopback(9, "255.255.255.255"));
        }
        int fd = socket(AF_INET, SOCK_DGRAM, 0);
        ClientFanout fanout(fd, c.stop_at_first_failure, "<send error>");
        fanout.SetTargets(targets);
        ::testing::internal::CaptureStdout();
        for (const Bytes& p : Packets({1414, 1414, 200})) {
            fanout.Send(p.data(), static_cast<unsigned>(p.size()));
        }
        fanout.Flush();
        std::string out = ::testing::internal::GetCapturedStdout();
        size_t lines = 0;
        for (size_t at = out.find("<send error>"); at != std::string::npos;
             at = out.find("<send error>", at + 1)) {
            ++lines;
        }
        EXPECT_EQ(lines, c.error_lines);
        size_t got = 0;
        while (!ok.Receive(20).empty()) ++got;
        EXPECT_EQ(got, c.packets_at_receiver);
        close(fd);
    }
}

}  // namespace
