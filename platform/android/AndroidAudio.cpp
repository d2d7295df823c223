#include "platform/android/AndroidAudio.h"

#include <sys/types.h>

#include <utility>

#include <media/AudioRecord.h>
#include <media/AudioSystem.h>
#include <media/IAudioFlinger.h>
#include <system/audio.h>
#include <utils/Errors.h>
#include <utils/String16.h>
#include <utils/String8.h>

namespace platform {
namespace android_port {
namespace {

class AndroidAudioRecord final : public AudioRecord {
public:
    explicit AndroidAudioRecord(android::sp<android::AudioRecord> record)
        : record_(std::move(record)) {}

    int set(int input_source, unsigned sample_rate, int format, unsigned channel_mask,
            size_t frame_count) override {
        // Blocking reads on the caller's thread: no callback, default transfer, a fresh
        // session, and the calling process's own uid and pid.
        const android::status_t status = record_->set(
            static_cast<audio_source_t>(input_source), sample_rate,
            static_cast<audio_format_t>(format), static_cast<audio_channel_mask_t>(channel_mask),
            frame_count, nullptr, nullptr, 0, false, AUDIO_SESSION_ALLOCATE,
            android::AudioRecord::TRANSFER_DEFAULT, AUDIO_INPUT_FLAG_NONE, static_cast<uid_t>(-1),
            -1, nullptr);
        return status != android::NO_ERROR ? status : record_->initCheck();
    }
    int start() override { return record_->start(); }
    void stop() override { record_->stop(); }
    long read(void* buffer, size_t size) override { return record_->read(buffer, size); }

private:
    android::sp<android::AudioRecord> record_;
};

}  // namespace

std::shared_ptr<AudioRecord> AndroidAudioRecordPort::create(const std::string& package) {
    android::sp<android::AudioRecord> record =
        new android::AudioRecord(android::String16(package.c_str()));
    return std::make_shared<AndroidAudioRecord>(std::move(record));
}

int AndroidAudioRecordPort::getMinFrameCount(size_t* frame_count, unsigned sample_rate, int format,
                                             unsigned channel_mask) {
    return android::AudioRecord::getMinFrameCount(frame_count, sample_rate,
                                                  static_cast<audio_format_t>(format),
                                                  static_cast<audio_channel_mask_t>(channel_mask));
}

bool AndroidAudioRecordPort::setFlingerParameters(int io, const std::string& key_values) {
    const android::sp<android::IAudioFlinger> flinger = android::AudioSystem::get_audio_flinger();
    if (flinger == nullptr) {
        return false;
    }
    flinger->setParameters(static_cast<audio_io_handle_t>(io),
                           android::String8(key_values.c_str()));
    return true;
}

}  // namespace android_port
}  // namespace platform
