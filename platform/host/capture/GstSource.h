#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>

#include "platform/host/capture/LaunchChild.h"
#include "platform/host/capture/LiveSource.h"

namespace platform {
namespace host {

// One GStreamer pipeline that ends in an appsink named "orvexsink", and the samples it yields.
// GStreamer itself lives in liborvex_host_gst.so, loaded at the first start of any GstSource
// and kept for the life of the process: ORVEX_HOST_GST_MODULE names the file, else it is the
// one beside the executable, else the one the build made.
// Thread contract: one thread at a time (start on the capture thread, reads on the recording
// thread, stop after that thread has ended).
class GstSource {
public:
    GstSource();
    ~GstSource();
    GstSource(const GstSource&) = delete;
    GstSource& operator=(const GstSource&) = delete;

    // Builds the pipeline and sets it playing, then, when `wait_first`, waits (bounded) for its
    // first sample or its first error. False with GStreamer's own error text when it cannot
    // run, or with the module's name and the loader's reason when the module does not load.
    // Without the wait, a pipeline that fails later says so through ended().
    bool start(const std::string& description, std::string* error, bool wait_first = true);
    // Video whose capture runs in a gst-launch-1.0 process of its own (see LaunchChild):
    // `child` ends in "fdsink fd=3" and writes I420 frames of width x height at fps, which
    // this process reads from the pipe. Reasons name what the child said.
    bool startInChild(const std::string& child, int width, int height, int fps, std::string* error,
                      bool wait_first = true);
    // A screen through PipeWire: `node` names a PipeWire video node (its number or name), or
    // is empty to ask the desktop for a screen cast session first (see ScreenCast), which
    // goes on after this returns when the desktop is slow to answer. `conversion` is the rest
    // of the pipeline, from the first converter to the appsink. A screen that has sent
    // nothing for 4 s, its session ended or refused, ends the source.
    bool startScreen(const std::string& node, const std::string& conversion, std::string* error,
                     bool wait_first = true);
    // Whether a screen is still waiting for the desktop's answer (it may be asking the person).
    bool waiting() const { return live_ != nullptr && live_->waiting(); }
    // Stops and frees the pipeline; nothing happens when it is not running.
    void stop();
    bool running() const { return live_ != nullptr && live_->running(); }
    // The child's process id while one runs, else -1 (for the tests).
    int childPid() const;

    // Whether the pipeline has failed or reached its end since the last call; *why then holds
    // GStreamer's text (or "end of stream"). Cheap; allocates nothing while all is well.
    bool ended(std::string* why);

    // Video: copies the newest frame waiting (older ones are left out) into `i420`, tightly
    // packed planes of width x height. False when no new frame has come since the last call.
    bool latestFrame(uint8_t* i420, int width, int height);
    // Stream time of the last frame latestFrame copied, in nanoseconds.
    uint64_t lastFrameTimeNs() const { return live_ != nullptr ? live_->lastFrameTimeNs() : 0; }

    // Audio: copies up to `size` bytes of the samples in arrival order, waiting at most
    // `timeout_ms` for one to come. The byte count, 0 when none came in time.
    size_t readBytes(uint8_t* out, size_t size, int timeout_ms);

private:
    // Loads the module and makes the source, once.
    bool load(std::string* error);
    bool startPipeline(const std::string& description, std::string* error, bool wait_first);

    std::unique_ptr<LiveSource> live_;
    std::unique_ptr<LaunchChild> child_;
};

}  // namespace host
}  // namespace platform
