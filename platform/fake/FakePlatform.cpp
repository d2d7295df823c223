#include "platform/fake/FakePlatform.h"

namespace platform {
namespace fake {

FakePlatform::FakePlatform() : previous_(Installed()) {
    Ports ports;
    ports.log = &log;
    ports.properties = &properties;
    ports.pip_manager = &pip_manager;
    ports.audio_manager = &audio_manager;
    Install(ports);
}

FakePlatform::~FakePlatform() { Install(previous_); }

}  // namespace fake
}  // namespace platform
