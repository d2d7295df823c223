#include "platform/fake/FakePlatform.h"

namespace platform {
namespace fake {

FakePlatform::FakePlatform() : previous_(Installed()) {
    Ports ports;
    ports.log = &log;
    ports.properties = &properties;
    ports.pip_manager = &pip_manager;
    ports.audio_manager = &audio_manager;
    ports.binder = &binder;
    ports.camera = &camera;
    ports.media_recorder = &media_recorder;
    ports.tv_manager = &tv_manager;
    ports.px_audio_out = &px_audio_out;
    ports.audio_record = &audio_record;
    ports.aac_library = &aac_library;
    ports.publish = &publish;
    Install(ports);
}

FakePlatform::~FakePlatform() { Install(previous_); }

}  // namespace fake
}  // namespace platform
