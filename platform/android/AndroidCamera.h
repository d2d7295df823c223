#pragma once

#include <memory>
#include <string>

#include <camera/Camera.h>
#include <utils/StrongPointer.h>

#include "platform/CapturePorts.h"

namespace platform {
namespace android_port {

// One connection to the camera service. The recorder reaches the underlying camera through
// native(). Thread contract: the capture thread.
class AndroidCamera final : public Camera {
public:
    explicit AndroidCamera(android::sp<android::Camera> camera);
    // Gives the device back to the camera service, which otherwise keeps it for this process.
    ~AndroidCamera() override;

    std::string getParameters() override;
    int setParameters(const std::string& flattened) override;
    int unlock() override;
    int lock() override;

    const android::sp<android::Camera>& native() const { return camera_; }

private:
    android::sp<android::Camera> camera_;
};

class AndroidCameraPort final : public CameraPort {
public:
    std::shared_ptr<Camera> connect(int camera_id, const std::string& package, int uid,
                                    int pid) override;
};

}  // namespace android_port
}  // namespace platform
