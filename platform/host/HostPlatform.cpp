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
#include "platform/host/StartLine.h"
#include "platform/host/publish/HostPublish.h"
#include "platform/host/video/HostCamera.h"
#include "platform/host/video/HostMediaRecorder.h"

namespace platform {

namespace {
host::HostLog* g_log = nullptr;
}

// The host's ports live for the whole process: created once, never destroyed, so that
// threads still logging during exit find them.
void InstallDefaultPorts() {
    static host::HostProperties* properties = new host::HostProperties(host::PropertyFilePath());
    // The log sink: $ORVEX_LOG, else the property "orvex.host.log", else standard error; its
    // level as ChooseLogLevel reads it.
    static std::string level_complaint;
    static host::HostLog* log = [] {
        // Read before any log exists, by hand: the property table is a layer above this one.
        const char* env = getenv("ORVEX_LOG");
        char value[kPropertyValueMax];
        char level[kPropertyValueMax];
        char kv_log[kPropertyValueMax];
        properties->Get("orvex.host.log", value, "stderr");
        properties->Get("orvex.host.log.level", level, "");
        properties->Get("kv.orvex.log", kv_log, "");
        int least =
            host::ChooseLogLevel(getenv("ORVEX_LOG_LEVEL"), level, kv_log, &level_complaint);
        return new host::HostLog(env != nullptr && env[0] != '\0' ? env : value, least);
    }();
    g_log = log;
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
        if (!level_complaint.empty()) host::HostLogf(kLogWarn, "%s", level_complaint.c_str());
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

void ShowStdoutMirror() {
    if (g_log != nullptr) g_log->ShowMirror();
}

void AnnounceService(unsigned rtsp_port, unsigned http_port, const std::string& bind,
                     const std::string& access) {
    const std::string line =
        host::StartLine(host::ChooseVideoSource(false), host::ChooseAudioSource(),
                        host::ReachableAddress(bind), rtsp_port, http_port, access);
    host::HostLogf(kLogInfo, "%s", line.c_str());
}

}  // namespace platform
