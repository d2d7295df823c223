#include <cstdlib>
#include <fstream>
#include <sstream>
#include <string>

#include "platform/Ports.h"
#include "platform/host/HostAudio.h"
#include "platform/host/HostBinder.h"
#include "platform/host/HostLog.h"
#include "platform/host/HostManagers.h"
#include "platform/host/HostProperties.h"
#include "platform/host/KnownProperties.h"
#include "platform/host/publish/HostPublish.h"
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
    static const Ports ports = [] {
        Ports p;
        p.log = log;
        p.properties = properties;
        p.pip_manager = new host::HostPipManager();
        p.audio_manager = new host::HostAudioManager();
        p.binder = new host::HostBinder();
        p.camera = new host::HostCameraPort();
        p.media_recorder = new host::HostMediaRecorderPort();
        p.tv_manager = new host::HostTvManager();
        p.px_audio_out = new host::HostPxAudioOut();
        p.audio_record = new host::HostAudioRecordPort();
        p.aac_library = new host::HostAacLibrary();
        p.publish = new host::HostPublish();
        return p;
    }();
    Install(ports);
    // Once, with the log in place: keys that nothing reads are most likely misspelt.
    static const bool checked = [] {
        for (const std::string& path : properties->paths()) {
            std::ifstream in(path);
            std::ostringstream text;
            text << in.rdbuf();
            if (in) host::WarnUnknownPropertyKeys(host::HostProperties::Parse(text.str()), path);
        }
        return true;
    }();
    (void)checked;
}

}  // namespace platform
