#pragma once

#include <sys/types.h>

#include <ctime>
#include <map>
#include <mutex>
#include <string>

#include "platform/PropertyPort.h"

namespace platform {
namespace host {

// System properties on Linux, from a build.prop-style file: "key=value" lines, blanks around
// key and value ignored, "#" comment lines. The file is read again when it changes, so edits
// take effect at the next lookup, as setprop would. A missing file means no property is set.
// Thread contract: Get from any thread.
class HostProperties final : public PropertyPort {
public:
    explicit HostProperties(std::string path);

    int Get(const char* key, char* value, const char* default_value) override;
    // The whole value of `key` (Get stops at kPropertyValueMax); false when unset or empty.
    bool Lookup(const std::string& key, std::string* value);
    const std::string& path() const { return path_; }

    // Parses file text into its key/value pairs (later lines win).
    static std::map<std::string, std::string> Parse(const std::string& text);

private:
    void ReloadIfChanged();

    std::mutex mutex_;
    std::string path_;
    std::map<std::string, std::string> values_;
    bool loaded_ = false;
    timespec mtime_{};
    off_t size_ = -1;
};

// Where the host looks for its properties: $ORVEX_PROP_FILE, else /etc/orvex/orvex.prop.
std::string PropertyFilePath();

}  // namespace host
}  // namespace platform
