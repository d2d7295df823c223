#include "platform/host/video/HostCamera.h"

#include <cstdio>

#include "platform/Ports.h"
#include "sync/thread_mutex.h"

namespace platform {
namespace host {

const char* const HostCamera::kDefaultParameters =
    "preview-size=1280x720;preview-size-values=1920x1080,1280x720,720x576,640x480,320x240;"
    "preview-frame-rate=30;preview-frame-rate-values=15,25,30,60;preview-format=yuv420p;"
    "video-size=1280x720;video-frame-format=yuv420p";

std::string HostCamera::getParameters() {
    thread_mutex::Scoped hold(mutex_);
    return parameters_;
}

int HostCamera::setParameters(const std::string& flattened) {
    thread_mutex::Scoped hold(mutex_);
    parameters_ = flattened;
    return 0;
}

int HostCamera::unlock() {
    thread_mutex::Scoped hold(mutex_);
    locked_ = false;
    return 0;
}

int HostCamera::lock() {
    thread_mutex::Scoped hold(mutex_);
    locked_ = true;
    return 0;
}

bool HostCamera::locked() {
    thread_mutex::Scoped hold(mutex_);
    return locked_;
}

std::shared_ptr<Camera> HostCameraPort::connect(int camera_id, const std::string&, int, int) {
    char text[64];
    snprintf(text, sizeof text, "Camera::connect(%d)", camera_id);
    Log().Write(kLogIdSystem, kLogDebug, "orvex:::host", text);
    return std::make_shared<HostCamera>();
}

}  // namespace host
}  // namespace platform
