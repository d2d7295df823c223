#include "server/RtspService_t.h"

#include "rtp/SendH264Rtp.h"
#include "rtp/SendMP3Rtp.h"

RtspService_t::RtspService_t(config::Settings settings)
    : m_settings(std::move(settings)), m_config(Global_Config::instance()) {}

RtspService_t::~RtspService_t() { Release(); }

bool RtspService_t::Open(unsigned port) {
    m_config->m_rtsp_port = port;
    m_config->Apply(m_settings);
    auto session = std::make_unique<MediaSession>("skyvo");
    // Video first: it becomes track 1, payload type 96 in the SDP.
    session->AddMediaStream(std::make_unique<MediaStreamH264>("h264"));
    session->AddMediaStream(std::make_unique<MediaStreamMP4A>("aac", -1));
    m_listener = std::make_unique<RtspTransport>();
    m_listener->AddMediaSession(std::move(session));
    m_listener->access().Configure(m_settings.allow, m_settings.auth_file);
    OpenAudioAndVideoThread();
    // A kv.orvex.bind that is not an address (its line is logged) opens nothing rather than
    // everything.
    if (m_settings.bind_refused) return false;
    const char* address = m_settings.bind.empty() ? "0.0.0.0" : m_settings.bind.c_str();
    return m_listener->Open(address, port, static_cast<unsigned>(-1));
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
