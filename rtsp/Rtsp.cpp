#include "rtsp/Rtsp.h"

#include <cstdlib>

#include "base/OrvexLog.h"
#include "rtsp/RequestFields.h"

namespace {
// A line longer than this is cut: a peer must not make us hold unbounded memory.
constexpr size_t kLineMax = 64 * 1024;
}  // namespace

Rtsp::Rtsp() = default;

int Rtsp::Write(std::string line) {
    OrvexDebugRaw(">> '%s'\n", line.c_str());
    static unsigned char kCrLf[2] = {'\r', '\n'};
    int first = -1;
    if (!line.empty()) {
        first = Socket::Write(reinterpret_cast<unsigned char*>(&line[0]),
                              static_cast<int>(line.size()), 2000000);
        Socket::Write(kCrLf, 2, 2000000);
    } else {
        first = Socket::Write(kCrLf, 2, 2000000);
    }
    OrvexDebugRaw(" \n");
    return first;
}

int Rtsp::Read(std::string& line) {
    line.clear();
    for (;;) {
        unsigned char c = 0;
        int n = Socket::Read(&c, 1, 2000000);
        if (n < 0) return -1;
        if (n == 0) break;
        if (c == 13) {
            unsigned char dropped = 0;
            Socket::Read(&dropped, 1, 2000000);
            break;
        }
        if (c == 10) break;
        if (line.size() < kLineMax) line.push_back(static_cast<char>(c));
    }
    if (line.empty()) {
        OrvexDebugRaw("<< ''\n");
        return 0;
    }
    OrvexDebugRaw("<< '%s'\n", line.c_str());
    return static_cast<int>(line.size());
}

void Rtsp::AddField(std::string field) { m_fields.push_back(std::move(field)); }

void Rtsp::WriteFields() {
    for (const std::string& f : m_fields) Write(f);
    m_fields.clear();
}

bool Rtsp::ParseMrl(std::string mrl, std::string* host, std::string* path, int* port) {
    size_t scheme = mrl.size() >= 7 ? mrl.find("rtsp://") : std::string::npos;
    if (scheme == std::string::npos) {
        OrvexDebugRaw("rtsp: bad url: %s\n", mrl.c_str());
        return false;
    }
    std::string rest = mrl.substr(scheme + 7);
    int p = 554;
    // The first ':' with a '/' somewhere after it delimits the port, even inside the path.
    size_t colon = rest.find(':');
    if (colon != std::string::npos) {
        size_t slash = rest.find('/', colon + 1);
        if (slash != std::string::npos) {
            p = LeadingInt(std::string_view(rest).substr(colon + 1, slash - colon - 1)).value_or(0);
            rest.erase(colon, slash - colon);
        }
    }
    std::string h, pa;
    size_t slash = rest.find('/');
    if (slash != std::string::npos) {
        h = rest.substr(0, slash);
        pa = rest.substr(slash + 1);
    } else {
        h = rest;
    }
    if (host != nullptr) *host = h;
    if (path != nullptr) *path = pa;
    if (port != nullptr) *port = p;
    return true;
}
