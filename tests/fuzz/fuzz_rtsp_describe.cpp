// Arbitrary bytes as the URL of a DESCRIBE and then of a SETUP on one client connection, each
// answered as the listener runs it: DESCRIBE hands the query keys to the capture rules and the
// name to the served presentation and its SDP; SETUP takes the name, the stream and the
// transport through the URL extractors. The first byte picks the platform flavour and whether
// the URL time check is on; the second splits the rest into the DESCRIBE URL and the stream
// part that SETUP appends to it, so SETUP's track numbers are reached on their own. Run with
// -close_fd_mask=1: the query search traces to standard output.
#include <sys/socket.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>

#include "media/MediaSessionList.h"
#include "media/MediaStreamH264.h"
#include "media/MediaStreamMP4A.h"
#include "platform/fake/FakePlatform.h"
#include "rtsp/RtspSession.h"

namespace {

struct Server {
    platform::fake::FakePlatform fake;
    MediaSessionList list;

    Server() {
        Socket::SetReadinessWaitMs(10);
        auto session = std::make_unique<MediaSession>("skyvo");
        session->AddMediaStream(std::make_unique<MediaStreamH264>("h264"));
        session->AddMediaStream(std::make_unique<MediaStreamMP4A>("aac", -1));
        list.AddMediaSession(std::move(session));
    }
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    static Server* server = new Server();  // lives as long as the process
    if (size < 2 || size > 8192) return 0;
    static const char* const kFlavours[] = {"sa", "px", "dqx", ""};
    server->fake.properties.Set("kelvo.build.kelvotv", kFlavours[data[0] & 3]);
    g_url_check_switch = (data[0] & 4) != 0;
    std::string rest(reinterpret_cast<const char*>(data + 2), size - 2);
    size_t split = data[1] % (rest.size() + 1);
    std::string url = rest.substr(0, split);
    std::string stream = rest.substr(split);
    std::string request = "DESCRIBE " + url + " RTSP/1.0\r\nCSeq: 2\r\n" +
                          "Accept: application/sdp\r\n\r\n" + "SETUP " + url + stream +
                          " RTSP/1.0\r\nCSeq: 3\r\n" +
                          "Transport: RTP/AVP;unicast;client_port=5000-5001\r\n\r\n";
    int fds[2];
    if (socketpair(AF_UNIX, SOCK_STREAM, 0, fds) != 0) return 0;
    if (write(fds[1], request.data(), request.size()) == static_cast<ssize_t>(request.size())) {
        close(fds[1]);  // the client is gone once it has asked: answers fail fast
        RtspSession session(fds[0], sockaddr_in{}, sockaddr_in{}, &server->list);  // closes fds[0]
        int type = 0;
        // Both requests, even after a failed DESCRIBE: SETUP then judges the URL on its own.
        session.RtspSessionThread(type);
        session.RtspSessionThread(type);
    } else {
        close(fds[0]);
        close(fds[1]);
    }
    g_url_check_switch = 0;
    server->fake.log.Clear();
    server->fake.journal.Clear();
    return 0;
}
