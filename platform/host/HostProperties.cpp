#include "platform/host/HostProperties.h"

#include <sys/stat.h>

#include <cstdlib>
#include <cstring>
#include <fstream>
#include <sstream>

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

HostProperties::HostProperties(std::string path) : path_(std::move(path)) {}

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

void HostProperties::ReloadIfChanged() {
    struct stat st {};
    if (stat(path_.c_str(), &st) != 0) {
        values_.clear();
        loaded_ = false;
        return;
    }
    if (loaded_ && st.st_size == size_ && st.st_mtim.tv_sec == mtime_.tv_sec &&
        st.st_mtim.tv_nsec == mtime_.tv_nsec) {
        return;
    }
    std::ifstream f(path_);
    std::stringstream text;
    text << f.rdbuf();
    values_ = Parse(text.str());
    loaded_ = true;
    mtime_ = st.st_mtim;
    size_ = st.st_size;
}

bool HostProperties::Lookup(const std::string& key, std::string* value) {
    std::lock_guard<std::mutex> hold(mutex_);
    ReloadIfChanged();
    auto it = values_.find(key);
    if (it == values_.end() || it->second.empty()) return false;
    *value = it->second;
    return true;
}

int HostProperties::Get(const char* key, char* value, const char* default_value) {
    std::lock_guard<std::mutex> hold(mutex_);
    ReloadIfChanged();
    auto it = key != nullptr ? values_.find(key) : values_.end();
    // As on the television, an empty value reads as unset.
    if (it != values_.end() && !it->second.empty()) return CopyOut(it->second.c_str(), value);
    return CopyOut(default_value != nullptr ? default_value : "", value);
}

}  // namespace host
}  // namespace platform
