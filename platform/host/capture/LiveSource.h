#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

namespace platform {
namespace host {

// What GstSource asks of the GStreamer module (liborvex_host_gst.so), which is loaded only
// when a live source starts, so that GStreamer and GLib stay unmapped for the pattern and the
// tone. The calls mean what GstSource's do; both sides are built by the same build.
class LiveSource {
public:
    virtual ~LiveSource() = default;
    virtual bool start(const std::string& description, bool wait_first, std::string* error) = 0;
    virtual bool startScreen(const std::string& node, const std::string& conversion,
                             bool wait_first, std::string* error) = 0;
    virtual bool waiting() const = 0;
    virtual void stop() = 0;
    virtual bool running() const = 0;
    virtual bool ended(std::string* why) = 0;
    virtual bool latestFrame(uint8_t* i420, int width, int height) = 0;
    virtual uint64_t lastFrameTimeNs() const = 0;
    virtual size_t readBytes(uint8_t* out, size_t size, int timeout_ms) = 0;
};

// The module's one entry point: a new, idle source the caller owns.
using LiveSourceFactory = LiveSource* (*)();
constexpr char kLiveSourceFactory[] = "orvex_host_gst_create_source";

}  // namespace host
}  // namespace platform
