#include "platform/android/AndroidCamera.h"

#include <utility>

#include <utils/String16.h>
#include <utils/String8.h>

namespace platform {
namespace android_port {

AndroidCamera::AndroidCamera(android::sp<android::Camera> camera) : camera_(std::move(camera)) {}

AndroidCamera::~AndroidCamera() { camera_->disconnect(); }

std::string AndroidCamera::getParameters() {
    const android::String8 flattened = camera_->getParameters();
    return std::string(flattened.string(), flattened.length());
}

int AndroidCamera::setParameters(const std::string& flattened) {
    return camera_->setParameters(android::String8(flattened.c_str()));
}

int AndroidCamera::unlock() { return camera_->unlock(); }

int AndroidCamera::lock() { return camera_->lock(); }

std::shared_ptr<Camera> AndroidCameraPort::connect(int camera_id, const std::string& package,
                                                   int uid, int pid) {
    android::sp<android::Camera> camera =
        android::Camera::connect(camera_id, android::String16(package.c_str()), uid, pid);
    if (camera == nullptr) {
        return nullptr;
    }
    return std::make_shared<AndroidCamera>(std::move(camera));
}

}  // namespace android_port
}  // namespace platform
