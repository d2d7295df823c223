// Reading, classifying and extracting typical requests (as ffmpeg sends them) from a
// connection: requests per second on one core.
#include <benchmark/benchmark.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstdio>
#include <string>

#include "rtsp/KeyWordValue.h"
#include "rtsp/RtspResponse.h"

namespace {

const std::string kUrl =
    "rtsp://192.168.1.20/skyvo.1700000000?width=1280&height=720&cameraid=hd0&win=main&sub=0"
    "&dumpvideo=0&dumpaudio=0&specialcase=none&framerate=30";
const std::string kDescribe = "DESCRIBE " + kUrl +
                              " RTSP/1.0\r\nAccept: application/sdp\r\nCSeq: 2\r\n"
                              "User-Agent: Lavf59.27.100\r\n\r\n";
const std::string kSetup =
    "SETUP " + kUrl +
    "/trackID=1 RTSP/1.0\r\nTransport: RTP/AVP/UDP;unicast;"
    "client_port=15190-15191\r\nCSeq: 3\r\nUser-Agent: Lavf59.27.100\r\n\r\n";

struct Connection {
    Connection() {
        socketpair(AF_UNIX, SOCK_STREAM, 0, fds);
        r = new RtspResponse(fds[0], sockaddr_in{}, sockaddr_in{});
        // The query search traces every call to standard output.
        stdout_copy = dup(1);
        freopen("/dev/null", "w", stdout);
    }
    ~Connection() {
        fflush(stdout);
        dup2(stdout_copy, 1);
        close(stdout_copy);
        delete r;
        close(fds[1]);
    }
    void Send(const std::string& s) { (void)!write(fds[1], s.data(), s.size()); }
    int fds[2];
    int stdout_copy;
    RtspResponse* r;
};

void BM_Describe(benchmark::State& state) {
    Connection c;
    static const char* kKeys[] = {"width=",     "height=",    "cameraid=",    "win=",      "sub=",
                                  "dumpvideo=", "dumpaudio=", "specialcase=", "framerate="};
    for (auto _ : state) {
        c.Send(kDescribe);
        c.r->GetRequests();
        int type = 0;
        c.r->GetRequestType(&type);
        std::string name, auth;
        c.r->GetRequestSessionName(&name, auth);
        for (const char* key : kKeys) benchmark::DoNotOptimize(getKeyWordValue(key, auth));
    }
    state.SetItemsProcessed(state.iterations());
}

void BM_Setup(benchmark::State& state) {
    Connection c;
    for (auto _ : state) {
        c.Send(kSetup);
        c.r->GetRequests();
        int type = 0, rtp = 0, rtcp = 0;
        c.r->GetRequestType(&type);
        std::string name, auth, stream;
        c.r->GetRequestSessionName(&name, auth);
        c.r->GetRequestStreamName(&stream);
        c.r->GetRequestTransportInfo(&rtp, &rtcp);
        benchmark::DoNotOptimize(rtp);
    }
    state.SetItemsProcessed(state.iterations());
}

BENCHMARK(BM_Describe);
BENCHMARK(BM_Setup);

}  // namespace

BENCHMARK_MAIN();
