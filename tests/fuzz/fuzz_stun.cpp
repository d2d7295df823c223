// Arbitrary bytes as a datagram on the WebRTC port: read as a Binding request, checked with a
// password, and answered to an IPv4 and an IPv6 address; every answer must be a whole STUN
// message whose integrity checks with the same password.
#include <arpa/inet.h>
#include <netinet/in.h>

#include <cstddef>
#include <cstdint>
#include <cstdlib>

#include "webrtc/Stun.h"

namespace {

void Answer(const webrtc::StunBindingRequest& req, const sockaddr* from, size_t size) {
    uint8_t out[128];
    const size_t n = webrtc::WriteStunBindingSuccess(req, from, "pw", out, sizeof out);
    webrtc::StunBindingRequest again;
    if (n != size || !webrtc::LooksLikeStun(out, n) || !webrtc::CheckStunIntegrity(out, n, "pw") ||
        webrtc::ReadStunBindingRequest(out, n, &again) != webrtc::StunRead::kNotBindingRequest) {
        abort();
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    webrtc::StunBindingRequest req;
    const webrtc::StunRead r = webrtc::ReadStunBindingRequest(data, size, &req);
    if ((r == webrtc::StunRead::kNotStun) == webrtc::LooksLikeStun(data, size)) abort();
    webrtc::CheckStunIntegrity(data, size, "0123456789abcdefghijklmn");
    if (r != webrtc::StunRead::kOk) return 0;
    const char* name = req.username.data();
    if (!req.username.empty() &&
        (name < reinterpret_cast<const char*>(data) ||
         name + req.username.size() > reinterpret_cast<const char*>(data + size))) {
        abort();
    }
    if (webrtc::LocalUfragOf(req.username).size() > req.username.size()) abort();
    sockaddr_in in = {};
    in.sin_family = AF_INET;
    in.sin_port = htons(50000);
    in.sin_addr.s_addr = htonl(0xc0a80114);
    Answer(req, reinterpret_cast<const sockaddr*>(&in), 64);
    sockaddr_in6 in6 = {};
    in6.sin6_family = AF_INET6;
    in6.sin6_port = htons(50000);
    in6.sin6_addr.s6_addr[0] = 0xfd;
    Answer(req, reinterpret_cast<const sockaddr*>(&in6), 76);
    return 0;
}
