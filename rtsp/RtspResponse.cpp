#include "rtsp/RtspResponse.h"

#include <atomic>
#include <cstdio>

#include "base/OrvexLog.h"

namespace {

std::atomic<unsigned> g_session_counter{1880};

// 1881 ... 91883, then 1881 again. Atomic so two connections never share an identifier.
unsigned NextSessionId() {
    unsigned current = g_session_counter.load(std::memory_order_relaxed);
    unsigned next;
    do {
        next = (current >= 91883 ? 1880 : current) + 1;
    } while (!g_session_counter.compare_exchange_weak(current, next, std::memory_order_relaxed));
    return next;
}

}  // namespace

void RtspResponse::SetSessionCounter(unsigned value) {
    g_session_counter.store(value, std::memory_order_relaxed);
}

RtspResponse::RtspResponse(int fd, sockaddr_in first, sockaddr_in second) {
    m_fd = fd;
    m_bind_addr = first;
    m_connect_addr = second;
    m_opened = 1;
    m_connected = 1;
}

bool RtspResponse::SendResponse(const char* status) {
    // Each line is formatted into 256 bytes: a longer one is cut to 255 characters.
    char line[256];
    snprintf(line, sizeof line, "%s",
             status != nullptr && status[0] != '\0' ? status : "RTSP/1.0 200 OK");
    Write(line);
    snprintf(line, sizeof line, "CSeq: %u", m_cseq);
    Write(line);
    if (m_session_id >= 1) {
        snprintf(line, sizeof line, "Session: %u;timeout=%d", static_cast<unsigned>(m_session_id),
                 10);
        Write(line);
    }
    for (const std::string& f : m_fields) {
        snprintf(line, sizeof line, "%s", f.c_str());
        Write(line);
    }
    m_fields.clear();
    Write("");
    return true;
}

bool RtspResponse::ResponseOptions() {
    // No blank before GET_PARAMETER: clients have seen it this way from the start.
    AddField("Public: OPTIONS, DESCRIBE, SETUP, TEARDOWN, PLAY, PAUSE,GET_PARAMETER");
    SendResponse("");
    OrvexDebugRaw("\n");
    return true;
}

bool RtspResponse::ResponseDescribe(const char* sdp, unsigned length) {
    std::string mrl;
    GetRequestMrl(&mrl);
    AddField("Server: RTSP Service");
    AddField("Content-Base: " + mrl);
    AddField("Content-Type: application/sdp");
    char field[64];
    snprintf(field, sizeof field, "Content-Length: %lu", static_cast<unsigned long>(length));
    AddField(field);
    SendResponse("");
    if (sdp != nullptr && length > 0) {
        Socket::Write(reinterpret_cast<unsigned char*>(const_cast<char*>(sdp)),
                      static_cast<int>(length), 2000000);
    }
    OrvexDebugRaw("Content:\n\n");
    return true;
}

bool RtspResponse::ResponseSetup(const char*, int serverPort, const char*, int clientPort,
                                 int ssrc) {
    if (m_session_id == 0) m_session_id = static_cast<int>(NextSessionId());
    char field[256];
    snprintf(field, sizeof field,
             "Transport: RTP/AVP;unicast;server_port=%u-%u;client_port=%u-%u;ssrc=%u",
             static_cast<unsigned>(serverPort), static_cast<unsigned>(serverPort) + 1u,
             static_cast<unsigned>(clientPort), static_cast<unsigned>(clientPort) + 1u,
             static_cast<unsigned>(ssrc));
    AddField(field);
    SendResponse("");
    OrvexDebugRaw("\n");
    return true;
}

bool RtspResponse::ResponseTeardown() {
    AddField("Connection: Close");
    SendResponse("");
    OrvexDebugRaw("\n");
    return true;
}

bool RtspResponse::ResponsePlay(const char* rtpInfo) {
    AddField(std::string("RTP-Info: ") + (rtpInfo != nullptr ? rtpInfo : ""));
    SendResponse("");
    OrvexDebugRaw("\n");
    return true;
}

bool RtspResponse::ResponsePause() {
    SendResponse("");
    OrvexDebugRaw("\n");
    return true;
}

bool RtspResponse::ResponseError(const char* status) {
    SendResponse(status);
    OrvexDebugRaw("\n");
    return true;
}
