#include "config/orvexPIPCfg.h"

#include "base/OrvexLog.h"

namespace {
constexpr const char* kTag = "orvex:::orvexPIPCfg";
}

orvexPIPCfg::orvexPIPCfg() {
    OrvexLog(kTag, "orvexPIPCfg::orvexPIPCfg");
    OrvexLog(kTag, "orvexPIPCfg::initialize");
    m_audio_capture_state = -1;
    m_counter = 0;
    SetTVParameterDefault();
    iniPipInfo();
}

orvexPIPCfg::~orvexPIPCfg() {
    OrvexLog(kTag, "orvexPIPCfg::~orvexPIPCfg");
    if (m_flavour.Get() == kFlavourSa) {
        if (m_pip_manager) m_pip_manager->disconnect();
        m_pip_manager.reset();
        if (m_audio_manager) m_audio_manager->disconnect();
        m_audio_manager.reset();
    }
}

void orvexPIPCfg::SetTVParameterDefault() {
    OrvexLog(kTag, "orvexPIPCfg::SetTVParameterDefault");
    m_main_input_source = -1;
    m_sub_input_source = -1;
    if (m_audio_manager && m_audio_capture_state == 1) m_audio_manager->setAudioCaptureSource(0, 0);
    m_audio_capture_state = -1;
}

void orvexPIPCfg::iniPipInfo() {
    OrvexLog(kTag, "orvexPIPCfg::iniPipInfo");
    // The television's own input-source numbers.
    static const std::pair<const char*, int> kSources[] = {
        {"PIP_VGA", 0},      {"PIP_ATV", 1},    {"PIP_DTV", 28},   {"PIP_CVBS", 2},
        {"PIP_STORAGE", 34}, {"PIP_YPBPR", 16}, {"PIP_HDMI1", 23}, {"PIP_HDMI2", 24},
        {"PIP_HDMI3", 25},   {"PIP_HDMI4", 26},
    };
    for (const auto& s : kSources) m_pip_sources.insert(s);
}
