#include "platform/fake/FakeProperties.h"

#include <cstring>

#include "sync/thread_mutex.h"

namespace platform {
namespace fake {

int FakeProperties::Get(const char* key, char* value, const char* default_value) {
    std::string text = default_value != nullptr ? default_value : "";
    {
        thread_mutex::Scoped hold(mutex_);
        auto it = key != nullptr ? values_.find(key) : values_.end();
        if (it != values_.end() && !it->second.empty()) text = it->second;
    }
    size_t n = text.size() < kPropertyValueMax - 1 ? text.size() : kPropertyValueMax - 1;
    memcpy(value, text.data(), n);
    value[n] = '\0';
    return static_cast<int>(n);
}

bool FakeProperties::Lookup(const std::string& key, std::string* value) {
    thread_mutex::Scoped hold(mutex_);
    auto it = values_.find(key);
    if (it == values_.end() || it->second.empty()) return false;
    *value = it->second;
    return true;
}

void FakeProperties::Set(const std::string& key, const std::string& value) {
    thread_mutex::Scoped hold(mutex_);
    values_[key] = value;
}

void FakeProperties::Clear() {
    thread_mutex::Scoped hold(mutex_);
    values_.clear();
}

}  // namespace fake
}  // namespace platform
