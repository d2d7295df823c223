#pragma once

#include <memory>

#include "config/GlobalConfig.h"
#include "config/Settings.h"
#include "media/MediaSession.h"
#include "media/MediaStreamH264.h"
#include "media/MediaStreamMP4A.h"
#include "rtsp/RtspTransport.h"

// The process-wide streaming server behind the skyvo_* functions: the RTSP listener and the
// presentation "skyvo" with its tracks "h264" and "aac".
// Thread contract: created, opened and released by the main thread; the producers reach its
// listener's rings while it is open.
class RtspService_t {
public:
    explicit RtspService_t(config::Settings settings);
    virtual ~RtspService_t();
    RtspService_t(const RtspService_t&) = delete;
    RtspService_t& operator=(const RtspService_t&) = delete;

    // Builds the presentation and the listener and opens it; false (nothing left open) on failure.
    bool Open(unsigned port);
    // Hands the listener's rings to the two send sessions.
    void OpenAudioAndVideoThread();
    void Release();

    RtspTransport* listener() { return m_listener.get(); }
    Global_Config* config() { return m_config; }
    // The start-time properties, read when the service was made.
    const config::Settings& settings() const { return m_settings; }

private:
    const config::Settings m_settings;
    std::unique_ptr<RtspTransport> m_listener;
    unsigned m_bookkeeping[4] = {};
    Global_Config* m_config;
};
