#include "rtsp/RtspSession.h"

#include <arpa/inet.h>
#include <sys/time.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>

#include "base/OrvexLog.h"
#include "config/GlobalConfig.h"
#include "config/LivecameraResolution.h"
#include "platform/LogPort.h"
#include "rtp/SendH264Rtp.h"
#include "rtp/SendMP3Rtp.h"
#include "rtsp/CaptureQuery.h"
#include "rtsp/RequestFields.h"
#include "stream/KeyFrames.h"

std::atomic<unsigned char> g_url_check_switch{0};

namespace {

constexpr const char* kTag = "orvex:::RtspSession";

}  // namespace

RtspSession::RtspSession(int fd, sockaddr_in first, sockaddr_in second, MediaSessionList* list,
                         auth::AccessGate* access)
    : m_fd(fd),
      m_response(std::make_unique<RtspResponse>(fd, first, second)),
      m_list(list),
      m_access(access) {}

RtspSession::~RtspSession() {
    OrvexPrint("\n RtspSession::~RtspSession() ");
    // One line for a client that never got in, with the last reason it was given.
    if (!m_refusal.empty() && !m_admitted) {
        OrvexLogPriority(platform::kLogWarn, kTag, "%s refused: %s",
                         DottedAddress(m_response->GetConnectAddr()).c_str(), m_refusal.c_str());
    }
    H264RtpTransportSession::instance()->del_dest_socket_info(this);
    MP3RtpTransportSession::instance()->del_dest_socket_info(this);
    m_response.reset();  // closes the connection
}

int RtspSession::RtspSessionThread(int& type) {
    type = 0;
    if (!m_response->GetRequests()) {
        OrvexPrintLog(kTag, "\n m_pRtspResponse->GetRequests() ");
        return -1;
    }
    if (!m_response->GetRequestType(&type)) {
        OrvexPrintLog(kTag, "\n m_pRtspResponse->GetRequestType() %d \n", type);
        return -1;
    }
    m_last_activity = static_cast<int>(GetTimeHeartbeatSec());
    int refused_result = 0;
    if (Refused(&type, &refused_result)) return refused_result;
    switch (type) {
        case kRtspOptions:
            m_response->ResponseOptions();
            return 0;
        case kRtspDescribe: {
            std::string sdp;
            if (!TransportDescribe(&sdp)) return -1;
            m_response->ResponseDescribe(sdp.c_str(), static_cast<unsigned>(sdp.size()));
            return 0;
        }
        case kRtspSetup:
            ResponseSetup();
            return 0;
        case kRtspGetParameter:
            m_response->ResponsePause();  // the plain answer serves as keep-alive
            return 0;
        case kRtspTeardown:
            // Never answered: the connection is simply closed.
            usleep(100000);
            OrvexPrintLog(kTag, "\n rtsp server ResponseTeardown ");
            return -1;
        case kRtspPlay:
            if (TransportPlay()) {
                m_response->ResponsePlay(m_rtp_info.c_str());
                stream::AskForKeyFrame();  // the client decodes from its first picture
                usleep(10000);
            }
            return 0;
        case kRtspPause:
            if (TransportPause()) m_response->ResponsePause();
            return 0;
        default:
            OrvexPrintLog(kTag, "\n rtsp method not support ");
            return -1;
    }
}

bool RtspSession::Refused(int* type, int* result) {
    if (m_access == nullptr || !m_access->authenticating()) return false;
    sockaddr_in peer = m_response->GetConnectAddr();
    auth::AccessDecision d = JudgeRtspRequest(*m_access, m_response->request_lines(), *type,
                                              ntohl(peer.sin_addr.s_addr), DottedAddress(peer));
    if (d.answer == auth::AccessAnswer::kServe) {
        if (*type != kRtspOptions) m_admitted = true;
        return false;
    }
    m_refusal = d.reason;
    *type = 0;  // nothing was done: no PLAY may start capture
    switch (d.answer) {
        case auth::AccessAnswer::kChallenge:
            m_response->AddField("WWW-Authenticate: " + d.challenge);
            m_response->ResponseError("RTSP/1.0 401 Unauthorized");
            break;
        case auth::AccessAnswer::kBadRequest:
            m_response->ResponseError("RTSP/1.0 400 Bad Request");
            break;
        case auth::AccessAnswer::kLockedOut:
            // A status players print ("403 Forbidden") rather than a reset they cannot explain.
            m_response->AddField("Retry-After: " + std::to_string(d.retry_after_s));
            m_response->ResponseError("RTSP/1.0 403 Forbidden");
            break;
        default:
            m_response->ResponseError("RTSP/1.0 503 Service Unavailable");
            break;
    }
    *result = d.close ? -1 : 0;
    return true;
}

void RtspSession::WarnOfRefusedSize() {
    // The answer stays 200 and the sound plays; without this line nobody learns why the
    // picture does not.
    const CaptureState& state = capture_state();
    if (ResolutionCode(state.width, state.height, state.board) >= 0) return;
    OrvexLogPriority(platform::kLogWarn, kTag,
                     "%s asks for %ux%u, a size the capture refuses: no picture, sound only "
                     "(accepted on %s: %s)",
                     DottedAddress(m_response->GetConnectAddr()).c_str(), state.width, state.height,
                     state.board, AcceptedSizesText(state.board).c_str());
}

bool RtspSession::TransportDescribe(std::string* sdp) {
    // rtsp://host/name.seconds?query: the text after the first '.' carries time and query.
    std::string name, time_text;
    m_response->GetRequestSessionName(&name, time_text);
    if (g_url_check_switch.load(std::memory_order_relaxed) != 0) {
        int stamp = LeadingInt(time_text).value_or(0);
        timeval now{};
        gettimeofday(&now, nullptr);
        int now_sec = static_cast<int>(now.tv_sec);
        OrvexPrintLog(kTag, "\n timesec:%d,nowsec:%d,\n", stamp, now_sec);
        if (now_sec < stamp) {
            OrvexPrintLog(kTag, "\n  live auth error --1 ! ");
            return false;
        }
        if (static_cast<int64_t>(now_sec) - stamp >= 11) {
            OrvexPrintLog(kTag, "\n  live auth error --3 ! ");
            return false;
        }
    }
    std::string missing;
    CaptureQueryResult applied = ApplyCaptureQuery(time_text, &missing);
    if (applied == CaptureQueryResult::kMissingKey) {
        // The connection is reset with no answer; this line is all the operator gets.
        OrvexLogPriority(platform::kLogWarn, kTag,
                         "rtsp client %s: the URL has no '%s' key; every key of %s is needed",
                         DottedAddress(m_response->GetConnectAddr()).c_str(), missing.c_str(),
                         kCaptureKeysText);
        return false;
    }
    if (applied == CaptureQueryResult::kRefused) {
        m_response->ResponseError("RTSP/1.0 405  resolvration error !");
        return false;
    }
    WarnOfRefusedSize();
    MediaSession* session = m_list->FindMediaSession(name.c_str());
    if (session == nullptr) {
        m_response->ResponseError("RTSP/1.0 404 File Url Not Found, Or In Incorrect Format");
        return false;
    }
    m_session_name = name;
    std::string local = DottedAddress(m_response->GetBindAddr());
    std::string client = DottedAddress(m_response->GetConnectAddr());
    *sdp = session->GenerateMediaSdp(local.c_str(), client.c_str(), 1);
    if (sdp->empty()) return false;
    m_rtp_info.clear();
    return true;
}

void RtspSession::ResponseSetup() {
    std::string name, auth;
    if (!m_response->GetRequestSessionName(&name, auth)) name = m_session_name;
    MediaSession* session = m_list->FindMediaSession(name.c_str());
    if (session == nullptr) {
        m_response->ResponseError("RTSP/1.0 404 Session Not Found");
        return;
    }
    unsigned server_port = 0;
    int client_port = 0;
    if (TransportSetup(session, &server_port, &client_port)) {
        m_response->ResponseSetup(nullptr, static_cast<int>(server_port), nullptr, client_port, 1);
    }
}

bool RtspSession::TransportSetup(MediaSession* session, unsigned* server_port, int* client_port) {
    std::string stream;
    m_response->GetRequestStreamName(&stream);
    std::optional<int> track = TrackIndexOf(stream);
    if (track) {
        MediaStream* s =
            *track >= 0 ? session->GetMediaStream(static_cast<unsigned>(*track)) : nullptr;
        if (s == nullptr) {
            m_response->ResponseError("RTSP/1.0 404 Stream Not Found");
            return false;
        }
        return StreamSetup(s, server_port, client_port);
    }
    if (!stream.empty()) {
        MediaStream* s = session->FindMediaStream(stream.c_str());
        if (s == nullptr) {
            m_response->ResponseError("RTSP/1.0 404 Stream Not Found");
            return false;
        }
        return StreamSetup(s, server_port, client_port);
    }
    // No stream named: every stream in order, stopping at the first failure.
    for (int i = 0; i < session->GetMediaStreamCount(); ++i) {
        if (!StreamSetup(session->GetMediaStream(static_cast<unsigned>(i)), server_port,
                         client_port)) {
            return false;
        }
    }
    return true;
}

bool RtspSession::StreamSetup(MediaStream* stream, unsigned* server_port, int* client_port) {
    std::string client = DottedAddress(m_response->GetConnectAddr());
    int rtp = 0, rtcp = 0;
    if (!m_response->GetRequestTransportInfo(&rtp, &rtcp)) {
        m_response->ResponseError("RTSP/1.0 400 Bad Request");
        return false;
    }
    Global_Config* config = Global_Config::instance();
    std::string codec = stream->GetName();
    unsigned port = 8000;
    if (codec == "h264") {
        port = config->m_h264_rtp_port;
        H264RtpTransportSession::instance()->SetServerPort(port);
        H264RtpTransportSession::instance()->add_dest_socket_info(this, rtp, client);
    } else if (codec == "aac") {
        port = config->m_audio_rtp_port;
        MP3RtpTransportSession::instance()->SetServerPort(port);
        MP3RtpTransportSession::instance()->add_dest_socket_info(this, rtp, client);
    }
    std::string mrl;
    m_response->GetRequestMrl(&mrl);
    if (!m_rtp_info.empty()) m_rtp_info += ",";
    m_rtp_info += "url=" + mrl;
    *server_port = port;
    *client_port = rtp;
    return true;
}

MediaSession* RtspSession::NamedSession() {
    std::string name, auth;
    if (!m_response->GetRequestSessionName(&name, auth)) {
        m_response->ResponseError("RTSP/1.0 400 Bad Request");
        return nullptr;
    }
    MediaSession* session = m_list->FindMediaSession(name.c_str());
    if (session == nullptr) m_response->ResponseError("RTSP/1.0 404 Session Not Found");
    return session;
}

bool RtspSession::TransportPlay() { return NamedSession() != nullptr; }

bool RtspSession::TransportPause() {
    MediaSession* session = NamedSession();
    if (session == nullptr) return false;
    for (int i = 0; i < session->GetMediaStreamCount(); ++i) {
        session->GetMediaStream(static_cast<unsigned>(i))->TransportStop();
    }
    return true;
}
