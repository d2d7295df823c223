#include "server/RtspService_t.h"

#include "auth/AddressRules.h"
#include "base/OrvexLog.h"
#include "platform/LogPort.h"
#include "platform/Ports.h"
#include "platform/PropertyPort.h"
#include "rtp/SendH264Rtp.h"
#include "rtp/SendMP3Rtp.h"

namespace {

// kv.orvex.bind: the one address to listen on; unset, all of them. A value that is not an IPv4
// address opens nothing rather than everything.
bool ListenAddress(std::string* address) {
    char value[platform::kPropertyValueMax] = {};
    platform::Properties().Get("kv.orvex.bind", value, "");
    uint32_t parsed = 0;
    if (value[0] == '\0') {
        *address = "0.0.0.0";
        return true;
    }
    if (!auth::ParseIpv4(value, &parsed)) {
        OrvexLogPriority(platform::kLogError, "orvex:::access",
                         "kv.orvex.bind=\"%s\" is not an IPv4 address; not listening", value);
        return false;
    }
    *address = value;
    return true;
}

}  // namespace

RtspService_t::RtspService_t() : m_config(Global_Config::instance()) {}

RtspService_t::~RtspService_t() { Release(); }

bool RtspService_t::Open(unsigned port) {
    m_config->m_rtsp_port = port;
    m_config->read_audio_payload_type();
    m_config->read_wake_mode();
    m_config->read_audio_clock();
    m_config->read_latency_report();
    auto session = std::make_unique<MediaSession>("skyvo");
    // Video first: it becomes track 1, payload type 96 in the SDP.
    session->AddMediaStream(std::make_unique<MediaStreamH264>("h264"));
    session->AddMediaStream(std::make_unique<MediaStreamMP4A>("aac", -1));
    m_listener = std::make_unique<RtspTransport>();
    m_listener->AddMediaSession(std::move(session));
    m_listener->access().Load();
    OpenAudioAndVideoThread();
    std::string address;
    if (!ListenAddress(&address)) return false;
    return m_listener->Open(address.c_str(), port, static_cast<unsigned>(-1));
}

void RtspService_t::OpenAudioAndVideoThread() {
    H264RtpTransportSession::instance()->SetInputRing(&m_listener->video_ring());
    MP3RtpTransportSession::instance()->SetInputRing(&m_listener->audio_ring());
}

void RtspService_t::Release() {
    if (m_listener != nullptr) m_listener->CloseAll();
    m_listener.reset();  // with it the presentation and its tracks
    // The send sessions go before the configuration their threads read.
    H264RtpTransportSession::CloseInstance();
    MP3RtpTransportSession::CloseInstance();
    Global_Config::CloseInstance();
    m_config = nullptr;
    for (unsigned& word : m_bookkeeping) word = 0;
}
