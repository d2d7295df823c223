#pragma once

#include <android/hardware/ICamera.h>
#include <camera/ICameraRecordingProxy.h>
#include <utils/Errors.h>
#include <utils/RefBase.h>
#include <utils/String16.h>
#include <utils/String8.h>

// Android 8: frameworks/av/include/camera/Camera.h (remote() comes from CameraBase there).
namespace android {

class Camera : public virtual RefBase {
public:
    static sp<Camera> connect(int cameraId, const String16& clientPackageName, int clientUid,
                              int clientPid);
    void disconnect();
    status_t lock();
    status_t unlock();
    status_t setParameters(const String8& params);
    String8 getParameters() const;
    sp<hardware::ICamera> remote();
    sp<ICameraRecordingProxy> getRecordingProxy();
};

}  // namespace android
