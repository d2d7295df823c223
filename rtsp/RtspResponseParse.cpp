// Request parsing of RtspResponse: lenient and substring-based by design. The order of the
// searches decides ambiguous requests and is part of the behaviour.
#include <cstdlib>
#include <cstring>

#include "rtsp/RtspResponse.h"
#include "service/OrvexLog.h"

namespace {

// A request with more lines than this keeps its first lines only: a peer must not make us
// hold unbounded memory.
constexpr size_t kRequestLinesMax = 256;

std::string Lower(std::string s) {
    for (char& c : s) c = to_lower_char(c);
    return s;
}

bool Contains(const std::string& s, const char* word) { return s.find(word) != std::string::npos; }

// The URL less its first six characters ("rtsp:/"), one '/' and the host through the next
// '/'; false when no '/' follows the host.
bool RestAfterHost(const std::string& url, std::string* rest) {
    std::string r = url.size() > 6 ? url.substr(6) : "";
    if (!r.empty() && r[0] == '/') r.erase(0, 1);
    size_t slash = r.find('/');
    if (slash == std::string::npos) return false;
    *rest = r.substr(slash + 1);
    return true;
}

bool SessionNameOf(const std::string& url, std::string* name) {
    std::string rest;
    if (!RestAfterHost(url, &rest)) return false;
    // Looked for before the cut, so ".../skyvo.N/trackID=1" yields no name.
    if (Contains(rest, "trackID=")) return false;
    rest = rest.substr(0, rest.find('/'));
    if (name != nullptr) *name = rest;
    return true;
}

}  // namespace

char to_lower_char(char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; }

bool RtspResponse::GetRequests() {
    m_request_lines.clear();
    std::string line;
    for (;;) {
        int n = Read(line);
        if (n < 0) return false;
        if (n == 0) break;
        if (m_request_lines.size() < kRequestLinesMax) m_request_lines.push_back(line);
    }
    std::string cseq;
    SearchRequests(&cseq, "CSeq");
    m_cseq = static_cast<unsigned>(atoi(cseq.c_str()));
    return true;
}

bool RtspResponse::GetRequestType(int* type) {
    if (m_request_lines.empty()) return false;
    // Searched anywhere in the request line, in this order: the first hit decides.
    static const std::pair<const char*, int> kMethods[] = {
        {"OPTIONS", kRtspOptions},
        {"DESCRIBE", kRtspDescribe},
        {"SETUP", kRtspSetup},
        {"TEARDOWN", kRtspTeardown},
        {"PLAY", kRtspPlay},
        {"PAUSE", kRtspPause},
        {"GET_PARAMETER", kRtspGetParameter},
    };
    const std::string& line = m_request_lines[0];
    for (const auto& m : kMethods) {
        if (Contains(line, m.first)) {
            if (type != nullptr) *type = m.second;
            return true;
        }
    }
    return false;
}

bool RtspResponse::SearchRequests(std::string* value, std::string key) {
    std::string lower_key = Lower(key);
    for (const std::string& line : m_request_lines) {
        size_t at = Lower(line).find(lower_key);
        if (at == std::string::npos) continue;
        std::string v = line.substr(at + lower_key.size());
        size_t b = v.find_first_not_of(':');
        v = b == std::string::npos ? "" : v.substr(b);
        size_t t = v.find_first_not_of(" \t");
        if (t != std::string::npos) v = v.substr(t);  // only blanks left: kept as they are
        if (value != nullptr) *value = v;
        break;
    }
    return true;
}

bool RtspResponse::GetRequestMrl(std::string* mrl) {
    if (m_request_lines.empty()) return false;
    const std::string& line = m_request_lines[0];
    size_t start = Lower(line).find("rtsp:/");
    if (start == std::string::npos) return false;
    size_t version = line.find("RTSP/1.0", start);
    if (version == std::string::npos) return false;
    std::string url = line.substr(start, version - start);
    size_t end = url.find_last_not_of(' ');
    url.erase(end == std::string::npos ? 0 : end + 1);
    if (mrl != nullptr) *mrl = url;
    return true;
}

bool RtspResponse::GetRequestServerUrl(std::string* server) {
    std::string url;
    if (!GetRequestMrl(&url)) return false;
    std::string rest = url.substr(6);
    size_t b = rest.find_first_not_of('/');
    rest = b == std::string::npos ? "" : rest.substr(b);
    rest = rest.substr(0, rest.find('/'));
    if (rest.empty()) return false;
    if (server != nullptr) *server = rest;
    return true;
}

bool RtspResponse::UrlAfterHost(std::string* rest) {
    std::string url;
    return GetRequestMrl(&url) && RestAfterHost(url, rest);
}

bool RtspResponse::GetRequestSessionName(std::string* name) {
    std::string url;
    return GetRequestMrl(&url) && SessionNameOf(url, name);
}

bool RtspResponse::GetRequestSessionName(std::string* name, std::string& authTime) {
    std::string url;
    if (!GetRequestMrl(&url)) return false;
    std::string compact;
    for (char c : url) {
        if (c != ' ') compact.push_back(c);
    }
    std::string n;
    if (!SessionNameOf(compact, &n)) return false;
    size_t dot = n.find('.');
    if (dot != std::string::npos) {
        authTime = n.substr(dot + 1);
        n = n.substr(0, dot);
    }
    OrvexDebugRaw("\n authtimesec:%s,(*pSessionName) :%s,\n", authTime.c_str(), n.c_str());
    if (name != nullptr) *name = n;
    return true;
}

bool RtspResponse::GetRequestStreamName(std::string* stream) {
    std::string rest;
    std::string s;
    bool ok = false;
    if (UrlAfterHost(&rest)) {
        size_t slash = rest.find('/');
        if (slash != std::string::npos) {
            s = rest.substr(slash + 1);
            ok = true;
        } else if (Contains(rest, "trackID=")) {
            s = rest;
            ok = true;
        }
    }
    if (stream != nullptr) *stream = s;
    return ok;
}

bool RtspResponse::FindInterleavedOrPorts(const char* word, int* first, int* second) {
    std::string transport;
    SearchRequests(&transport, "Transport");
    size_t at = transport.find(word);
    if (at == std::string::npos) return false;
    std::string value = transport.substr(at + strlen(word));
    value = value.substr(0, value.find(';'));
    size_t dash = value.find('-');
    *first = atoi(value.c_str());
    *second = atoi(dash != std::string::npos ? value.c_str() + dash + 1 : value.c_str());
    return true;
}

bool RtspResponse::GetRequestTransportInfo(int* rtpPort, int* rtcpPort) {
    int rtp = 0, rtcp = 0;
    if (!FindInterleavedOrPorts("client_port=", &rtp, &rtcp)) return false;
    if (rtpPort != nullptr) *rtpPort = rtp;
    if (rtcpPort != nullptr) *rtcpPort = rtcp;
    return true;
}

bool RtspResponse::GetRequestTransportintleaved(int* rtpChannel, int* rtcpChannel) {
    if (!FindInterleavedOrPorts("interleaved=", &m_interleaved_rtp, &m_interleaved_rtcp)) {
        return false;
    }
    if (rtpChannel != nullptr) *rtpChannel = m_interleaved_rtp;
    if (rtcpChannel != nullptr) *rtcpChannel = m_interleaved_rtcp;
    return true;
}
