// Request parsing of RtspResponse: lenient and substring-based by design. The order of the
// searches decides ambiguous requests and is part of the behaviour.

#include "base/OrvexLog.h"
#include "rtsp/RequestFields.h"
#include "rtsp/RtspResponse.h"

namespace {

// A request with more lines than this keeps its first lines only: a peer must not make us
// hold unbounded memory.
constexpr size_t kRequestLinesMax = 256;

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
    m_cseq = CSeqOf(HeaderValueOf(m_request_lines, "CSeq").value_or(""));
    return true;
}

bool RtspResponse::GetRequestType(int* type) {
    if (m_request_lines.empty()) return false;
    int method = RequestMethodOf(m_request_lines[0]);
    if (method == 0) return false;
    if (type != nullptr) *type = method;
    return true;
}

bool RtspResponse::SearchRequests(std::string* value, std::string key) {
    std::optional<std::string> found = HeaderValueOf(m_request_lines, key);
    if (found && value != nullptr) *value = *found;
    return true;
}

bool RtspResponse::GetRequestMrl(std::string* mrl) {
    if (m_request_lines.empty()) return false;
    std::optional<std::string> url = MrlOf(m_request_lines[0]);
    if (!url) return false;
    if (mrl != nullptr) *mrl = *url;
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

bool RtspResponse::GetRequestSessionName(std::string* name) {
    std::string url;
    if (!GetRequestMrl(&url)) return false;
    std::optional<std::string> n = SessionNameOf(url);
    if (n && name != nullptr) *name = *n;
    return n.has_value();
}

bool RtspResponse::GetRequestSessionName(std::string* name, std::string& authTime) {
    std::string url;
    if (!GetRequestMrl(&url)) return false;
    std::string compact;
    for (char c : url) {
        if (c != ' ') compact.push_back(c);
    }
    std::optional<std::string> named = SessionNameOf(compact);
    if (!named) return false;
    std::string n = *named;
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
    std::string url;
    std::optional<std::string> s;
    if (GetRequestMrl(&url)) s = StreamNameOf(url);
    if (stream != nullptr) *stream = s.value_or("");
    return s.has_value();
}

bool RtspResponse::FindInterleavedOrPorts(const char* word, int* first, int* second) {
    std::optional<PortPair> pair =
        PortPairOf(HeaderValueOf(m_request_lines, "Transport").value_or(""), word);
    if (!pair) return false;
    *first = pair->first;
    *second = pair->second;
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
