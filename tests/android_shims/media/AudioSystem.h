#pragma once

#include <media/IAudioFlinger.h>
#include <utils/RefBase.h>

// Android 8: frameworks/av/include/media/AudioSystem.h (only what the adapters call).
namespace android {

class AudioSystem {
public:
    enum sync_event_t {
        SYNC_EVENT_NONE = 0,
    };
    static const sp<IAudioFlinger> get_audio_flinger();
};

}  // namespace android
