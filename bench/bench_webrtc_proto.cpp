// The per-datagram readers of WebRTC playback: a browser's consent check (read, integrity
// checked, answered) and its RTCP feedback (a receiver report with a NACK, as a lossy viewer
// sends every few tens of milliseconds). Datagrams per second on one core.
#include <benchmark/benchmark.h>
#include <netinet/in.h>

#include <cstdint>
#include <vector>

#include "webrtc/Rtcp.h"
#include "webrtc/Stun.h"

namespace {

// Chromium 156's nominating check for ufrag "orvx", password kPassword.
const std::vector<uint8_t> kCheck = {
    0x00, 0x01, 0x00, 0x50, 0x21, 0x12, 0xa4, 0x42, 0x42, 0x53, 0x49, 0x59, 0x47, 0x34, 0x6c,
    0x6d, 0x45, 0x4b, 0x46, 0x72, 0x00, 0x06, 0x00, 0x09, 0x6f, 0x72, 0x76, 0x78, 0x3a, 0x4a,
    0x6e, 0x72, 0x54, 0x00, 0x00, 0x00, 0xc0, 0x57, 0x00, 0x04, 0x00, 0x00, 0x03, 0xe7, 0x80,
    0x2a, 0x00, 0x08, 0x18, 0x11, 0xcc, 0xa5, 0xfd, 0xc5, 0x89, 0xf3, 0x00, 0x25, 0x00, 0x00,
    0x00, 0x24, 0x00, 0x04, 0x6e, 0x00, 0x1e, 0xff, 0x00, 0x08, 0x00, 0x14, 0x0c, 0x84, 0xfa,
    0x68, 0x27, 0x05, 0xaa, 0x16, 0x6d, 0x8d, 0xff, 0x10, 0xc1, 0xba, 0x83, 0xd6, 0x81, 0xc2,
    0x14, 0xd2, 0x80, 0x28, 0x00, 0x04, 0x22, 0x10, 0x8a, 0x57};
const char kPassword[] = "0123456789abcdefghijklmn";

// A receiver report block and a generic NACK of three packets.
const std::vector<uint8_t> kFeedback = {
    0x81, 0xc9, 0x00, 0x07, 0x00, 0x00, 0x00, 0x01, 0x11, 0x22, 0x33, 0x44, 0x10, 0x00, 0x00, 0x05,
    0x00, 0x01, 0x02, 0x03, 0x00, 0x00, 0x00, 0x20, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00,
    0x81, 0xcd, 0x00, 0x03, 0x00, 0x00, 0x00, 0x01, 0x11, 0x22, 0x33, 0x44, 0x00, 0x64, 0x00, 0x05};

void BM_ReadStunBindingRequest(benchmark::State& state) {
    webrtc::StunBindingRequest req;
    for (auto _ : state) {
        benchmark::DoNotOptimize(
            webrtc::ReadStunBindingRequest(kCheck.data(), kCheck.size(), &req));
    }
    state.SetItemsProcessed(state.iterations());
}
BENCHMARK(BM_ReadStunBindingRequest);

// What the server does per check: read, verify MESSAGE-INTEGRITY, answer.
void BM_AnswerStunCheck(benchmark::State& state) {
    webrtc::StunBindingRequest req;
    sockaddr_in from = {};
    from.sin_family = AF_INET;
    from.sin_port = htons(45065);
    from.sin_addr.s_addr = htonl(0x7f000001);
    uint8_t out[128];
    for (auto _ : state) {
        webrtc::ReadStunBindingRequest(kCheck.data(), kCheck.size(), &req);
        benchmark::DoNotOptimize(
            webrtc::CheckStunIntegrity(kCheck.data(), kCheck.size(), kPassword));
        benchmark::DoNotOptimize(webrtc::WriteStunBindingSuccess(
            req, reinterpret_cast<const sockaddr*>(&from), kPassword, out, sizeof out));
    }
    state.SetItemsProcessed(state.iterations());
}
BENCHMARK(BM_AnswerStunCheck);

void BM_ReadRtcp(benchmark::State& state) {
    webrtc::RtcpFeedback f;
    for (auto _ : state) {
        benchmark::DoNotOptimize(webrtc::ReadRtcp(kFeedback.data(), kFeedback.size(), &f));
    }
    state.SetItemsProcessed(state.iterations());
}
BENCHMARK(BM_ReadRtcp);

}  // namespace

BENCHMARK_MAIN();
