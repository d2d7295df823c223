#include "platform/host/HostProperties.h"

#include <sys/stat.h>

#include <cstdlib>
#include <cstring>
#include <fstream>
#include <sstream>

#include "sync/thread_mutex.h"

namespace platform {
namespace host {
namespace {

std::string Trim(const std::string& s) {
    const char* ws = " \t\r\n";
    size_t b = s.find_first_not_of(ws);
    if (b == std::string::npos) return "";
    size_t e = s.find_last_not_of(ws);
    return s.substr(b, e - b + 1);
}

int CopyOut(const char* text, char* value) {
    size_t n = strnlen(text, kPropertyValueMax - 1);
    memcpy(value, text, n);
    value[n] = '\0';
    return static_cast<int>(n);
}

}  // namespace

std::string PropertyFilePath() {
    const char* env = getenv("ORVEX_PROP_FILE");
    return env != nullptr && env[0] != '\0' ? env : "/etc/orvex/orvex.prop";
}

HostProperties::HostProperties(const std::string& paths) {
    size_t from = 0;
    for (;;) {
        const size_t colon = paths.find(':', from);
        std::string path = paths.substr(from, colon == std::string::npos ? colon : colon - from);
        if (!path.empty()) files_.push_back(File{path, {}, false, {}, -1});
        if (colon == std::string::npos) break;
        from = colon + 1;
    }
}

std::vector<std::string> HostProperties::paths() const {
    thread_mutex::Scoped hold(mutex_);
    std::vector<std::string> out;
    for (const File& f : files_) out.push_back(f.path);
    return out;
}

std::map<std::string, std::string> HostProperties::Parse(const std::string& text) {
    std::map<std::string, std::string> out;
    std::istringstream in(text);
    std::string line;
    while (std::getline(in, line)) {
        std::string t = Trim(line);
        if (t.empty() || t[0] == '#') continue;
        size_t eq = t.find('=');
        if (eq == std::string::npos) continue;
        std::string key = Trim(t.substr(0, eq));
        if (key.empty()) continue;
        out[key] = Trim(t.substr(eq + 1));
    }
    return out;
}

void HostProperties::ReloadIfChanged(File* file) {
    struct stat st {};
    if (stat(file->path.c_str(), &st) != 0) {
        file->values.clear();
        file->loaded = false;
        return;
    }
    if (file->loaded && st.st_size == file->size && st.st_mtim.tv_sec == file->mtime.tv_sec &&
        st.st_mtim.tv_nsec == file->mtime.tv_nsec) {
        return;
    }
    std::ifstream f(file->path);
    std::stringstream text;
    text << f.rdbuf();
    file->values = Parse(text.str());
    file->loaded = true;
    file->mtime = st.st_mtim;
    file->size = st.st_size;
}

const std::string* HostProperties::Find(const std::string& key) {
    const std::string* found = nullptr;
    for (File& file : files_) {
        ReloadIfChanged(&file);
        auto it = file.values.find(key);
        if (it != file.values.end()) found = &it->second;
    }
    return found;
}

bool HostProperties::Lookup(const std::string& key, std::string* value) {
    thread_mutex::Scoped hold(mutex_);
    const std::string* found = Find(key);
    if (found == nullptr || found->empty()) return false;
    *value = *found;
    return true;
}

int HostProperties::Get(const char* key, char* value, const char* default_value) {
    thread_mutex::Scoped hold(mutex_);
    const std::string* found = key != nullptr ? Find(key) : nullptr;
    // As on the television, an empty value reads as unset.
    if (found != nullptr && !found->empty()) return CopyOut(found->c_str(), value);
    return CopyOut(default_value != nullptr ? default_value : "", value);
}

}  // namespace host
}  // namespace platform
