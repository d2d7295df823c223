#include "platform/Ports.h"
#include "platform/android/AndroidAacLibrary.h"
#include "platform/android/AndroidAudio.h"
#include "platform/android/AndroidBinder.h"
#include "platform/android/AndroidCamera.h"
#include "platform/android/AndroidLog.h"
#include "platform/android/AndroidManagers.h"
#include "platform/android/AndroidMediaRecorder.h"
#include "platform/android/AndroidProperties.h"
#include "platform/android/AndroidPublish.h"
#include "platform/android/AndroidPxAudioOut.h"

namespace platform {

// The ports live for the whole process: created once, never destroyed, so that threads still
// logging or receiving binder calls during exit find them.
void InstallDefaultPorts() {
    static const Ports ports = [] {
        Ports p;
        p.log = new android_port::AndroidLog();
        p.properties = new android_port::AndroidProperties();
        p.pip_manager = new android_port::AndroidPipManager();
        p.audio_manager = new android_port::AndroidAudioManager();
        p.binder = new android_port::AndroidBinder();
        p.camera = new android_port::AndroidCameraPort();
        p.media_recorder = new android_port::AndroidMediaRecorderPort();
        p.tv_manager = new android_port::AndroidTvManager();
        p.px_audio_out = new android_port::AndroidPxAudioOut();
        p.audio_record = new android_port::AndroidAudioRecordPort();
        p.aac_library = new android_port::AndroidAacLibrary();
        p.publish = new android_port::AndroidPublish();
        return p;
    }();
    Install(ports);
}

void AnnounceService(unsigned, unsigned, const std::string&, const std::string&) {}

void ShowStdoutMirror() {}

}  // namespace platform
