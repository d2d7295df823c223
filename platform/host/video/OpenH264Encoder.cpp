#include "platform/host/video/OpenH264Encoder.h"

#include <dlfcn.h>
#include <wels/codec_api.h>

#include <cinttypes>
#include <cstring>
#include <string>

#include "codec/AnnexB.h"
#include "platform/host/HostLog.h"
#include "platform/host/video/BitBudget.h"
#include "sync/thread_mutex.h"

namespace platform {
namespace host {
namespace {

// OpenH264 takes frame rates up to this; faster schedules still run, told this rate.
constexpr float kEncoderMaxFps = 60.0f;

// Restaging a unit behind 4 bytes adds one byte to it; room for this many units per frame
// (OpenH264 writes a handful), past which further restaged units are left out.
constexpr size_t kMaxNalsPerFrame = 256;

// A filler data unit (type 12) behind its start code; 0xFF bytes and a closing 0x80 follow.
constexpr uint8_t kFillerStart[] = {0, 0, 0, 1, 0x0C};
constexpr size_t kFillerHeader = sizeof kFillerStart;

void EncoderTrace(void*, int, const char* message) { HostLogf(kLogError, "%s", message); }

// The two C entry points of OpenH264; the encoder itself is reached through its vtable.
struct OpenH264 {
    decltype(&WelsCreateSVCEncoder) create = nullptr;
    decltype(&WelsDestroySVCEncoder) destroy = nullptr;
};

// Loads OpenH264 at the first encoder and keeps it; a failure logs one line and is tried
// again at the next prepare. Null when it does not load.
const OpenH264* LoadOpenH264() {
    static thread_mutex mutex;
    static OpenH264 api;
    thread_mutex::Scoped hold(mutex);
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
        HostLogf(kLogError, "%s", line.c_str());
        if (library != nullptr) dlclose(library);
        return nullptr;
    }
    api = found;
    return &api;
}

}  // namespace

OpenH264Encoder::OpenH264Encoder() = default;
OpenH264Encoder::~OpenH264Encoder() { Close(); }

bool OpenH264Encoder::Open(int width, int height, int fps, int bitrate) {
    Close();
    const OpenH264* openh264 = LoadOpenH264();
    if (openh264 == nullptr) return false;
    if (openh264->create(&encoder_) != 0 || encoder_ == nullptr) {
        encoder_ = nullptr;
        HostLogf(kLogError, "MediaRecorder: OpenH264 encoder cannot be created");
        return false;
    }
    int level = WELS_LOG_ERROR;
    encoder_->SetOption(ENCODER_OPTION_TRACE_LEVEL, &level);
    WelsTraceCallback trace = &EncoderTrace;
    encoder_->SetOption(ENCODER_OPTION_TRACE_CALLBACK, &trace);

    SEncParamExt p;
    encoder_->GetDefaultParams(&p);
    p.iUsageType = CAMERA_VIDEO_REAL_TIME;
    p.iPicWidth = width;
    p.iPicHeight = height;
    p.iTargetBitrate = bitrate;
    p.iMaxBitrate = UNSPECIFIED_BIT_RATE;
    // The rate is ours (BitBudget): OpenH264's own keeps the quantiser near each key frame's,
    // and a screen in full motion overshot by 90%; with frame skipping it held 1080p at 9 fps.
    p.iRCMode = RC_OFF_MODE;
    p.fMaxFrameRate = fps < kEncoderMaxFps ? static_cast<float>(fps) : kEncoderMaxFps;
    p.iTemporalLayerNum = 1;
    p.iSpatialLayerNum = 1;
    p.iComplexityMode = LOW_COMPLEXITY;
    // Key frames are forced by the caller (by capture time), which also covers skipped frames.
    p.uiIntraPeriod = 0;
    p.iNumRefFrame = 1;
    // One SPS/PPS for the whole recording: clients take them once, from the first key frame.
    p.eSpsPpsIdStrategy = CONSTANT_ID;
    p.bPrefixNalAddingCtrl = false;
    p.bEnableSSEI = false;
    p.bSimulcastAVC = false;
    p.iEntropyCodingModeFlag = 0;
    // Viewers want the frame rate kept; the picture gets coarser instead.
    p.bEnableFrameSkip = false;
    p.iMultipleThreadIdc = 1;
    p.bEnableDenoise = false;
    p.bEnableSceneChangeDetect = false;
    SSpatialLayerConfig& layer = p.sSpatialLayers[0];
    layer.iVideoWidth = width;
    layer.iVideoHeight = height;
    layer.fFrameRate = p.fMaxFrameRate;
    layer.iSpatialBitrate = bitrate;
    layer.iMaxSpatialBitrate = UNSPECIFIED_BIT_RATE;
    layer.uiProfileIdc = PRO_BASELINE;
    budget_ = std::make_unique<BitBudget>(bitrate, fps);
    qp_ = budget_->qp();
    layer.iDLayerQp = qp_;
    layer.sSliceArgument.uiSliceMode = SM_SINGLE_SLICE;
    // Say which colours the samples mean: every host picture is BT.601 with limited range (the
    // pattern's bars, and the live sources' conversion asks GStreamer for colorimetry=bt601).
    // Without it players guess, and guess BT.709 for HD sizes: reds and greens shift.
    layer.bVideoSignalTypePresent = true;
    layer.uiVideoFormat = VF_UNDEF;
    layer.bFullRange = false;
    layer.bColorDescriptionPresent = true;
    layer.uiColorPrimaries = CP_SMPTE170M;
    layer.uiTransferCharacteristics = TRC_SMPTE170M;
    layer.uiColorMatrix = CM_SMPTE170M;
    if (encoder_->InitializeExt(&p) != cmResultSuccess) {
        HostLogf(kLogError, "MediaRecorder: OpenH264 refuses %dx%d @ %d fps, %d bit/s", width,
                 height, fps, bitrate);
        Close();
        return false;
    }
    int format = videoFormatI420;
    encoder_->SetOption(ENCODER_OPTION_DATAFORMAT, &format);
    width_ = width;
    height_ = height;
    params_ = std::make_unique<SEncParamExt>(p);
    // A filler unit of up to one picture's share, all 0xFF: each use writes its closing
    // 0x80 and the next restores it.
    filler_.assign(static_cast<size_t>(budget_->share()) + kFillerHeader + 1, 0xFF);
    memcpy(filler_.data(), kFillerStart, kFillerHeader);
    filler_end_ = 0;
    return true;
}

void OpenH264Encoder::Close() {
    if (encoder_ == nullptr) return;
    encoder_->Uninitialize();
    // An encoder exists only once the library has loaded, so this finds it loaded.
    LoadOpenH264()->destroy(encoder_);
    encoder_ = nullptr;
}

OpenH264Encoder::Frame OpenH264Encoder::Encode(uint8_t* i420, uint64_t ms, bool force_key) {
    if (encoder_ == nullptr) return Frame{};
    if (budget_->qp() != qp_) {
        qp_ = budget_->qp();
        params_->sSpatialLayers[0].iDLayerQp = qp_;
        encoder_->SetOption(ENCODER_OPTION_SVC_ENCODE_PARAM_EXT, params_.get());
    }
    if (force_key) encoder_->ForceIntraFrame(true);
    SSourcePicture source;
    memset(&source, 0, sizeof source);
    source.iColorFormat = videoFormatI420;
    source.iPicWidth = width_;
    source.iPicHeight = height_;
    source.iStride[0] = source.iPicWidth;
    source.iStride[1] = source.iStride[2] = source.iPicWidth / 2;
    source.pData[0] = i420;
    source.pData[1] = source.pData[0] + static_cast<size_t>(source.iPicWidth) * source.iPicHeight;
    source.pData[2] =
        source.pData[1] + static_cast<size_t>(source.iPicWidth / 2) * (source.iPicHeight / 2);
    source.uiTimeStamp = static_cast<long long>(ms);

    SFrameBSInfo info;
    memset(&info, 0, sizeof info);
    if (encoder_->EncodeFrame(&source, &info) != cmResultSuccess) {
        HostLogf(kLogWarn, "MediaRecorder: OpenH264 failed on the frame of %" PRIu64 " ms", ms);
        return Frame{};
    }
    if (info.eFrameType == videoFrameTypeSkip || info.eFrameType == videoFrameTypeInvalid) {
        // The rate control leaves frames out when the picture costs more than the bitrate.
        Frame skipped;
        skipped.skipped = true;
        return skipped;
    }

    // The NAL units as OpenH264 wrote them (the SPS and PPS are a layer of their own before the
    // IDR slices), each to be handed over on its own, as the platform recorder does. It writes
    // 4-byte start codes; a unit behind a 3-byte one is restaged behind 4 bytes.
    nals_.clear();
    // Room for every unit restaged, before any pointer into it is taken.
    size_t bound = static_cast<size_t>(info.iFrameSizeInBytes) + kMaxNalsPerFrame;
    if (staged_.size() < bound) staged_.resize(bound);
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
            } else if (len > start && staged + len - start + 4 <= staged_.size()) {
                uint8_t* at = staged_.data() + staged;
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
    Frame out;
    if (nals_.empty()) return out;
    out.key = info.eFrameType == videoFrameTypeIDR;
    size_t filler = budget_->spend(size, out.key);
    if (filler > kFillerHeader && filler <= filler_.size()) {
        if (filler_end_ > 0) filler_[filler_end_] = 0xFF;
        filler_end_ = filler - 1;
        filler_[filler_end_] = 0x80;  // rbsp_trailing_bits
        nals_.push_back({filler_.data(), filler});
        size += filler;
    }
    out.nals = nals_.data();
    out.count = nals_.size();
    out.size = size;
    return out;
}

}  // namespace host
}  // namespace platform
