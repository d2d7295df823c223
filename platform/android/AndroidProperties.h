#pragma once

#include "platform/PropertyPort.h"

namespace platform {
namespace android_port {

// System properties through libcutils. Thread contract: any thread.
class AndroidProperties final : public PropertyPort {
public:
    int Get(const char* key, char* value, const char* default_value) override;
};

}  // namespace android_port
}  // namespace platform
