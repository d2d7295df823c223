#pragma once

#include <map>
#include <string>

#include "platform/PropertyPort.h"
#include "sync/thread_mutex.h"

namespace platform {
namespace fake {

// Properties set by the test; unset keys read as the caller's default, like property_get.
// Thread contract: any thread.
class FakeProperties final : public PropertyPort {
public:
    int Get(const char* key, char* value, const char* default_value) override;
    // The whole value, as the host's property file keeps it.
    bool Lookup(const std::string& key, std::string* value) override;
    void Set(const std::string& key, const std::string& value);
    void Clear();

private:
    thread_mutex mutex_;
    std::map<std::string, std::string> values_ ORVEX_GUARDED_BY(mutex_);
};

}  // namespace fake
}  // namespace platform
