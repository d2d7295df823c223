#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "platform/BinderPort.h"
#include "platform/CapturePorts.h"
#include "platform/host/capture/HostSources.h"
#include "platform/host/video/OpenH264Encoder.h"
#include "platform/host/video/TestPattern.h"
#include "sync/thread_mutex.h"

namespace platform {
namespace host {

class GstSource;

// The host's media recorder: between start and stop a thread takes a picture at the requested
// frame rate, encodes it as H.264 (Constrained Baseline, OpenH264) and sends every encoded
// frame to the binder service "orvex.rtp" the way the platform's recorder does. The picture is
// the test pattern or, as the host properties choose at prepare, the newest frame of a
// GStreamer source (screen, camera, pipeline); a source lost mid-stream gives way to the
// pattern marked "no signal". A camera set to the sub window picks the sub window's source.
// OpenH264 is loaded at the first prepare whose source is not "none".
// Thread contract: MediaRecorder calls and encodeFrame from one thread; between start and stop
// the recorder's own thread owns the encoder and buffers; the counters read from any thread.
class HostMediaRecorder final : public MediaRecorder {
public:
    static constexpr int kOutputFormatOrvex = 101;
    static constexpr int kVideoEncoderH264 = 2;
    static constexpr const char* kFrameService = "orvex.rtp";
    static constexpr uint32_t kFrameTransaction = 101;
    static constexpr uint64_t kKeyIntervalMs = 2000;
    // Status codes as Android numbers them.
    static constexpr int kBadValue = -22;
    static constexpr int kInvalidOperation = -38;
    static constexpr int kUnknownError = -2147483647 - 1;

    HostMediaRecorder();
    ~HostMediaRecorder() override;
    HostMediaRecorder(const HostMediaRecorder&) = delete;
    HostMediaRecorder& operator=(const HostMediaRecorder&) = delete;

    // Also notes whether the camera is set to the sub window (traveling-mode 4).
    int setCamera(Camera& camera) override;
    int setVideoSource(int source) override;
    int setOutputFormat(int format) override;
    int setVideoEncoder(int encoder) override;
    int setVideoSize(int width, int height) override;
    int setVideoFrameRate(int fps) override;
    // "key=value;key=value": reads video-param-encoding-bitrate (bits per second), accepts and
    // ignores the other keys.
    int setParameters(const std::string& params) override;
    int prepare() override;
    int start() override;
    int stop() override;
    int release() override;

    // One encoded frame: its NAL units, valid until the next frame.
    using Encoded = OpenH264Encoder::Frame;
    // The thread's work for one frame, minus the binder: takes frame `frame` as captured at
    // host clock time `ms` and encodes it. Only after prepare and before start, and never for
    // "none" (else empty); size 0 when the encoder skipped the frame.
    Encoded encodeFrame(uint32_t frame, uint64_t ms);

    int videoBitrate() const { return bitrate_; }
    uint64_t framesDelivered() const { return delivered_.load(std::memory_order_relaxed); }
    uint64_t failedTransacts() const { return failed_.load(std::memory_order_relaxed); }
    // The source prepare chose.
    const SourceChoice& source() const { return source_; }
    // Frames the thread had no time for (it was more than a frame period late) and left out.
    uint64_t framesDropped() const { return dropped_.load(std::memory_order_relaxed); }
    // Frames the encoder's rate control left out.
    uint64_t framesSkipped() const { return skipped_.load(std::memory_order_relaxed); }

private:
    enum class State { kIdle, kPrepared, kRecording, kReleased };

    int settable() const;
    int openSource();
    void takePicture(uint32_t frame, uint64_t ms);
    void run();
    Encoded encodeNext(uint32_t frame, uint64_t ms);
    void deliver(const Encoded& frame);
    bool startLive(bool wait_first, std::string* error);
    void retryLater(uint64_t delay_ms);

    State state_ = State::kIdle;
    bool format_set_ = false;
    bool encoder_set_ = false;
    int width_ = 1280;
    int height_ = 720;
    int fps_ = 30;
    int bitrate_ = 4000000;

    bool sub_ = false;
    SourceChoice source_;
    std::unique_ptr<GstSource> live_;
    // A live source that could not start or went away is tried again, after 1 s doubling to
    // 10 s; meanwhile the picture is the pattern marked "no signal".
    bool want_live_ = false;
    uint64_t retry_ms_ = 0;
    uint64_t retry_at_ms_ = 0;
    // A source started again that has not yet given a frame (until trying_until_ms_).
    bool trying_ = false;
    uint64_t trying_until_ms_ = 0;
    TestPattern::Label label_ = TestPattern::Label::kNone;
    std::unique_ptr<TestPattern> pattern_;
    OpenH264Encoder encoder_;
    std::vector<uint8_t> picture_;
    ParcelWriter parcel_;
    bool key_seen_ = false;
    uint64_t last_key_ms_ = 0;
    bool failing_ = false;

    std::thread thread_;
    thread_mutex mutex_;
    thread_condition wake_;
    bool stopping_ ORVEX_GUARDED_BY(mutex_) = false;

    std::atomic<uint64_t> delivered_{0};
    std::atomic<uint64_t> failed_{0};
    std::atomic<uint64_t> dropped_{0};
    std::atomic<uint64_t> skipped_{0};
};

// Every create gives a fresh HostMediaRecorder. Thread contract: any thread.
class HostMediaRecorderPort final : public MediaRecorderPort {
public:
    std::shared_ptr<MediaRecorder> create(const std::string& package) override;
    // The recording thread makes its next picture a key frame.
    bool RequestKeyFrame() override;
};

}  // namespace host
}  // namespace platform
