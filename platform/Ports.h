#pragma once

#include <string>

#include "platform/AudioManagerPort.h"
#include "platform/AudioPorts.h"
#include "platform/BinderPort.h"
#include "platform/CapturePorts.h"
#include "platform/LogPort.h"
#include "platform/PipManagerPort.h"
#include "platform/PropertyPort.h"
#include "platform/PublishPort.h"

// The installed platform implementation: one object per port, reached by the layers above.
// Thread contract: Install before any other thread uses a port (start-up, or a test's set-up);
// the accessors may be called from any thread. A port that was never installed is a null
// implementation: logs vanish, properties read as their defaults, managers cannot connect.

namespace platform {

struct Ports {
    LogPort* log = nullptr;
    PropertyPort* properties = nullptr;
    PipManagerPort* pip_manager = nullptr;
    AudioManagerPort* audio_manager = nullptr;
    BinderPort* binder = nullptr;
    CameraPort* camera = nullptr;
    MediaRecorderPort* media_recorder = nullptr;
    TvManagerPort* tv_manager = nullptr;
    PxAudioOutPort* px_audio_out = nullptr;
    AudioRecordPort* audio_record = nullptr;
    AacLibraryPort* aac_library = nullptr;
    PublishPort* publish = nullptr;
};

// Null members install the null implementation of that port. Ports are not owned.
void Install(const Ports& ports);
Ports Installed();

LogPort& Log();
PropertyPort& Properties();
PipManagerPort& PipManager();
AudioManagerPort& AudioManager();
BinderPort& Binder();
CameraPort& Cameras();
MediaRecorderPort& MediaRecorders();
TvManagerPort& TvManager();
PxAudioOutPort& PxAudioOut();
AudioRecordPort& AudioRecords();
AacLibraryPort& AacLibrary();
PublishPort& Publish();

// Defined by the platform library the executable links (host or android), never by fakes.
void InstallDefaultPorts();
// Once the service listens: the RTSP port, the web viewer's (0: none), the address it listens
// on (kv.orvex.bind; empty: every one) and who may watch (empty: nothing to add). The host logs
// one line with the sources and addresses; the television logs nothing more than it always
// has. Same library as InstallDefaultPorts.
void AnnounceService(unsigned rtsp_port, unsigned http_port, const std::string& bind,
                     const std::string& access);
// The process answers a person's command with traces (orvex -v): the stdout copy of the traces
// is printed even where the platform leaves it out (the television always prints it).
void ShowStdoutMirror();

}  // namespace platform
