#include <gst/app/gstappsink.h>
#include <gst/gst.h>
#include <gst/video/video.h>

#include <algorithm>
#include <cstring>
#include <mutex>
#include <new>

#include "platform/host/capture/LiveSource.h"

namespace platform {
namespace host {
namespace {

constexpr uint64_t kFirstSampleWaitNs = 3000000000u;
constexpr uint64_t kPollNs = 50000000u;

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
    void stop() override;
    bool running() const override { return pipeline_ != nullptr; }
    bool ended(std::string* why) override;
    bool latestFrame(uint8_t* i420, int width, int height) override;
    uint64_t lastFrameTimeNs() const override { return last_pts_ns_; }
    size_t readBytes(uint8_t* out, size_t size, int timeout_ms) override;

private:
    GstSample* pull(uint64_t timeout_ns);

    GstElement* pipeline_ = nullptr;
    GstElement* sink_ = nullptr;
    GstSample* pending_ = nullptr;
    size_t pending_offset_ = 0;
    uint64_t last_pts_ns_ = 0;
};

bool GstPipelineSource::start(const std::string& description, bool wait_first, std::string* error) {
    stop();
    if (!InitOnce(error)) return false;
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
    bool failed = gst_element_set_state(pipeline_, GST_STATE_PLAYING) == GST_STATE_CHANGE_FAILURE;
    std::string why;
    // A pull returns at once at the end of the stream, so the wait is measured, not counted.
    const int64_t until_us = g_get_monotonic_time() + kFirstSampleWaitNs / 1000;
    while (wait_first && g_get_monotonic_time() < until_us) {
        if (ended(&why)) {
            failed = true;
            break;
        }
        if (failed) break;
        pending_ = pull(kPollNs);
        if (pending_ != nullptr) break;
    }
    if (failed && why.empty()) ended(&why);
    if (failed) {
        *error = why.empty() ? "the pipeline does not start" : why;
        stop();
        return false;
    }
    // A live source that is slow to deliver is not an error: frames come when they come.
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
}

bool GstPipelineSource::ended(std::string* why) {
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
