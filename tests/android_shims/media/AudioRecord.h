#pragma once

#include <stddef.h>
#include <sys/types.h>

#include <media/AudioSystem.h>
#include <system/audio.h>
#include <utils/Errors.h>
#include <utils/RefBase.h>
#include <utils/String16.h>

// Android 8: frameworks/av/include/media/AudioRecord.h (only what the adapters call).
namespace android {

class AudioRecord : public virtual RefBase {
public:
    typedef void (*callback_t)(int event, void* user, void* info);

    enum transfer_type {
        TRANSFER_DEFAULT,
        TRANSFER_CALLBACK,
        TRANSFER_OBTAIN,
        TRANSFER_SYNC,
    };

    static status_t getMinFrameCount(size_t* frameCount, uint32_t sampleRate, audio_format_t format,
                                     audio_channel_mask_t channelMask);

    explicit AudioRecord(const String16& opPackageName);

    status_t set(audio_source_t inputSource, uint32_t sampleRate, audio_format_t format,
                 audio_channel_mask_t channelMask, size_t frameCount = 0, callback_t cbf = NULL,
                 void* user = NULL, uint32_t notificationFrames = 0, bool threadCanCallJava = false,
                 audio_session_t sessionId = AUDIO_SESSION_ALLOCATE,
                 transfer_type transferType = TRANSFER_DEFAULT,
                 audio_input_flags_t flags = AUDIO_INPUT_FLAG_NONE, uid_t uid = AUDIO_UID_INVALID,
                 pid_t pid = -1, const audio_attributes_t* pAttributes = NULL,
                 audio_port_handle_t selectedDeviceId = AUDIO_PORT_HANDLE_NONE);

    status_t initCheck() const;
    status_t start(AudioSystem::sync_event_t event = AudioSystem::SYNC_EVENT_NONE,
                   audio_session_t triggerSession = AUDIO_SESSION_NONE);
    void stop();
    ssize_t read(void* buffer, size_t size, bool blocking = true);
};

}  // namespace android
