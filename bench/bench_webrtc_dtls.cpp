// The two costs of a WebRTC viewer in webrtc/DtlsSrtp: its DTLS handshake on the server side
// (the client's part, OpenSSL playing the browser, is not counted), and SRTP protection of one
// 1200-byte RTP packet (the largest the WebRTC sender makes) per negotiated profile, packets per
// second on one core. The copy of the clear packet into place is part of each iteration, as the
// sender writes one.
#include <benchmark/benchmark.h>
#include <stdlib.h>

#include <cstring>
#include <filesystem>
#include <memory>
#include <string>

#include "tests/webrtc/DtlsTestClient.h"
#include "webrtc/DtlsSrtp.h"

namespace {

std::unique_ptr<webrtc::DtlsCertificate> Certificate(std::string* why) {
    char dir[] = "/tmp/orvex-bench-XXXXXX";
    if (!mkdtemp(dir)) return nullptr;
    auto cert = webrtc::DtlsCertificate::LoadOrCreate(std::string(dir) + "/cert.pem", why);
    std::filesystem::remove_all(dir);
    return cert;
}

// Flights back and forth; with `state`, only the session's part is timed.
void Handshake(webrtc::DtlsSrtpSession& session, webrtc::test::DtlsTestClient& client,
               benchmark::State* state) {
    webrtc::test::Datagrams to_server = client.Step({});
    while (!to_server.empty()) {
        webrtc::test::Datagrams to_client;
        const auto send = [&](const uint8_t* p, size_t n) { to_client.emplace_back(p, p + n); };
        if (state) state->ResumeTiming();
        for (const auto& d : to_server) session.Feed(d.data(), d.size(), send);
        if (state) state->PauseTiming();
        to_server = client.Step(to_client);
    }
}

void BM_ServerHandshake(benchmark::State& state) {
    std::string why;
    auto cert = Certificate(&why);
    if (!cert) return state.SkipWithError(why.c_str());
    for (auto _ : state) {
        state.PauseTiming();
        webrtc::test::DtlsTestClient client("SRTP_AEAD_AES_128_GCM:SRTP_AES128_CM_SHA1_80");
        state.ResumeTiming();
        webrtc::DtlsSrtpSession session(*cert, client.Fingerprint());
        state.PauseTiming();
        Handshake(session, client, &state);
        if (session.state() != webrtc::DtlsSrtpSession::State::kConnected) {
            return state.SkipWithError(session.why().c_str());
        }
        state.ResumeTiming();
    }
}
BENCHMARK(BM_ServerHandshake)->Unit(benchmark::kMicrosecond);

void BM_ProtectRtp(benchmark::State& state, const char* profile) {
    std::string why;
    auto cert = Certificate(&why);
    if (!cert) return state.SkipWithError(why.c_str());
    webrtc::test::DtlsTestClient client(profile);
    webrtc::DtlsSrtpSession session(*cert, client.Fingerprint());
    Handshake(session, client, nullptr);
    if (session.state() != webrtc::DtlsSrtpSession::State::kConnected) {
        return state.SkipWithError(session.why().c_str());
    }
    uint8_t clear[1200] = {0x80, 0x60, 0x00, 0x00, 0x00, 0x01, 0x5f, 0x90, 0x12, 0x34, 0x56, 0x78};
    for (size_t i = 12; i < sizeof(clear); ++i) clear[i] = static_cast<uint8_t>(i);
    uint8_t wire[sizeof(clear) + webrtc::kSrtpMaxTrailer];
    uint16_t seq = 0;
    for (auto _ : state) {
        ++seq;
        clear[2] = static_cast<uint8_t>(seq >> 8);
        clear[3] = static_cast<uint8_t>(seq);
        memcpy(wire, clear, sizeof(clear));
        size_t len = sizeof(clear);
        if (!session.ProtectRtp(wire, &len, sizeof(wire))) return state.SkipWithError("refused");
        benchmark::DoNotOptimize(wire);
    }
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations()) * sizeof(clear));
    state.SetItemsProcessed(state.iterations());
}
BENCHMARK_CAPTURE(BM_ProtectRtp, aes_128_gcm, "SRTP_AEAD_AES_128_GCM");
BENCHMARK_CAPTURE(BM_ProtectRtp, aes_128_cm_sha1_80, "SRTP_AES128_CM_SHA1_80");

}  // namespace

BENCHMARK_MAIN();
