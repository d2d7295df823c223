#pragma once

#include <netinet/in.h>

#include <string>
#include <vector>

#include "rtsp/Rtsp.h"

// Method codes, bit values so that sets of methods can be masks.
enum RtspMethod {
    kRtspOptions = 1,
    kRtspDescribe = 2,
    kRtspGetParameter = 16,
    kRtspSetup = 8,
    kRtspTeardown = 64,
    kRtspPlay = 128,
    kRtspPause = 256,
};

// One client connection's protocol object: reads a request, extracts what the session logic
// needs (lenient, substring-based: the order of the searches decides ambiguous cases) and
// writes the answers byte for byte.
// Thread contract: NOT thread safe; used by its connection's thread. The session-identifier
// counter is shared by all connections (atomic).
class RtspResponse : public Rtsp {
public:
    // Wraps an accepted descriptor: `first` is the local (bind) address, `second` the peer.
    RtspResponse(int fd, sockaddr_in first, sockaddr_in second);

    // Answers.
    virtual bool ResponseOptions();
    virtual bool ResponseDescribe(const char* sdp, unsigned length);
    virtual bool ResponseSetup(const char* unused1, int serverPort, const char* unused2,
                               int clientPort, int ssrc);
    virtual bool ResponseTeardown();
    virtual bool ResponsePlay(const char* rtpInfo);
    virtual bool ResponsePause();
    virtual bool ResponseError(const char* status);
    virtual bool SendResponse(const char* status);

    // Request parsing.
    virtual bool SearchRequests(std::string* value, std::string key);
    virtual bool GetRequests();
    virtual bool GetRequestType(int* type);
    virtual bool GetRequestMrl(std::string* mrl);
    virtual bool GetRequestServerUrl(std::string* server);
    virtual bool GetRequestSessionName(std::string* name);
    virtual bool GetRequestStreamName(std::string* stream);
    virtual bool GetRequestTransportInfo(int* rtpPort, int* rtcpPort);
    virtual bool GetRequestTransportintleaved(int* rtpChannel, int* rtcpChannel);
    virtual bool GetRequestSessionName(std::string* name, std::string& authTime);

    const std::vector<std::string>& request_lines() const { return m_request_lines; }
    unsigned cseq() const { return m_cseq; }
    int session_id() const { return m_session_id; }

    // Identifiers run 1881 ... 91883 and then start again; the counter starts at 1880.
    static void SetSessionCounter(unsigned value);

private:
    bool FindInterleavedOrPorts(const char* word, int* first, int* second);

    std::vector<std::string> m_request_lines;
    int m_interleaved_rtp = 0;
    int m_interleaved_rtcp = 0;
};

char to_lower_char(char c);
