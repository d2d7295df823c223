#pragma once

#include <system/audio.h>
#include <utils/Errors.h>
#include <utils/RefBase.h>
#include <utils/String8.h>

// Android 8: frameworks/av/include/media/IAudioFlinger.h (only what the adapters call).
namespace android {

class IAudioFlinger : public virtual RefBase {
public:
    virtual status_t setParameters(audio_io_handle_t ioHandle, const String8& keyValuePairs) = 0;
};

}  // namespace android
