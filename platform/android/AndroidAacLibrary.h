#pragma once

#include "platform/AudioPorts.h"

namespace platform {
namespace android_port {

// The television's AAC encoder lives in libstagefright.so, which exports voGetAACEncAPI.
// Thread contract: the encoder thread only.
class AndroidAacLibrary final : public AacLibraryPort {
public:
    const char* name() override;
    void* open() override;
    void* symbol(void* library, const char* symbol) override;
    void close(void* library) override;
};

}  // namespace android_port
}  // namespace platform
