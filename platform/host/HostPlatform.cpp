#include <cstdlib>
#include <string>

#include "platform/Ports.h"
#include "platform/host/HostLog.h"
#include "platform/host/HostManagers.h"
#include "platform/host/HostProperties.h"

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
    static host::HostPipManager* pip = new host::HostPipManager();
    static host::HostAudioManager* audio = new host::HostAudioManager();
    Ports ports;
    ports.log = log;
    ports.properties = properties;
    ports.pip_manager = pip;
    ports.audio_manager = audio;
    Install(ports);
}

}  // namespace platform
