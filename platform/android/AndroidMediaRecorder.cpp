#include "platform/android/AndroidMediaRecorder.h"

#include <utility>

#include <media/mediarecorder.h>
#include <utils/Errors.h>
#include <utils/String16.h>
#include <utils/String8.h>

#include "platform/android/AndroidCamera.h"

namespace platform {
namespace android_port {
namespace {

class AndroidMediaRecorder final : public MediaRecorder {
public:
    explicit AndroidMediaRecorder(android::sp<android::MediaRecorder> recorder)
        : recorder_(std::move(recorder)) {}

    int setCamera(Camera& camera) override {
        // Only this platform's camera port is ever installed next to this recorder, so every
        // camera handed here is an AndroidCamera (no RTTI in platform builds to check it).
        const android::sp<android::Camera>& native = static_cast<AndroidCamera&>(camera).native();
        return recorder_->setCamera(native->remote(), native->getRecordingProxy());
    }
    int setVideoSource(int source) override { return recorder_->setVideoSource(source); }
    int setOutputFormat(int format) override { return recorder_->setOutputFormat(format); }
    int setVideoEncoder(int encoder) override { return recorder_->setVideoEncoder(encoder); }
    int setVideoSize(int width, int height) override {
        return recorder_->setVideoSize(width, height);
    }
    int setVideoFrameRate(int fps) override { return recorder_->setVideoFrameRate(fps); }
    int setParameters(const std::string& params) override {
        return recorder_->setParameters(android::String8(params.c_str()));
    }
    int prepare() override { return recorder_->prepare(); }
    int start() override { return recorder_->start(); }
    int stop() override { return recorder_->stop(); }
    int release() override { return recorder_->release(); }

private:
    android::sp<android::MediaRecorder> recorder_;
};

}  // namespace

std::shared_ptr<MediaRecorder> AndroidMediaRecorderPort::create(const std::string& package) {
    android::sp<android::MediaRecorder> recorder =
        new android::MediaRecorder(android::String16(package.c_str()));
    // A recorder that could not reach the media service is useless; report it as none.
    if (recorder->initCheck() != android::NO_ERROR) {
        return nullptr;
    }
    return std::make_shared<AndroidMediaRecorder>(std::move(recorder));
}

}  // namespace android_port
}  // namespace platform
