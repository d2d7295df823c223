#pragma once

#include <string>

// Port to the system properties (Android: property_get).
// Thread contract: Get may be called from any thread.

namespace platform {

// Room for a value and its NUL, as PROPERTY_VALUE_MAX on Android.
constexpr int kPropertyValueMax = 92;

class PropertyPort {
public:
    virtual ~PropertyPort() = default;
    // Copies the value of `key` (or `default_value` when the key is unset; "" when that is
    // null) into `value`, which holds kPropertyValueMax bytes; returns the length copied.
    virtual int Get(const char* key, char* value, const char* default_value) = 0;
    // The whole value of `key`, which may be longer than Get can copy where the platform keeps
    // longer ones (the host's property file: capture pipelines); false when unset or empty.
    virtual bool Lookup(const std::string& key, std::string* value) {
        char text[kPropertyValueMax] = {};
        if (Get(key.c_str(), text, "") == 0) return false;
        *value = text;
        return true;
    }
};

}  // namespace platform
