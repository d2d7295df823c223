#pragma once

#include <map>
#include <mutex>
#include <string>

#include "platform/PropertyPort.h"

namespace platform {
namespace fake {

// Properties set by the test; unset keys read as the caller's default, like property_get.
// Thread contract: any thread.
class FakeProperties final : public PropertyPort {
public:
    int Get(const char* key, char* value, const char* default_value) override;
    void Set(const std::string& key, const std::string& value);
    void Clear();

private:
    std::mutex mutex_;
    std::map<std::string, std::string> values_;
};

}  // namespace fake
}  // namespace platform
