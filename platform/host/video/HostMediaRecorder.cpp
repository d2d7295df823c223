#include "platform/host/video/HostMediaRecorder.h"

#include "platform/host/HostClock.h"

#include <pthread.h>
#include <time.h>

#include <algorithm>
#include <chrono>
#include <cinttypes>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <system_error>

#include "platform/Ports.h"
#include "platform/host/HostLog.h"
#include "platform/host/capture/GstSource.h"
#include "sync/thread_mutex.h"

namespace platform {
namespace host {

namespace {

// Set by a viewer that joined; taken by whichever recorder encodes the next picture.
std::atomic<bool> g_key_frame_wanted{false};

// The same clock HostClockMs reads, in nanoseconds, so frame times land on its milliseconds.
uint64_t MonotonicNs() {
    timespec ts{};
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<uint64_t>(ts.tv_sec) * 1000000000u + static_cast<uint64_t>(ts.tv_nsec);
}

std::string Trim(const std::string& s) {
    size_t b = s.find_first_not_of(" \t"), e = s.find_last_not_of(" \t");
    return b == std::string::npos ? std::string() : s.substr(b, e - b + 1);
}

// Whether flattened camera parameters select the sub window (traveling-mode 4).
bool SubWindow(const std::string& flattened) {
    size_t at = 0;
    while (at < flattened.size()) {
        size_t end = flattened.find(';', at);
        if (end == std::string::npos) end = flattened.size();
        if (flattened.compare(at, end - at, "traveling-mode=4") == 0) return true;
        at = end + 1;
    }
    return false;
}

}  // namespace

HostMediaRecorder::HostMediaRecorder() = default;
HostMediaRecorder::~HostMediaRecorder() { stop(); }

int HostMediaRecorder::settable() const { return state_ == State::kIdle ? 0 : kInvalidOperation; }

int HostMediaRecorder::setCamera(Camera& camera) {
    if (int rc = settable()) return rc;
    // The platform's recorder cannot record from a camera its owner still holds.
    if (camera.locked()) return kInvalidOperation;
    sub_ = SubWindow(camera.getParameters());
    return 0;
}

int HostMediaRecorder::setVideoSource(int source) {
    if (int rc = settable()) return rc;
    return source == 0 || source == 1 ? 0 : kBadValue;  // DEFAULT or CAMERA
}

int HostMediaRecorder::setOutputFormat(int format) {
    if (int rc = settable()) return rc;
    if (format != kOutputFormatOrvex) return kBadValue;
    format_set_ = true;
    return 0;
}

int HostMediaRecorder::setVideoEncoder(int encoder) {
    if (int rc = settable()) return rc;
    if (encoder != kVideoEncoderH264) return kBadValue;
    encoder_set_ = true;
    return 0;
}

int HostMediaRecorder::setVideoSize(int width, int height) {
    if (int rc = settable()) return rc;
    if (width < 16 || height < 16 || width > 4096 || height > 4096 || (width | height) & 1) {
        return kBadValue;
    }
    width_ = width;
    height_ = height;
    return 0;
}

int HostMediaRecorder::setVideoFrameRate(int fps) {
    if (int rc = settable()) return rc;
    if (fps < 1 || fps > 120) return kBadValue;
    fps_ = fps;
    return 0;
}

int HostMediaRecorder::setParameters(const std::string& params) {
    if (int rc = settable()) return rc;
    size_t at = 0;
    while (at <= params.size()) {
        size_t end = params.find(';', at);
        if (end == std::string::npos) end = params.size();
        std::string pair = params.substr(at, end - at);
        at = end + 1;
        size_t eq = pair.find('=');
        if (eq == std::string::npos || Trim(pair.substr(0, eq)) != "video-param-encoding-bitrate") {
            continue;
        }
        std::string value = Trim(pair.substr(eq + 1));
        char* rest = nullptr;
        long bps = strtol(value.c_str(), &rest, 10);
        if (value.empty() || *rest != '\0' || bps < 1000 || bps > 200000000) return kBadValue;
        bitrate_ = static_cast<int>(bps);
    }
    return 0;
}

int HostMediaRecorder::prepare() {
    if (state_ != State::kIdle || !format_set_ || !encoder_set_) return kInvalidOperation;
    pattern_ = std::make_unique<TestPattern>(width_, height_);
    // Black, until a live source's first frame.
    size_t luma = static_cast<size_t>(pattern_->width()) * pattern_->height();
    picture_.assign(pattern_->frameSize(), TestPattern::kNeutralUV);
    memset(picture_.data(), TestPattern::kBlackY, luma);
    // Reserves the parcel's storage for a unit far larger than the pattern ever gives, so the
    // recording allocates nothing per frame.
    parcel_.clear();
    parcel_.writeInt32(0);
    parcel_.writeInplace(picture_.data(), picture_.size());
    parcel_.writeInt32(0);
    parcel_.clear();
    if (int rc = openSource()) return rc;
    // "none" encodes nothing (another binder client sends the frames): no OpenH264 at all.
    int rc = source_.kind == SourceChoice::kNone || encoder_.Open(width_, height_, fps_, bitrate_)
                 ? 0
                 : kUnknownError;
    if (rc != 0) {
        live_.reset();
        return rc;
    }
    key_seen_ = false;
    state_ = State::kPrepared;
    HostLogf(kLogDebug, "MediaRecorder::prepare %dx%d @ %d fps, %d bit/s", width_, height_, fps_,
             bitrate_);
    return 0;
}

namespace {

constexpr uint64_t kRetryFirstMs = 1000;
constexpr uint64_t kRetryMaxMs = 10000;
constexpr uint64_t kFirstFrameMs = 3000;

}  // namespace

int HostMediaRecorder::openSource() {
    source_ = ChooseVideoSource(sub_);
    label_ = sub_ && source_.kind == SourceChoice::kPattern ? TestPattern::Label::kSub
                                                            : TestPattern::Label::kNone;
    live_.reset();
    trying_ = false;
    want_live_ = source_.live();
    if (!want_live_) return 0;
    std::string error;
    if (!startLive(true, &error)) {
        // The sound goes on: this track sends "no signal" and tries again.
        HostLogf(kLogWarn,
                 "MediaRecorder: video source %s cannot start: %s; showing \"no signal\", trying "
                 "again in 1 s",
                 source_.text.c_str(), error.c_str());
        label_ = TestPattern::Label::kNoSignal;
        retryLater(kRetryFirstMs);
        return 0;
    }
    HostLogf(kLogDebug, "MediaRecorder: video from %s", source_.text.c_str());
    if (live_->waiting()) {
        HostLogf(kLogWarn,
                 "MediaRecorder: video source %s: waiting for the desktop to allow the screen "
                 "cast; showing \"no signal\"",
                 source_.text.c_str());
        label_ = TestPattern::Label::kNoSignal;
    }
    return 0;
}

bool HostMediaRecorder::startLive(bool wait_first, std::string* error) {
    // The pattern's size: the same even size the encoder is given.
    const int w = pattern_->width(), h = pattern_->height();
    auto live = std::make_unique<GstSource>();
    std::string child = ChildVideoPipeline(source_, w, h, fps_);
    bool started = false;
    if (source_.throughPipeWire()) {
        started = live->startScreen(source_.kind == SourceChoice::kPipeWire ? source_.arg : "",
                                    VideoConversion(w, h), error, wait_first);
    } else if (child.empty()) {
        started = live->start(VideoPipeline(source_, w, h, fps_), error, wait_first);
    } else {
        started = live->startInChild(child, w, h, fps_, error, wait_first);
    }
    if (!started) return false;
    live_ = std::move(live);
    return true;
}

void HostMediaRecorder::retryLater(uint64_t delay_ms) {
    retry_ms_ = delay_ms;
    retry_at_ms_ = HostClockMs() + delay_ms;
}

void HostMediaRecorder::takePicture(uint32_t frame, uint64_t ms) {
    const uint64_t now = HostClockMs();
    if (live_ != nullptr && live_->running()) {
        std::string why;
        bool ended = live_->ended(&why);
        if (!ended) {
            // No new frame since the last one: the last picture is sent again.
            bool fresh = live_->latestFrame(picture_.data(), pattern_->width(), pattern_->height());
            if (!trying_) {
                // Until the desktop lets the screen be seen, "no signal" (drawn below).
                if (fresh || !live_->waiting()) return;
            } else if (fresh) {
                HostLogf(kLogWarn, "MediaRecorder: video source %s is back", source_.text.c_str());
                trying_ = false;
                label_ = TestPattern::Label::kNone;
                return;
            } else {
                // A source that opens but never gives a frame; the desktop asking the person
                // whether to share the screen is no such source.
                if (live_->waiting()) trying_until_ms_ = now + kFirstFrameMs;
                ended = now >= trying_until_ms_;
            }
        }
        if (ended && trying_) {
            // Another attempt that failed: quietly, as the first failure said it all.
            HostLogf(kLogDebug, "MediaRecorder: video source %s: still failing: %s",
                     source_.text.c_str(), why.empty() ? "no picture" : why.c_str());
            live_.reset();
            trying_ = false;
            retryLater(std::min(retry_ms_ * 2, kRetryMaxMs));
        } else if (ended) {
            HostLogf(kLogWarn,
                     "MediaRecorder: video source %s stopped: %s; showing \"no signal\", "
                     "trying again in 1 s",
                     source_.text.c_str(), why.c_str());
            live_.reset();
            label_ = TestPattern::Label::kNoSignal;
            retryLater(kRetryFirstMs);
        }
    } else if (want_live_ && live_ == nullptr && now >= retry_at_ms_) {
        // Started without waiting for its first frame, which would hold up this thread's
        // pictures: the source is back when a frame comes.
        std::string error;
        if (startLive(false, &error)) {
            trying_ = true;
            trying_until_ms_ = now + kFirstFrameMs;
        } else {
            HostLogf(kLogDebug, "MediaRecorder: video source %s: still failing: %s",
                     source_.text.c_str(), error.c_str());
            retryLater(std::min(retry_ms_ * 2, kRetryMaxMs));
        }
    }
    pattern_->draw(frame, ms, picture_.data(), label_);
}

int HostMediaRecorder::start() {
    if (state_ != State::kPrepared) return kInvalidOperation;
    {
        thread_mutex::Scoped hold(mutex_);
        stopping_ = false;
    }
    try {
        thread_ = std::thread(&HostMediaRecorder::run, this);
    } catch (const std::system_error& e) {
        HostLogf(kLogError, "MediaRecorder::start: no encoder thread (%s)", e.what());
        return kUnknownError;
    }
    state_ = State::kRecording;
    HostLogf(kLogDebug, "MediaRecorder::start");
    return 0;
}

int HostMediaRecorder::stop() {
    if (thread_.joinable()) {
        {
            thread_mutex::Scoped hold(mutex_);
            stopping_ = true;
        }
        wake_.notify_all();
        thread_.join();
        HostLogf(kLogDebug,
                 "MediaRecorder::stop: %" PRIu64 " frames delivered, %" PRIu64
                 " transactions failed, %" PRIu64 " frames dropped, %" PRIu64
                 " skipped by the encoder",
                 framesDelivered(), failedTransacts(), framesDropped(), framesSkipped());
    }
    encoder_.Close();
    live_.reset();
    if (state_ != State::kReleased) state_ = State::kIdle;
    return 0;
}

int HostMediaRecorder::release() {
    stop();
    state_ = State::kReleased;
    return 0;
}

HostMediaRecorder::Encoded HostMediaRecorder::encodeFrame(uint32_t frame, uint64_t ms) {
    if (state_ != State::kPrepared || !encoder_.opened()) return Encoded{};
    return encodeNext(frame, ms);
}

HostMediaRecorder::Encoded HostMediaRecorder::encodeNext(uint32_t frame, uint64_t ms) {
    takePicture(frame, ms);
    // Force a key frame when waiting for the next frame would stretch the gap past the
    // interval (1 ms of slack absorbs the truncation of frame times to milliseconds).
    uint64_t since = ms - last_key_ms_;
    bool force_key = !key_seen_ || since * fps_ + 1000 > (kKeyIntervalMs + 1) * fps_ ||
                     g_key_frame_wanted.exchange(false, std::memory_order_relaxed);
    Encoded out = encoder_.Encode(picture_.data(), ms, force_key);
    if (out.skipped) skipped_.fetch_add(1, std::memory_order_relaxed);
    if (out.count == 0) return out;
    if (out.key) {
        key_seen_ = true;
        last_key_ms_ = ms;
    }
    return out;
}

void HostMediaRecorder::deliver(const Encoded& frame) {
    int status = kBinderOk;
    for (size_t i = 0; i < frame.count && status == kBinderOk; ++i) {
        parcel_.clear();
        parcel_.writeInt32(static_cast<int32_t>(frame.nals[i].size));
        parcel_.writeInplace(frame.nals[i].data, frame.nals[i].size);
        parcel_.writeInt32(0);
        status = Binder().transact(kFrameService, kFrameTransaction, parcel_);
    }
    if (status != kBinderOk) {
        // The service may not have registered yet: the frame is lost, the recording goes on,
        // and the next frame is a key frame so that the service can decode from its first one.
        failed_.fetch_add(1, std::memory_order_relaxed);
        key_seen_ = false;
        if (!failing_)
            HostLogf(kLogWarn, "MediaRecorder: %s does not take frames (%d)", kFrameService,
                     status);
        failing_ = true;
        return;
    }
    delivered_.fetch_add(1, std::memory_order_relaxed);
    if (failing_) HostLogf(kLogDebug, "MediaRecorder: %s takes frames again", kFrameService);
    failing_ = false;
}

void HostMediaRecorder::run() {
    pthread_setname_np(pthread_self(), "orvex-recorder");
    const uint64_t start_ns = MonotonicNs();
    const auto start_tp = std::chrono::steady_clock::now();
    const uint64_t period_ns = 1000000000u / fps_;
    uint64_t n = 0;
    thread_mutex::Scoped hold(mutex_);
    if (source_.kind == SourceChoice::kNone) {
        // The frames come from another binder client, such as orvex-feed: nothing to pace.
        while (!stopping_) wake_.wait(mutex_);
        return;
    }
    for (;;) {
        // Frame n is due at a fixed offset from the start, so waits never add up to drift.
        uint64_t due_ns = start_ns + n * 1000000000u / fps_;
        auto due_tp = start_tp + std::chrono::nanoseconds(due_ns - start_ns);
        while (!stopping_ && wake_.wait_until(mutex_, due_tp)) {
        }
        if (stopping_) break;
        // The frame is made unlocked so that stop is never kept waiting by an encode.
        mutex_.unlock();
        uint64_t now_ns = MonotonicNs();
        // More than a period late (a busy machine): leave the missed frames out rather than
        // sending a burst of stale ones.
        if (now_ns > due_ns + period_ns) {
            uint64_t behind = (now_ns - due_ns) / period_ns;
            n += behind;
            dropped_.fetch_add(behind, std::memory_order_relaxed);
            due_ns = start_ns + n * 1000000000u / fps_;
        }
        Encoded frame = encodeNext(static_cast<uint32_t>(n), due_ns / 1000000u);
        if (frame.size > 0) deliver(frame);
        ++n;
        mutex_.lock();
    }
}

bool HostMediaRecorderPort::RequestKeyFrame() {
    g_key_frame_wanted.store(true, std::memory_order_relaxed);
    return true;
}

std::shared_ptr<MediaRecorder> HostMediaRecorderPort::create(const std::string& package) {
    HostLogf(kLogDebug, "MediaRecorder(%s)", package.c_str());
    return std::make_shared<HostMediaRecorder>();
}

}  // namespace host
}  // namespace platform
