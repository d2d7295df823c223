#include "server/RtspService_t.h"

#include "rtp/SendH264Rtp.h"
#include "rtp/SendMP3Rtp.h"

RtspService_t::RtspService_t() : m_config(Global_Config::instance()) {}

RtspService_t::~RtspService_t() { Release(); }

bool RtspService_t::Open(unsigned port) {
    m_config->m_rtsp_port = port;
    m_config->read_audio_payload_type();
    m_config->read_wake_mode();
    m_config->read_latency_report();
    m_video = new MediaStreamH264("h264");
    m_audio = new MediaStreamMP4A("aac", -1);
    m_session = new MediaSession("skyvo");
    // Video first: it becomes track 1, payload type 96 in the SDP.
    m_session->AddMediaStream(m_video);
    m_session->AddMediaStream(m_audio);
    m_listener = new RtspTransport();
    m_listener->AddMediaSession(m_session);
    OpenAudioAndVideoThread();
    return m_listener->Open("0.0.0.0", port, static_cast<unsigned>(-1));
}

void RtspService_t::OpenAudioAndVideoThread() {
    H264RtpTransportSession::instance()->SetInputRing(&m_listener->video_ring());
    MP3RtpTransportSession::instance()->SetInputRing(&m_listener->audio_ring());
}

void RtspService_t::Release() {
    if (m_listener != nullptr) {
        m_listener->CloseAll();
        delete m_listener;  // with it the presentation and its tracks
    }
    m_listener = nullptr;
    m_session = nullptr;
    m_video = nullptr;
    m_audio = nullptr;
    // The send sessions go before the configuration their threads read.
    H264RtpTransportSession::CloseInstance();
    MP3RtpTransportSession::CloseInstance();
    Global_Config::CloseInstance();
    m_config = nullptr;
    for (unsigned& word : m_bookkeeping) word = 0;
}
