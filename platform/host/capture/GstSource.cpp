#include "platform/host/capture/GstSource.h"

#include <dlfcn.h>
#include <unistd.h>

#include <cstdlib>
#include <mutex>

namespace platform {
namespace host {
namespace {

std::string ModulePath() {
    const char* chosen = getenv("ORVEX_HOST_GST_MODULE");
    if (chosen != nullptr && chosen[0] != '\0') return chosen;
    // An installed service keeps the module beside itself; test programs elsewhere in the
    // build tree find it where the build put it.
    char exe[4096];
    ssize_t n = readlink("/proc/self/exe", exe, sizeof exe - 1);
    if (n > 0) {
        std::string path(exe, static_cast<size_t>(n));
        path = path.substr(0, path.rfind('/') + 1) + ORVEX_HOST_GST_MODULE_NAME;
        if (access(path.c_str(), F_OK) == 0) return path;
    }
    return ORVEX_HOST_GST_MODULE_PATH;
}

// Loads the module once; a failure is tried again at the next start. It is never unloaded:
// GLib and GStreamer cannot be.
LiveSourceFactory LoadModule(std::string* error) {
    static std::mutex mutex;
    static LiveSourceFactory factory = nullptr;
    std::lock_guard<std::mutex> hold(mutex);
    if (factory != nullptr) return factory;
    std::string path = ModulePath();
    void* module = dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL);
    void* entry = module != nullptr ? dlsym(module, kLiveSourceFactory) : nullptr;
    if (entry == nullptr) {
        const char* why = dlerror();
        *error = std::string("cannot load ") + ORVEX_HOST_GST_MODULE_NAME + ": " +
                 (why != nullptr ? why : path);
        if (module != nullptr) dlclose(module);
        return nullptr;
    }
    factory = reinterpret_cast<LiveSourceFactory>(entry);
    return factory;
}

}  // namespace

GstSource::GstSource() = default;
GstSource::~GstSource() { stop(); }

bool GstSource::start(const std::string& description, std::string* error) {
    stop();
    if (live_ == nullptr) {
        LiveSourceFactory create = LoadModule(error);
        if (create == nullptr) return false;
        live_.reset(create());
        if (live_ == nullptr) {
            *error = "out of memory";
            return false;
        }
    }
    return live_->start(description, error);
}

void GstSource::stop() {
    if (live_ != nullptr) live_->stop();
}

bool GstSource::ended(std::string* why) { return live_ != nullptr && live_->ended(why); }

bool GstSource::latestFrame(uint8_t* i420, int width, int height) {
    return live_ != nullptr && live_->latestFrame(i420, width, height);
}

size_t GstSource::readBytes(uint8_t* out, size_t size, int timeout_ms) {
    return live_ != nullptr ? live_->readBytes(out, size, timeout_ms) : 0;
}

}  // namespace host
}  // namespace platform
