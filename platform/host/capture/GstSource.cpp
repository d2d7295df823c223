#include "platform/host/capture/GstSource.h"

#include "platform/host/HostModule.h"
#include "sync/thread_mutex.h"

namespace platform {
namespace host {
namespace {

// Loads the module once; a failure is tried again at the next start. It is never unloaded:
// GLib and GStreamer cannot be.
LiveSourceFactory LoadModule(std::string* error) {
    static thread_mutex mutex;
    static LiveSourceFactory factory = nullptr;
    thread_mutex::Scoped hold(mutex);
    if (factory == nullptr) {
        factory = reinterpret_cast<LiveSourceFactory>(
            LoadModuleSymbol("ORVEX_HOST_GST_MODULE", ORVEX_HOST_GST_MODULE_NAME,
                             ORVEX_HOST_GST_MODULE_PATH, kLiveSourceFactory, error));
    }
    return factory;
}

}  // namespace

GstSource::GstSource() = default;
GstSource::~GstSource() { stop(); }

bool GstSource::start(const std::string& description, std::string* error, bool wait_first) {
    stop();
    return startPipeline(description, error, wait_first);
}

bool GstSource::startScreen(const std::string& node, const std::string& conversion,
                            std::string* error, bool wait_first) {
    stop();
    return load(error) && live_->startScreen(node, conversion, wait_first, error);
}

bool GstSource::load(std::string* error) {
    if (live_ != nullptr) return true;
    LiveSourceFactory create = LoadModule(error);
    if (create == nullptr) return false;
    live_.reset(create());
    if (live_ == nullptr) *error = "out of memory";
    return live_ != nullptr;
}

bool GstSource::startPipeline(const std::string& description, std::string* error, bool wait_first) {
    return load(error) && live_->start(description, wait_first, error);
}

bool GstSource::startInChild(const std::string& child, int width, int height, int fps,
                             std::string* error, bool wait_first) {
    stop();
    auto launched = std::make_unique<LaunchChild>();
    if (!launched->start(child, error)) return false;
    // fdsrc leaves the descriptor open: the child object closes it after the pipeline stops.
    std::string reader =
        "fdsrc fd=" + std::to_string(launched->output()) +
        " blocksize=65536 ! rawvideoparse format=i420 width=" + std::to_string(width) +
        " height=" + std::to_string(height) + " framerate=" + std::to_string(fps) +
        "/1 ! appsink name=orvexsink max-buffers=2 drop=true";
    child_ = std::move(launched);
    if (startPipeline(reader, error, wait_first)) return true;
    // The reader sees only the pipe's end; the child says why.
    std::string reason = live_ != nullptr ? child_->why() : std::string();
    if (!reason.empty()) *error = reason;
    stop();
    return false;
}

void GstSource::stop() {
    if (live_ != nullptr) live_->stop();
    child_.reset();
}

int GstSource::childPid() const { return child_ != nullptr ? child_->pid() : -1; }

bool GstSource::ended(std::string* why) {
    if (live_ == nullptr || !live_->ended(why)) {
        if (child_ != nullptr) child_->drainErrors();
        return false;
    }
    if (child_ != nullptr) {
        std::string reason = child_->why();
        if (!reason.empty()) *why = reason;
    }
    return true;
}

bool GstSource::latestFrame(uint8_t* i420, int width, int height) {
    return live_ != nullptr && live_->latestFrame(i420, width, height);
}

size_t GstSource::readBytes(uint8_t* out, size_t size, int timeout_ms) {
    return live_ != nullptr ? live_->readBytes(out, size, timeout_ms) : 0;
}

}  // namespace host
}  // namespace platform
