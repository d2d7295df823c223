#include "platform/host/StartLine.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

namespace platform {
namespace host {

namespace {

std::string PictureName(const SourceChoice& s) {
    switch (s.kind) {
        case SourceChoice::kPattern:
            return "test pattern";
        case SourceChoice::kNone:
            return "none (only what orvex-feed sends)";
        case SourceChoice::kX11:
            return "the screen " + (s.arg.empty() ? std::string("of $DISPLAY") : s.arg);
        case SourceChoice::kV4l2:
            return "camera " + s.arg;
        case SourceChoice::kGst:
            return "GStreamer " + s.arg;
        default:
            return s.text;
    }
}

std::string SoundName(const SourceChoice& s) {
    switch (s.kind) {
        case SourceChoice::kTone:
            return "1 kHz tone";
        case SourceChoice::kNone:
            return "none";
        case SourceChoice::kPulse:
            return s.arg.empty() ? std::string("what the machine plays (PulseAudio)")
                                 : "PulseAudio source " + s.arg;
        case SourceChoice::kAlsa:
            return "ALSA " + (s.arg.empty() ? std::string("default") : s.arg);
        case SourceChoice::kGst:
            return "GStreamer " + s.arg;
        default:
            return s.text;
    }
}

}  // namespace

std::string StartLine(const SourceChoice& video, const SourceChoice& audio,
                      const std::string& address, unsigned rtsp_port, unsigned http_port,
                      const std::string& access) {
    std::string line = "serving picture: " + PictureName(video) + ", sound: " + SoundName(audio) +
                       " at rtsp://" + address + ":" + std::to_string(rtsp_port) + "/skyvo.0";
    if (http_port != 0) line += " and http://" + address + ":" + std::to_string(http_port) + "/";
    if (!access.empty()) line += "; " + access;
    return line;
}

std::string ReachableAddress(const std::string& bind) {
    in_addr parsed{};
    if (inet_pton(AF_INET, bind.c_str(), &parsed) == 1 && parsed.s_addr != htonl(INADDR_ANY)) {
        return bind;
    }
    std::string address = "127.0.0.1";
    int fd = socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0);
    if (fd < 0) return address;
    sockaddr_in out{};
    out.sin_family = AF_INET;
    out.sin_port = htons(9);
    inet_pton(AF_INET, "192.0.2.1", &out.sin_addr);  // TEST-NET-1: any routed address will do
    sockaddr_in local{};
    socklen_t len = sizeof local;
    char text[INET_ADDRSTRLEN];
    if (connect(fd, reinterpret_cast<sockaddr*>(&out), sizeof out) == 0 &&
        getsockname(fd, reinterpret_cast<sockaddr*>(&local), &len) == 0 &&
        local.sin_addr.s_addr != htonl(INADDR_ANY) &&
        inet_ntop(AF_INET, &local.sin_addr, text, sizeof text) != nullptr) {
        address = text;
    }
    close(fd);
    return address;
}

}  // namespace host
}  // namespace platform
