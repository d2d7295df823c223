#pragma once

#include <android/hardware/ICamera.h>
#include <camera/ICameraRecordingProxy.h>
#include <utils/Errors.h>
#include <utils/RefBase.h>
#include <utils/String16.h>
#include <utils/String8.h>

// Android 8: frameworks/av/include/media/mediarecorder.h
namespace android {

class MediaRecorder : public virtual RefBase {
public:
    explicit MediaRecorder(const String16& opPackageName);
    status_t initCheck();
    status_t setCamera(const sp<hardware::ICamera>& camera, const sp<ICameraRecordingProxy>& proxy);
    status_t setVideoSource(int vs);
    status_t setOutputFormat(int of);
    status_t setVideoEncoder(int ve);
    status_t setVideoSize(int width, int height);
    status_t setVideoFrameRate(int frames_per_second);
    status_t setParameters(const String8& params);
    status_t prepare();
    status_t start();
    status_t stop();
    status_t release();
};

}  // namespace android
