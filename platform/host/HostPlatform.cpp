#include <cstdlib>
#include <string>

#include "platform/Ports.h"
#include "platform/host/HostAudio.h"
#include "platform/host/HostBinder.h"
#include "platform/host/HostLog.h"
#include "platform/host/HostManagers.h"
#include "platform/host/HostProperties.h"
#include "platform/host/video/HostCamera.h"
#include "platform/host/video/HostMediaRecorder.h"

namespace platform {

// The host's ports live for the whole process: created once, never destroyed, so that
// threads still logging during exit find them.
void InstallDefaultPorts() {
    static host::HostProperties* properties = new host::HostProperties(host::PropertyFilePath());
    // The log sink: $ORVEX_LOG, else the property "orvex.host.log", else standard error.
    static host::HostLog* log = [] {
        const char* env = getenv("ORVEX_LOG");
        char value[kPropertyValueMax];
        properties->Get("orvex.host.log", value, "stderr");
        return new host::HostLog(env != nullptr && env[0] != '\0' ? env : value);
    }();
    Ports ports;
    ports.log = log;
    ports.properties = properties;
    ports.pip_manager = new host::HostPipManager();
    ports.audio_manager = new host::HostAudioManager();
    ports.binder = new host::HostBinder();
    ports.camera = new host::HostCameraPort();
    ports.media_recorder = new host::HostMediaRecorderPort();
    ports.tv_manager = new host::HostTvManager();
    ports.px_audio_out = new host::HostPxAudioOut();
    ports.audio_record = new host::HostAudioRecordPort();
    ports.aac_library = new host::HostAacLibrary();
    Install(ports);
}

}  // namespace platform
