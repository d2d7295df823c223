#pragma once

#include <sys/types.h>

#include <ctime>
#include <map>
#include <string>
#include <vector>

#include "platform/PropertyPort.h"
#include "sync/thread_mutex.h"

namespace platform {
namespace host {

// System properties on Linux, from build.prop-style files: "key=value" lines, blanks around
// key and value ignored, "#" comment lines. `paths` names one file or several separated by ':';
// a key in a later file wins (tools/run.sh lays its own settings over the shipped file this
// way, so the file people edit is the file that is read). Each file is read again when it
// changes, so edits take effect at the next lookup, as setprop would. A missing file sets
// nothing.
// Thread contract: Get from any thread.
class HostProperties final : public PropertyPort {
public:
    explicit HostProperties(const std::string& paths);

    int Get(const char* key, char* value, const char* default_value) override;
    // The whole value of `key` (Get stops at kPropertyValueMax); false when unset or empty.
    bool Lookup(const std::string& key, std::string* value) override;
    std::vector<std::string> paths() const;

    // Parses file text into its key/value pairs (later lines win).
    static std::map<std::string, std::string> Parse(const std::string& text);

private:
    struct File {
        std::string path;
        std::map<std::string, std::string> values;
        bool loaded = false;
        timespec mtime{};
        off_t size = -1;
    };
    static void ReloadIfChanged(File* file);
    // The value of `key` in the last file that sets it, null when none does.
    const std::string* Find(const std::string& key) ORVEX_REQUIRES(mutex_);

    mutable thread_mutex mutex_;
    std::vector<File> files_ ORVEX_GUARDED_BY(mutex_);
};

// Where the host looks for its properties: $ORVEX_PROP_FILE (one path, or several separated by
// ':'), else /etc/orvex/orvex.prop.
std::string PropertyFilePath();

}  // namespace host
}  // namespace platform
