// Arbitrary bytes as a client's side of an RTSP connection: every request read from them goes
// through every extractor and every answer; the same bytes also go to the URL and query
// helpers. Run with -close_fd_mask=1: the query search traces to standard output.
#include <sys/socket.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <string>

#include "rtsp/KeyWordValue.h"
#include "rtsp/RtspResponse.h"

namespace {

void Extract(RtspResponse& r) {
    int type = 0, a = 0, b = 0;
    std::string s, auth;
    r.GetRequestType(&type);
    r.GetRequestMrl(&s);
    r.GetRequestServerUrl(&s);
    r.GetRequestSessionName(&s);
    r.GetRequestSessionName(&s, auth);
    r.GetRequestStreamName(&s);
    r.GetRequestTransportInfo(&a, &b);
    r.GetRequestTransportintleaved(&a, &b);
    r.SearchRequests(&s, "Session");
    switch (type) {
        case kRtspOptions:
            r.ResponseOptions();
            break;
        case kRtspDescribe:
            r.ResponseDescribe(s.c_str(), static_cast<unsigned>(s.size()));
            break;
        case kRtspSetup:
            r.ResponseSetup(nullptr, 8000, nullptr, a, 1);
            break;
        case kRtspPlay:
            r.ResponsePlay(s.c_str());
            break;
        case kRtspTeardown:
            r.ResponseTeardown();
            break;
        default:
            r.ResponseError(s.c_str());
            break;
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    static const bool kShortWaits = [] {
        Socket::SetReadinessWaitMs(10);
        return true;
    }();
    (void)kShortWaits;
    if (size > 60000) return 0;  // stays within one socket buffer: written before it is read
    int fds[2];
    if (socketpair(AF_UNIX, SOCK_STREAM, 0, fds) != 0) return 0;
    if (size > 0 && write(fds[1], data, size) != static_cast<ssize_t>(size)) {
        close(fds[0]);
        close(fds[1]);
        return 0;
    }
    // The client is gone once it has sent: what it wrote stays readable, answers fail fast.
    close(fds[1]);
    {
        RtspResponse r(fds[0], sockaddr_in{}, sockaddr_in{});
        while (r.GetRequests()) Extract(r);
    }  // closes fds[0]

    std::string text(reinterpret_cast<const char*>(data), size);
    RtspResponse idle(-1, sockaddr_in{}, sockaddr_in{});
    std::string host, path;
    int port = 0;
    idle.ParseMrl(text, &host, &path, &port);
    for (const char* key : {"width=", "cameraid=", "win=", "specialcase=", ""}) {
        getKeyWordValue(key, text);
    }
    return 0;
}
