#pragma once

#include <map>
#include <memory>
#include <string>

#include "config/PlatformFlavour.h"
#include "platform/AudioManagerPort.h"
#include "platform/PipManagerPort.h"

// The picture-in-picture side of the TV settings, embedded in Global_Config.
// Thread contract: NOT thread safe; used by the thread that runs the capture start and stop.
class orvexPIPCfg {
public:
    orvexPIPCfg();
    virtual ~orvexPIPCfg();
    orvexPIPCfg(const orvexPIPCfg&) = delete;
    orvexPIPCfg& operator=(const orvexPIPCfg&) = delete;

    // Main and sub input back to none; the sound back to the main picture if it was switched.
    void SetTVParameterDefault();
    // Fills the source table with the platform's input-source numbers.
    void iniPipInfo();

    const std::map<std::string, int>& PipSources() const { return m_pip_sources; }
    int MainInputSource() const { return m_main_input_source; }
    int SubInputSource() const { return m_sub_input_source; }
    int AudioCaptureState() const { return m_audio_capture_state; }
    int Counter() const { return m_counter; }

private:
    std::map<std::string, int> m_pip_sources;
    int m_main_input_source = -1;
    int m_sub_input_source = -1;
    // -1 untouched, 1 the capture source was switched to the sub window's sound.
    int m_audio_capture_state = -1;
    int m_counter = 0;
    std::shared_ptr<platform::PipManagerClient> m_pip_manager;
    std::shared_ptr<platform::AudioManagerClient> m_audio_manager;
    PlatformFlavourCache m_flavour;
};
