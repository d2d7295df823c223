#include "platform/host/video/HostMediaRecorder.h"

#include <dlfcn.h>
#include <pthread.h>
#include <time.h>
#include <wels/codec_api.h>

#include <chrono>
#include <cinttypes>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <mutex>
#include <system_error>

#include "media/AnnexB.h"
#include "platform/Ports.h"
#include "platform/host/capture/GstSource.h"
#include "platform/host/video/HostCamera.h"

namespace platform {
namespace host {
namespace {

constexpr char kTag[] = "orvex:::host";
// OpenH264 rate-controls up to this rate; faster schedules still run, just capped in the RC.
constexpr float kEncoderMaxFps = 60.0f;

void Note(const char* fmt, ...) __attribute__((format(printf, 1, 2)));
void Note(const char* fmt, ...) {
    char text[512];
    va_list args;
    va_start(args, fmt);
    vsnprintf(text, sizeof text, fmt, args);
    va_end(args);
    Log().Write(kLogIdSystem, kLogDebug, kTag, text);
}

void EncoderTrace(void*, int, const char* message) {
    Log().Write(kLogIdSystem, kLogError, kTag, message);
}

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

// Restaging a unit behind 4 bytes adds one byte to it; room for this many units per frame
// (OpenH264 writes a handful), past which further restaged units are left out.
constexpr size_t kMaxNalsPerFrame = 256;

// The two C entry points of OpenH264; the encoder itself is reached through its vtable.
struct OpenH264 {
    decltype(&WelsCreateSVCEncoder) create = nullptr;
    decltype(&WelsDestroySVCEncoder) destroy = nullptr;
};

// Loads OpenH264 at the first encoder and keeps it; a failure logs one line and is tried
// again at the next prepare. Null when it does not load.
const OpenH264* LoadOpenH264() {
    static std::mutex mutex;
    static OpenH264 api;
    std::lock_guard<std::mutex> hold(mutex);
    if (api.create != nullptr) return &api;
    void* library = dlopen(ORVEX_OPENH264_SONAME, RTLD_NOW | RTLD_LOCAL);
    OpenH264 found;
    if (library != nullptr) {
        found.create =
            reinterpret_cast<decltype(found.create)>(dlsym(library, "WelsCreateSVCEncoder"));
        found.destroy =
            reinterpret_cast<decltype(found.destroy)>(dlsym(library, "WelsDestroySVCEncoder"));
    }
    if (found.create == nullptr || found.destroy == nullptr) {
        const char* why = dlerror();
        std::string line = std::string("MediaRecorder: cannot load " ORVEX_OPENH264_SONAME ": ") +
                           (why != nullptr ? why : "no encoder entry points");
        Log().Write(kLogIdSystem, kLogError, kTag, line.c_str());
        if (library != nullptr) dlclose(library);
        return nullptr;
    }
    api = found;
    return &api;
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
    auto* host_camera = dynamic_cast<HostCamera*>(&camera);
    if (host_camera != nullptr && host_camera->locked()) return kInvalidOperation;
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
    // Room for a key frame far worse than the pattern ever gives; encodeNext grows it if not.
    frame_.assign(pattern_->frameSize() + 4096, 0);
    // Writing the largest frame once reserves the parcel's storage for the whole recording.
    parcel_.clear();
    parcel_.writeInt32(0);
    parcel_.writeInplace(frame_.data(), frame_.size());
    parcel_.writeInt32(0);
    parcel_.clear();
    if (int rc = openSource()) return rc;
    // "none" encodes nothing (another binder client sends the frames): no OpenH264 at all.
    int rc = source_.kind == SourceChoice::kNone ? 0 : openEncoder();
    if (rc != 0) {
        live_.reset();
        return rc;
    }
    key_seen_ = false;
    state_ = State::kPrepared;
    Note("MediaRecorder::prepare %dx%d @ %d fps, %d bit/s", width_, height_, fps_, bitrate_);
    return 0;
}

int HostMediaRecorder::openSource() {
    source_ = ChooseVideoSource(sub_);
    label_ = sub_ && source_.kind == SourceChoice::kPattern ? TestPattern::Label::kSub
                                                            : TestPattern::Label::kNone;
    live_.reset();
    if (!source_.live()) return 0;
    // The pattern's size: the same even size the encoder is given.
    std::string description = VideoPipeline(source_, pattern_->width(), pattern_->height(), fps_);
    auto live = std::make_unique<GstSource>();
    std::string error;
    if (!live->start(description, &error)) {
        Note("MediaRecorder: video source %s cannot start: %s", source_.text.c_str(),
             error.c_str());
        return kUnknownError;
    }
    live_ = std::move(live);
    Note("MediaRecorder: video from %s", source_.text.c_str());
    return 0;
}

void HostMediaRecorder::takePicture(uint32_t frame, uint64_t ms) {
    if (live_ != nullptr && live_->running()) {
        std::string why;
        if (!live_->ended(&why)) {
            // No new frame since the last one: the last picture is sent again.
            live_->latestFrame(picture_.data(), pattern_->width(), pattern_->height());
            return;
        }
        Note(
            "MediaRecorder: video source %s stopped: %s; showing \"no signal\" until the next "
            "start",
            source_.text.c_str(), why.c_str());
        live_->stop();
        label_ = TestPattern::Label::kNoSignal;
    }
    pattern_->draw(frame, ms, picture_.data(), label_);
}

int HostMediaRecorder::openEncoder() {
    const OpenH264* openh264 = LoadOpenH264();
    if (openh264 == nullptr) return kUnknownError;
    if (openh264->create(&encoder_) != 0 || encoder_ == nullptr) {
        encoder_ = nullptr;
        Note("MediaRecorder: OpenH264 encoder cannot be created");
        return kUnknownError;
    }
    int level = WELS_LOG_ERROR;
    encoder_->SetOption(ENCODER_OPTION_TRACE_LEVEL, &level);
    WelsTraceCallback trace = &EncoderTrace;
    encoder_->SetOption(ENCODER_OPTION_TRACE_CALLBACK, &trace);

    SEncParamExt p;
    encoder_->GetDefaultParams(&p);
    p.iUsageType = CAMERA_VIDEO_REAL_TIME;
    p.iPicWidth = width_;
    p.iPicHeight = height_;
    p.iTargetBitrate = bitrate_;
    p.iMaxBitrate = UNSPECIFIED_BIT_RATE;
    p.iRCMode = RC_BITRATE_MODE;
    p.fMaxFrameRate = fps_ < kEncoderMaxFps ? static_cast<float>(fps_) : kEncoderMaxFps;
    p.iTemporalLayerNum = 1;
    p.iSpatialLayerNum = 1;
    p.iComplexityMode = LOW_COMPLEXITY;
    // Key frames are forced by capture time in encodeNext, which also covers skipped frames.
    p.uiIntraPeriod = 0;
    p.iNumRefFrame = 1;
    // One SPS/PPS for the whole recording: clients take them once, from the first key frame.
    p.eSpsPpsIdStrategy = CONSTANT_ID;
    p.bPrefixNalAddingCtrl = false;
    p.bEnableSSEI = false;
    p.bSimulcastAVC = false;
    p.iEntropyCodingModeFlag = 0;
    // A screen in full motion costs more than the bitrate: with skipping, the rate control held
    // 1080p at 9 fps. Viewers want the frame rate kept; the picture gets coarser instead.
    p.bEnableFrameSkip = false;
    p.iMultipleThreadIdc = 1;
    p.bEnableDenoise = false;
    p.bEnableSceneChangeDetect = false;
    SSpatialLayerConfig& layer = p.sSpatialLayers[0];
    layer.iVideoWidth = width_;
    layer.iVideoHeight = height_;
    layer.fFrameRate = p.fMaxFrameRate;
    layer.iSpatialBitrate = bitrate_;
    layer.iMaxSpatialBitrate = UNSPECIFIED_BIT_RATE;
    layer.uiProfileIdc = PRO_BASELINE;
    layer.sSliceArgument.uiSliceMode = SM_SINGLE_SLICE;
    if (encoder_->InitializeExt(&p) != cmResultSuccess) {
        Note("MediaRecorder: OpenH264 refuses %dx%d @ %d fps, %d bit/s", width_, height_, fps_,
             bitrate_);
        closeEncoder();
        return kUnknownError;
    }
    int format = videoFormatI420;
    encoder_->SetOption(ENCODER_OPTION_DATAFORMAT, &format);
    return 0;
}

void HostMediaRecorder::closeEncoder() {
    if (encoder_ == nullptr) return;
    encoder_->Uninitialize();
    // An encoder exists only once the library has loaded, so this finds it loaded.
    LoadOpenH264()->destroy(encoder_);
    encoder_ = nullptr;
}

int HostMediaRecorder::start() {
    if (state_ != State::kPrepared) return kInvalidOperation;
    {
        std::lock_guard<std::mutex> hold(mutex_);
        stopping_ = false;
    }
    try {
        thread_ = std::thread(&HostMediaRecorder::run, this);
    } catch (const std::system_error& e) {
        Note("MediaRecorder::start: no encoder thread (%s)", e.what());
        return kUnknownError;
    }
    state_ = State::kRecording;
    Note("MediaRecorder::start");
    return 0;
}

int HostMediaRecorder::stop() {
    if (thread_.joinable()) {
        {
            std::lock_guard<std::mutex> hold(mutex_);
            stopping_ = true;
        }
        wake_.notify_all();
        thread_.join();
        Note("MediaRecorder::stop: %" PRIu64 " frames delivered, %" PRIu64
             " transactions failed, %" PRIu64 " frames dropped, %" PRIu64 " skipped by the encoder",
             framesDelivered(), failedTransacts(), framesDropped(), framesSkipped());
    }
    closeEncoder();
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
    if (state_ != State::kPrepared || encoder_ == nullptr) return Encoded{};
    return encodeNext(frame, ms);
}

HostMediaRecorder::Encoded HostMediaRecorder::encodeNext(uint32_t frame, uint64_t ms) {
    takePicture(frame, ms);
    // Force a key frame when waiting for the next frame would stretch the gap past the
    // interval (1 ms of slack absorbs the truncation of frame times to milliseconds).
    uint64_t since = ms - last_key_ms_;
    if (!key_seen_ || since * fps_ + 1000 > (kKeyIntervalMs + 1) * fps_) {
        encoder_->ForceIntraFrame(true);
    }

    SSourcePicture source;
    memset(&source, 0, sizeof source);
    source.iColorFormat = videoFormatI420;
    source.iPicWidth = pattern_->width();
    source.iPicHeight = pattern_->height();
    source.iStride[0] = source.iPicWidth;
    source.iStride[1] = source.iStride[2] = source.iPicWidth / 2;
    source.pData[0] = picture_.data();
    source.pData[1] = source.pData[0] + static_cast<size_t>(source.iPicWidth) * source.iPicHeight;
    source.pData[2] =
        source.pData[1] + static_cast<size_t>(source.iPicWidth / 2) * (source.iPicHeight / 2);
    source.uiTimeStamp = static_cast<long long>(ms);

    SFrameBSInfo info;
    memset(&info, 0, sizeof info);
    if (encoder_->EncodeFrame(&source, &info) != cmResultSuccess) {
        Note("MediaRecorder: OpenH264 failed on frame %" PRIu32, frame);
        return Encoded{};
    }
    if (info.eFrameType == videoFrameTypeSkip || info.eFrameType == videoFrameTypeInvalid) {
        // The rate control leaves frames out when the picture costs more than the bitrate.
        skipped_.fetch_add(1, std::memory_order_relaxed);
        return Encoded{};
    }

    // The NAL units as OpenH264 wrote them (the SPS and PPS are a layer of their own before the
    // IDR slices), each to be handed over on its own, as the platform recorder does. It writes
    // 4-byte start codes; a unit behind a 3-byte one is restaged behind 4 bytes.
    nals_.clear();
    // Room for every unit restaged, before any pointer into it is taken.
    size_t bound = static_cast<size_t>(info.iFrameSizeInBytes) + kMaxNalsPerFrame;
    if (frame_.size() < bound) frame_.resize(bound);
    size_t size = 0, staged = 0;
    for (int l = 0; l < info.iLayerNum; ++l) {
        const SLayerBSInfo& layer = info.sLayerInfo[l];
        const uint8_t* nal = layer.pBsBuf;
        for (int n = 0; n < layer.iNalCount; ++n) {
            size_t len = static_cast<size_t>(layer.pNalLengthInByte[n]);
            size_t start = StartCodeLength(nal, len);
            if (start == 4) {
                nals_.push_back({nal, len});
                size += len;
            } else if (len > start && staged + len - start + 4 <= frame_.size()) {
                uint8_t* at = frame_.data() + staged;
                static const uint8_t kStartCode[4] = {0, 0, 0, 1};
                memcpy(at, kStartCode, 4);
                memcpy(at + 4, nal + start, len - start);
                nals_.push_back({at, len - start + 4});
                staged += len - start + 4;
                size += len - start + 4;
            }
            nal += len;
        }
    }
    if (nals_.empty()) return Encoded{};
    Encoded out;
    out.nals = nals_.data();
    out.count = nals_.size();
    out.size = size;
    out.key = info.eFrameType == videoFrameTypeIDR;
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
        if (!failing_) Note("MediaRecorder: %s does not take frames (%d)", kFrameService, status);
        failing_ = true;
        return;
    }
    delivered_.fetch_add(1, std::memory_order_relaxed);
    if (failing_) Note("MediaRecorder: %s takes frames again", kFrameService);
    failing_ = false;
}

void HostMediaRecorder::run() {
    pthread_setname_np(pthread_self(), "orvex-recorder");
    const uint64_t start_ns = MonotonicNs();
    const auto start_tp = std::chrono::steady_clock::now();
    const uint64_t period_ns = 1000000000u / fps_;
    uint64_t n = 0;
    std::unique_lock<std::mutex> lock(mutex_);
    if (source_.kind == SourceChoice::kNone) {
        // The frames come from another binder client, such as orvex-feed: nothing to pace.
        wake_.wait(lock, [this] { return stopping_; });
        return;
    }
    for (;;) {
        // Frame n is due at a fixed offset from the start, so waits never add up to drift.
        uint64_t due_ns = start_ns + n * 1000000000u / fps_;
        auto due_tp = start_tp + std::chrono::nanoseconds(due_ns - start_ns);
        if (wake_.wait_until(lock, due_tp, [this] { return stopping_; })) break;
        lock.unlock();
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
        lock.lock();
    }
}

std::shared_ptr<MediaRecorder> HostMediaRecorderPort::create(const std::string& package) {
    Note("MediaRecorder(%s)", package.c_str());
    return std::make_shared<HostMediaRecorder>();
}

}  // namespace host
}  // namespace platform
