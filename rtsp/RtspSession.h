#pragma once

#include <netinet/in.h>

#include <atomic>
#include <memory>
#include <string>

#include "media/MediaSessionList.h"
#include "rtsp/RtspAccess.h"
#include "rtsp/RtspResponse.h"

// The URL time check of DESCRIBE: off, and nothing in the service turns it on (tests do).
extern std::atomic<unsigned char> g_url_check_switch;

// One client connection: each call of RtspSessionThread reads and answers one request.
// Every method is accepted at any time and judged by its own URL; there is no per-connection
// state machine. Destroying the session removes its RTP destinations.
// Thread contract: NOT thread safe; used by the RTSP listener's thread only.
class RtspSession {
public:
    // `access`, when given, judges every request before it is served.
    RtspSession(int fd, sockaddr_in first, sockaddr_in second, MediaSessionList* list,
                auth::AccessGate* access = nullptr);
    virtual ~RtspSession();
    RtspSession(const RtspSession&) = delete;
    RtspSession& operator=(const RtspSession&) = delete;

    // 0 to keep the connection, -1 to have the listener close it; `type` gets the method
    // code (0 when none was recognised).
    int RtspSessionThread(int& type);
    bool RtspSessionIsClose() { return false; }

    bool TransportDescribe(std::string* sdp);
    void ResponseSetup();
    bool TransportPlay();
    bool TransportPause();

    int descriptor() const { return m_fd; }
    int last_activity() const { return m_last_activity; }

private:
    // Sets up the stream(s) the URL names; the ports of the last one set up come back.
    bool TransportSetup(MediaSession* session, unsigned* server_port, int* client_port);
    bool StreamSetup(MediaStream* stream, unsigned* server_port, int* client_port);
    // The media session a PLAY or PAUSE names, answering 400 or 404 when there is none.
    MediaSession* NamedSession();
    // One warning line when the stored capture size is one the capture will refuse.
    void WarnOfRefusedSize();
    // Answers a request that may not be served; false when it may.
    bool Refused(int* type, int* result);

    int m_fd;
    std::unique_ptr<RtspResponse> m_response;
    MediaSessionList* m_list;
    std::string m_session_name;
    std::string m_rtp_info;
    int m_last_activity = 0;
    auth::AccessGate* m_access;
    std::string m_refusal;  // why the last refused request was refused
    bool m_admitted = false;
};
