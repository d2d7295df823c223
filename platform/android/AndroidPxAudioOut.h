#pragma once

#include "platform/CapturePorts.h"

namespace platform {
namespace android_port {

// The PX flavour's audio-output library (PX_AOUT_*, declared in vendor/orvex_vendor.h).
// Thread contract: the capture thread.
class AndroidPxAudioOut final : public PxAudioOutPort {
public:
    int Init(unsigned short first_field) override;
    int GetHandle(int path, int* handle) override;
    int Open(int path, int param, int* handle) override;
    int SetAttr(int handle, int attr, int* value) override;
    int Close(int handle) override;
    int DeInit() override;
};

}  // namespace android_port
}  // namespace platform
