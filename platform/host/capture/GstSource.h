#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

struct _GstElement;
struct _GstSample;

namespace platform {
namespace host {

// One GStreamer pipeline that ends in an appsink named "orvexsink", and the samples it yields.
// Thread contract: one thread at a time (start on the capture thread, reads on the recording
// thread, stop after that thread has ended).
class GstSource {
public:
    GstSource() = default;
    ~GstSource();
    GstSource(const GstSource&) = delete;
    GstSource& operator=(const GstSource&) = delete;

    // Builds the pipeline and sets it playing, then waits (bounded) for its first sample or its
    // first error. False with GStreamer's own error text when it cannot run.
    bool start(const std::string& description, std::string* error);
    // Stops and frees the pipeline; nothing happens when it is not running.
    void stop();
    bool running() const { return pipeline_ != nullptr; }

    // Whether the pipeline has failed or reached its end since the last call; *why then holds
    // GStreamer's text (or "end of stream"). Cheap; allocates nothing while all is well.
    bool ended(std::string* why);

    // Video: copies the newest frame waiting (older ones are left out) into `i420`, tightly
    // packed planes of width x height. False when no new frame has come since the last call.
    bool latestFrame(uint8_t* i420, int width, int height);
    // Stream time of the last frame latestFrame copied, in nanoseconds.
    uint64_t lastFrameTimeNs() const { return last_pts_ns_; }

    // Audio: copies up to `size` bytes of the samples in arrival order, waiting at most
    // `timeout_ms` for one to come. The byte count, 0 when none came in time.
    size_t readBytes(uint8_t* out, size_t size, int timeout_ms);

private:
    _GstSample* pull(uint64_t timeout_ns);

    _GstElement* pipeline_ = nullptr;
    _GstElement* sink_ = nullptr;
    _GstSample* pending_ = nullptr;
    size_t pending_offset_ = 0;
    uint64_t last_pts_ns_ = 0;
};

}  // namespace host
}  // namespace platform
