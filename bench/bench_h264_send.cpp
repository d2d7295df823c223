// Video delivery: packetising and sending 10 s of a 4 Mbit/s, 30 fps stream to 1 and to 5
// loopback destinations (ClientFanout: sendmmsg, and segmentation offload for one), next to a
// bare sendto loop of the very same packets; and the time from newwrite of an item to its
// first packet at a client (the send thread polls every 2 ms).
#include <arpa/inet.h>
#include <benchmark/benchmark.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <thread>
#include <vector>

#include "config/GlobalConfig.h"
#include "rtp/ClientFanout.h"
#include "rtp/RtpPackets.h"
#include "rtp/SendH264Rtp.h"

namespace {

using Bytes = std::vector<unsigned char>;

// 300 frames: a 60 KB key frame every 30, the rest sized to make 4 Mbit/s on average.
std::vector<Bytes> TenSecondsOfVideo() {
    std::vector<Bytes> items;
    const unsigned key = 60000, other = (4000000 / 8 * 10 - 10 * key) / 290;
    for (int i = 0; i < 300; ++i) {
        Bytes b(4 + (i % 30 == 0 ? key : other), 0x5A);
        b[3] = 1;
        b[4] = i % 30 == 0 ? 0x65 : 0x41;
        items.push_back(std::move(b));
    }
    return items;
}

struct Clients {
    explicit Clients(int count) {
        for (int i = 0; i < count; ++i) {
            int fd = socket(AF_INET, SOCK_DGRAM, 0);
            sockaddr_in a{};
            a.sin_family = AF_INET;
            a.sin_addr.s_addr = inet_addr("127.0.0.1");
            bind(fd, reinterpret_cast<sockaddr*>(&a), sizeof a);
            timeval limit{1, 0};  // a lost packet must not hang the benchmark
            setsockopt(fd, SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof limit);
            socklen_t len = sizeof a;
            getsockname(fd, reinterpret_cast<sockaddr*>(&a), &len);
            fds.push_back(fd);
            targets.push_back(a);
        }
        sender = socket(AF_INET, SOCK_DGRAM, 0);
    }
    ~Clients() {
        for (int fd : fds) close(fd);
        close(sender);
    }
    std::vector<int> fds;
    std::vector<sockaddr_in> targets;
    int sender;
};

struct Counter : PacketSink {
    void Send(const unsigned char* p, unsigned n) override { packets.emplace_back(p, p + n); }
    std::vector<Bytes> packets;
};

void BM_PacketiseAndSend(benchmark::State& state) {
    Clients c(static_cast<int>(state.range(0)));
    auto items = TenSecondsOfVideo();
    ClientFanout fanout(c.sender, true, "\n  h264 frame send error ! \n ");
    fanout.SetTargets(c.targets);
    int64_t packets = 0;
    for (auto _ : state) {
        uint16_t seq = 0;
        for (const Bytes& item : items) {
            PacketiseH264Item(item.data(), static_cast<unsigned>(item.size()), 0, 96, &seq, fanout);
            fanout.Flush();
        }
        packets += seq;
    }
    state.counters["packets"] = benchmark::Counter(static_cast<double>(packets));
    state.counters["cpu_per_packet_us"] = benchmark::Counter(
        static_cast<double>(packets), benchmark::Counter::kIsRate | benchmark::Counter::kInvert);
}

// Packet building alone, into a sink that only looks at each packet.
struct Discard : PacketSink {
    void Send(const unsigned char* p, unsigned n) override { last = p[n - 1]; }
    unsigned char last = 0;
};

void BM_PacketiseOnly(benchmark::State& state) {
    auto items = TenSecondsOfVideo();
    Discard sink;
    int64_t packets = 0;
    for (auto _ : state) {
        uint16_t seq = 0;
        for (const Bytes& item : items) {
            PacketiseH264Item(item.data(), static_cast<unsigned>(item.size()), 0, 96, &seq, sink);
        }
        benchmark::DoNotOptimize(sink.last);
        packets += seq;
    }
    state.counters["time_per_packet"] = benchmark::Counter(
        static_cast<double>(packets), benchmark::Counter::kIsRate | benchmark::Counter::kInvert);
}

void BM_BareSendto(benchmark::State& state) {
    Clients c(static_cast<int>(state.range(0)));
    auto items = TenSecondsOfVideo();
    Counter built;
    uint16_t seq = 0;
    for (const Bytes& item : items) {
        PacketiseH264Item(item.data(), static_cast<unsigned>(item.size()), 0, 96, &seq, built);
    }
    int64_t packets = 0;
    for (auto _ : state) {
        for (const Bytes& p : built.packets) {
            for (const sockaddr_in& to : c.targets) {
                sendto(c.sender, p.data(), p.size(), 0, reinterpret_cast<const sockaddr*>(&to),
                       sizeof to);
            }
        }
        packets += static_cast<int64_t>(built.packets.size());
    }
    state.counters["packets"] = benchmark::Counter(static_cast<double>(packets));
    state.counters["cpu_per_packet_us"] = benchmark::Counter(
        static_cast<double>(packets), benchmark::Counter::kIsRate | benchmark::Counter::kInvert);
}

void BM_NewwriteToFirstPacket(benchmark::State& state) {
    Global_Config* config = Global_Config::instance();
    config->m_video_rtp_frequency = 90000;
    config->set_timestamp(0x80000000u, false);  // half the clock away: never ahead of audio
    cycle_buffer ring(8000000);
    H264RtpTransportSession* session = H264RtpTransportSession::instance();
    session->SetInputRing(&ring);
    Clients c(1);
    session->add_dest_socket_info(&c, ntohs(c.targets[0].sin_port), "127.0.0.1");
    session->StartSendThread();
    Bytes item(4 + 1000, 0x5A);
    item[3] = 1;
    item[4] = 0x41;
    unsigned char buf[2048];
    std::vector<double> us;
    for (auto _ : state) {
        // Items come at random phases of the 2 ms poll, as frames do.
        state.PauseTiming();
        std::this_thread::sleep_for(std::chrono::microseconds(500 + rand() % 2000));
        state.ResumeTiming();
        auto t0 = std::chrono::steady_clock::now();
        ring.newwrite(item.data(), static_cast<int>(item.size()), 0, false);
        recv(c.fds[0], buf, sizeof buf, 0);
        us.push_back(
            std::chrono::duration<double, std::micro>(std::chrono::steady_clock::now() - t0)
                .count());
    }
    session->CloseSendThread();
    H264RtpTransportSession::CloseInstance();
    Global_Config::CloseInstance();
    std::sort(us.begin(), us.end());
    state.counters["p50_us"] = us[us.size() / 2];
    state.counters["p99_us"] = us[us.size() * 99 / 100];
}

BENCHMARK(BM_PacketiseAndSend)->Arg(1)->Arg(5)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_PacketiseOnly)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_BareSendto)->Arg(1)->Arg(5)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_NewwriteToFirstPacket)->Iterations(500)->Unit(benchmark::kMicrosecond);

}  // namespace

BENCHMARK_MAIN();
