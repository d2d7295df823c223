#pragma once

#include "platform/LogPort.h"

namespace platform {
namespace android_port {

// The platform log through liblog. Thread contract: any thread (liblog serialises).
class AndroidLog final : public LogPort {
public:
    void Write(int buffer, int priority, const char* tag, const char* text) override;
};

}  // namespace android_port
}  // namespace platform
