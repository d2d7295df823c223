// Datagrams from a peer to a fresh DTLS-SRTP session, as the UDP thread hands them over: the
// input is a run of (2-byte big-endian length, bytes) pairs, each fed as one datagram, with
// the retransmission timer asked between them. Nothing connects without the server's random,
// so this reaches the record layer, the ClientHello and what follows a hello.
#include <stdlib.h>

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <string>

#include "webrtc/DtlsSrtp.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    static webrtc::DtlsCertificate* cert = [] {
        char dir[] = "/tmp/orvex-fuzz-dtls-XXXXXX";
        if (!mkdtemp(dir)) abort();
        std::string why;
        auto made = webrtc::DtlsCertificate::LoadOrCreate(std::string(dir) + "/cert.pem", &why);
        std::filesystem::remove_all(dir);
        if (!made) abort();
        return made.release();
    }();
    webrtc::DtlsSrtpSession session(*cert, std::vector<uint8_t>(32, 0xab));
    size_t sent = 0;
    const auto send = [&](const uint8_t*, size_t n) {
        if (n == 0 || n > webrtc::kDtlsMtu) abort();
        ++sent;
    };
    while (size >= 2) {
        size_t n = (size_t{data[0]} << 8) | data[1];
        data += 2;
        size -= 2;
        if (n > size) n = size;
        session.Feed(data, n, send);
        if (session.NextTimeoutMs() == 0) session.OnTimeout(send);
        data += n;
        size -= n;
    }
    if (session.state() == webrtc::DtlsSrtpSession::State::kConnected) abort();
    uint8_t rtcp[64] = {0x80, 0xc9, 0x00, 0x01};
    size_t len = 8;
    if (session.UnprotectRtcp(rtcp, &len)) abort();
    return 0;
}
