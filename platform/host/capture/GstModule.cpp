#include <gst/app/gstappsink.h>
#include <gst/gst.h>
#include <gst/video/video.h>

#include <algorithm>
#include <cstring>
#include <memory>
#include <mutex>
#include <new>

#include "platform/host/capture/LiveSource.h"
#include "platform/host/capture/ScreenCast.h"

namespace platform {
namespace host {
namespace {

constexpr uint64_t kFirstSampleWaitNs = 3000000000u;
constexpr uint64_t kPollNs = 50000000u;
// A still screen sends no pictures; pipewiresrc then sends the last one again this often...
constexpr int kKeepaliveMs = 1000;
// ...so a screen silent for this long is gone. pipewiresrc itself reports nothing when the
// compositor or PipeWire goes away: it just stops.
constexpr gint64 kSilentUs = 4000000;

bool InitOnce(std::string* error) {
    static std::once_flag once;
    static std::string failure;
    std::call_once(once, [] {
        GError* err = nullptr;
        if (!gst_init_check(nullptr, nullptr, &err)) {
            failure = err != nullptr ? err->message : "GStreamer cannot start";
            g_clear_error(&err);
        }
    });
    if (failure.empty()) return true;
    *error = failure;
    return false;
}

// Pops the first error or end-of-stream message, dropping the bus's other messages so that
// they do not pile up while streaming.
bool PopEnd(GstElement* pipeline, std::string* why) {
    GstBus* bus = gst_element_get_bus(pipeline);
    GstMessage* msg =
        gst_bus_pop_filtered(bus, static_cast<GstMessageType>(GST_MESSAGE_ERROR | GST_MESSAGE_EOS));
    gst_object_unref(bus);
    if (msg == nullptr) return false;
    if (GST_MESSAGE_TYPE(msg) == GST_MESSAGE_EOS) {
        *why = "end of stream";
    } else {
        GError* err = nullptr;
        gst_message_parse_error(msg, &err, nullptr);
        *why = err != nullptr ? err->message : "error";
        g_clear_error(&err);
    }
    gst_message_unref(msg);
    return true;
}

// One GStreamer pipeline that ends in an appsink named "orvexsink", and the samples it yields.
class GstPipelineSource final : public LiveSource {
public:
    GstPipelineSource() = default;
    ~GstPipelineSource() override { stop(); }
    GstPipelineSource(const GstPipelineSource&) = delete;
    GstPipelineSource& operator=(const GstPipelineSource&) = delete;

    bool start(const std::string& description, bool wait_first, std::string* error) override;
    bool startScreen(const std::string& node, const std::string& conversion, bool wait_first,
                     std::string* error) override;
    bool waiting() const override { return screen_ && pipeline_ == nullptr; }
    void stop() override;
    bool running() const override { return pipeline_ != nullptr || screen_; }
    bool ended(std::string* why) override;
    bool latestFrame(uint8_t* i420, int width, int height) override;
    uint64_t lastFrameTimeNs() const override { return last_pts_ns_; }
    size_t readBytes(uint8_t* out, size_t size, int timeout_ms) override;

private:
    GstSample* pull(uint64_t timeout_ns);
    bool launch(const std::string& description, std::string* error);
    bool waitFirst(std::string* error);
    bool launchScreen(const std::string& target, int fd, std::string* error);
    bool screenEnded(std::string* why);

    // A screen: the session it comes through (none for a PipeWire node named by the
    // operator), and what turns its pictures into the asked ones.
    bool screen_ = false;
    std::unique_ptr<ScreenCast> cast_;
    std::string conversion_;
    gint64 last_sample_us_ = 0;

    GstElement* pipeline_ = nullptr;
    GstElement* sink_ = nullptr;
    GstSample* pending_ = nullptr;
    size_t pending_offset_ = 0;
    uint64_t last_pts_ns_ = 0;
};

bool GstPipelineSource::start(const std::string& description, bool wait_first, std::string* error) {
    stop();
    if (!InitOnce(error) || !launch(description, error)) return false;
    return !wait_first || waitFirst(error);
}

bool GstPipelineSource::launch(const std::string& description, std::string* error) {
    GError* err = nullptr;
    GstElement* pipeline = gst_parse_launch(description.c_str(), &err);
    if (pipeline == nullptr || err != nullptr) {
        *error = err != nullptr ? err->message : "the pipeline does not parse";
        g_clear_error(&err);
        if (pipeline != nullptr) gst_object_unref(pipeline);
        return false;
    }
    // A description of a single element comes back as that element, not as a bin.
    GstElement* sink =
        GST_IS_BIN(pipeline) ? gst_bin_get_by_name(GST_BIN(pipeline), "orvexsink") : nullptr;
    if (sink == nullptr || !GST_IS_APP_SINK(sink)) {
        *error = "the pipeline has no appsink";
        if (sink != nullptr) gst_object_unref(sink);
        gst_object_unref(pipeline);
        return false;
    }
    pipeline_ = pipeline;
    sink_ = sink;
    if (gst_element_set_state(pipeline_, GST_STATE_PLAYING) != GST_STATE_CHANGE_FAILURE) {
        return true;
    }
    std::string why;
    PopEnd(pipeline_, &why);
    *error = why.empty() ? "the pipeline does not start" : why;
    stop();
    return false;
}

bool GstPipelineSource::waitFirst(std::string* error) {
    std::string why;
    // A pull returns at once at the end of the stream, so the wait is measured, not counted.
    const int64_t until_us = g_get_monotonic_time() + kFirstSampleWaitNs / 1000;
    while (g_get_monotonic_time() < until_us) {
        if (ended(&why)) {
            *error = why.empty() ? "the pipeline does not start" : why;
            stop();
            return false;
        }
        if (pipeline_ == nullptr) {
            g_usleep(kPollNs / 1000);  // the desktop has not answered yet
            continue;
        }
        pending_ = pull(kPollNs);
        if (pending_ != nullptr) {
            last_sample_us_ = g_get_monotonic_time();
            break;
        }
    }
    // A live source that is slow to deliver is not an error: frames come when they come.
    return true;
}

bool GstPipelineSource::startScreen(const std::string& node, const std::string& conversion,
                                    bool wait_first, std::string* error) {
    stop();
    if (!InitOnce(error)) return false;
    screen_ = true;
    conversion_ = conversion;
    if (node.empty()) {
        cast_ = std::make_unique<ScreenCast>();
    } else {
        // pipewiresrc takes a node's number as its path, anything else as a name.
        bool number = node.find_first_not_of("0123456789") == std::string::npos;
        if (!launchScreen((number ? "path=" : "target-object=") + node, -1, error)) {
            stop();
            return false;
        }
    }
    return !wait_first || waitFirst(error);
}

bool GstPipelineSource::launchScreen(const std::string& target, int fd, std::string* error) {
    // pipewiresrc makes a copy of the descriptor for itself.
    std::string head = "pipewiresrc " + target + " keepalive-time=" + std::to_string(kKeepaliveMs);
    if (fd >= 0) head += " fd=" + std::to_string(fd);
    last_sample_us_ = g_get_monotonic_time();
    return launch(head + " ! " + conversion_, error);
}

bool GstPipelineSource::screenEnded(std::string* why) {
    if (cast_ != nullptr) {
        int fd = -1;
        uint32_t node = 0;
        ScreenCast::State state = cast_->poll(&fd, &node, why);
        if (state == ScreenCast::State::kFailed) return true;
        if (state == ScreenCast::State::kReady && pipeline_ == nullptr &&
            !launchScreen("path=" + std::to_string(node), fd, why)) {
            return true;
        }
    }
    if (pipeline_ == nullptr || g_get_monotonic_time() - last_sample_us_ < kSilentUs) return false;
    *why = "no picture from PipeWire for " + std::to_string(kSilentUs / 1000000) + " s";
    return true;
}

void GstPipelineSource::stop() {
    if (pending_ != nullptr) gst_sample_unref(pending_);
    pending_ = nullptr;
    pending_offset_ = 0;
    if (pipeline_ != nullptr) gst_element_set_state(pipeline_, GST_STATE_NULL);
    if (sink_ != nullptr) gst_object_unref(sink_);
    if (pipeline_ != nullptr) gst_object_unref(pipeline_);
    sink_ = nullptr;
    pipeline_ = nullptr;
    cast_.reset();
    screen_ = false;
}

bool GstPipelineSource::ended(std::string* why) {
    if (screen_ && screenEnded(why)) return true;
    if (pipeline_ == nullptr) return false;
    if (PopEnd(pipeline_, why)) return true;
    // A stream that ends before the pipeline plays posts no message; the sink knows.
    if (!gst_app_sink_is_eos(GST_APP_SINK(sink_))) return false;
    *why = "end of stream";
    return true;
}

GstSample* GstPipelineSource::pull(uint64_t timeout_ns) {
    return gst_app_sink_try_pull_sample(GST_APP_SINK(sink_), timeout_ns);
}

bool GstPipelineSource::latestFrame(uint8_t* i420, int width, int height) {
    if (pipeline_ == nullptr) return false;
    GstSample* sample = pending_;
    pending_ = nullptr;
    while (GstSample* newer = pull(0)) {
        if (sample != nullptr) gst_sample_unref(sample);
        sample = newer;
    }
    if (sample == nullptr) return false;
    last_sample_us_ = g_get_monotonic_time();
    bool copied = false;
    GstVideoInfo info;
    GstBuffer* buffer = gst_sample_get_buffer(sample);
    if (buffer != nullptr && gst_video_info_from_caps(&info, gst_sample_get_caps(sample)) &&
        GST_VIDEO_INFO_FORMAT(&info) == GST_VIDEO_FORMAT_I420 &&
        GST_VIDEO_INFO_WIDTH(&info) == width && GST_VIDEO_INFO_HEIGHT(&info) == height) {
        GstVideoFrame frame;
        if (gst_video_frame_map(&frame, &info, buffer, GST_MAP_READ)) {
            uint8_t* out = i420;
            for (int p = 0; p < 3; ++p) {
                int w = p == 0 ? width : width / 2, h = p == 0 ? height : height / 2;
                const auto* in = static_cast<const uint8_t*>(GST_VIDEO_FRAME_PLANE_DATA(&frame, p));
                int stride = GST_VIDEO_FRAME_PLANE_STRIDE(&frame, p);
                for (int row = 0; row < h; ++row, out += w) {
                    memcpy(out, in + static_cast<size_t>(row) * stride, w);
                }
            }
            gst_video_frame_unmap(&frame);
            if (GST_BUFFER_PTS_IS_VALID(buffer)) last_pts_ns_ = GST_BUFFER_PTS(buffer);
            copied = true;
        }
    }
    gst_sample_unref(sample);
    return copied;
}

size_t GstPipelineSource::readBytes(uint8_t* out, size_t size, int timeout_ms) {
    if (pipeline_ == nullptr || size == 0) return 0;
    if (pending_ == nullptr) {
        pending_ = pull(static_cast<uint64_t>(timeout_ms) * 1000000u);
        pending_offset_ = 0;
        if (pending_ == nullptr) return 0;
    }
    size_t copied = 0;
    GstBuffer* buffer = gst_sample_get_buffer(pending_);
    GstMapInfo map;
    if (buffer != nullptr && gst_buffer_map(buffer, &map, GST_MAP_READ)) {
        if (pending_offset_ < map.size) {
            copied = std::min(size, map.size - pending_offset_);
            memcpy(out, map.data + pending_offset_, copied);
            pending_offset_ += copied;
        }
        bool done = pending_offset_ >= map.size;
        gst_buffer_unmap(buffer, &map);
        if (!done) return copied;
    }
    gst_sample_unref(pending_);
    pending_ = nullptr;
    pending_offset_ = 0;
    return copied;
}

}  // namespace
}  // namespace host
}  // namespace platform

// The module's only exported symbol (kLiveSourceFactory names it).
extern "C" __attribute__((visibility("default"))) platform::host::LiveSource*
orvex_host_gst_create_source() {
    return new (std::nothrow) platform::host::GstPipelineSource();
}
