#include "platform/host/HostAudio.h"

#include <dlfcn.h>
#include <time.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "platform/Ports.h"
#include "platform/host/HostClock.h"
#include "platform/host/capture/GstSource.h"
#include "platform/host/capture/HostSources.h"

namespace platform {
namespace host {
namespace {

constexpr unsigned kRate = 48000;
constexpr size_t kMinFrames = 960;  // 20 ms: one encoder block of 3840 bytes
constexpr double kToneHz = 1000.0;
constexpr double kAmplitude = 12000.0;
// A live source that gives nothing for this long is bridged with silence until it does.
constexpr int kStallMs = 100;
constexpr char kTag[] = "orvex:::host";

void SleepUntilMs(uint64_t ms) {
    timespec ts{};
    ts.tv_sec = static_cast<time_t>(ms / 1000);
    ts.tv_nsec = static_cast<long>((ms % 1000) * 1000000);
    clock_nanosleep(CLOCK_MONOTONIC, TIMER_ABSTIME, &ts, nullptr);
}

// The record's sound: the beeping tone, silence ("none", or a live source lost or stalled),
// or a GStreamer source (PulseAudio, ALSA, a pipeline) chosen by the host properties at start.
class HostAudioRecord final : public AudioRecord {
public:
    int set(int, unsigned sample_rate, int format, unsigned, size_t frame_count) override {
        if (sample_rate != kRate || format != 1 || frame_count == 0) return -22;
        frames_per_read_ = frame_count;
        return 0;
    }
    int start() override {
        SourceChoice source = ChooseAudioSource();
        live_.reset();
        wanted_.reset();
        mode_ = source.kind == SourceChoice::kTone ? Mode::kTone : Mode::kSilence;
        restartClock();
        if (source.live()) {
            wanted_ = std::make_unique<SourceChoice>(source);
            std::string error;
            if (!openLive(&error)) {
                // The picture goes on: this track sends silence and tries again.
                Warn("cannot start: " + error + "; silence, trying again in 1 s");
                retryFrom(kRetryFirstMs);
            }
        }
        stalled_ = false;
        started_ = true;
        return 0;
    }
    void stop() override {
        started_ = false;
        live_.reset();
        wanted_.reset();
    }
    long read(void* buffer, size_t size) override {
        if (!started_) return -1;
        size_t frames = size / 4;
        if (frames > frames_per_read_) frames = frames_per_read_;
        if (frames == 0) return -1;
        auto* out = static_cast<uint8_t*>(buffer);
        if (mode_ == Mode::kSilence && wanted_ && HostClockMs() >= retry_at_ms_) {
            std::string error;
            if (openLive(&error)) {
                Warn("is back");
                stalled_ = false;
            } else {
                retryFrom(std::min(retry_ms_ * 2, kRetryMaxMs));
            }
        }
        if (mode_ == Mode::kLive) {
            std::string why;
            if (live_->ended(&why)) {
                Warn("stopped: " + why + "; silence, trying again in 1 s");
                live_.reset();
                mode_ = Mode::kSilence;
                restartClock();
                retryFrom(kRetryFirstMs);
            } else {
                size_t got = live_->readBytes(out, frames * 4, stalled_ ? 0 : kStallMs);
                if (got > 0) {
                    stalled_ = false;
                    return static_cast<long>(got);
                }
                // Keep the sound going (the picture waits for it) until the source is back.
                if (!stalled_) restartClock();
                stalled_ = true;
            }
        }
        // Real time: a block is there once its last sample has been "recorded".
        SleepUntilMs(start_ms_ + (next_ + frames) * 1000 / kRate);
        if (mode_ == Mode::kTone) {
            FillTone(static_cast<int16_t*>(buffer), frames, next_, start_ms_);
        } else {
            memset(out, 0, frames * 4);
        }
        next_ += frames;
        return static_cast<long>(frames * 4);
    }

private:
    enum class Mode { kTone, kSilence, kLive };
    static constexpr uint64_t kRetryFirstMs = 1000;
    static constexpr uint64_t kRetryMaxMs = 10000;

    bool openLive(std::string* error) {
        auto live = std::make_unique<GstSource>();
        if (!live->start(AudioPipeline(*wanted_), error)) return false;
        live_ = std::move(live);
        mode_ = Mode::kLive;
        return true;
    }
    void retryFrom(uint64_t delay_ms) {
        retry_ms_ = delay_ms;
        retry_at_ms_ = HostClockMs() + delay_ms;
    }
    void Warn(const std::string& what) {
        std::string line = "AudioRecord: audio source " + wanted_->text + " " + what;
        Log().Write(kLogIdSystem, kLogWarn, kTag, line.c_str());
    }

    void restartClock() {
        start_ms_ = HostClockMs();
        next_ = 0;
    }

    size_t frames_per_read_ = kMinFrames;
    uint64_t start_ms_ = 0;
    uint64_t next_ = 0;
    bool started_ = false;
    bool stalled_ = false;
    Mode mode_ = Mode::kTone;
    std::unique_ptr<GstSource> live_;
    std::unique_ptr<SourceChoice> wanted_;  // the live source asked for, while it is
    uint64_t retry_ms_ = kRetryFirstMs;     // the back-off: 1 s, doubling to 10 s
    uint64_t retry_at_ms_ = 0;
};

}  // namespace

void FillTone(int16_t* out, size_t frames, uint64_t first, uint64_t start_ms) {
    // At 1 kHz one period of the tone is one millisecond: 48 samples, worked out once. Sample
    // n is then period[n % 48], heard while its millisecond (n / 48) is in a flash.
    static_assert(kRate % 1000 == 0 && kToneHz == 1000.0, "one period a millisecond");
    constexpr size_t kPeriod = kRate / 1000;
    static const std::array<int16_t, kPeriod> period = [] {
        std::array<int16_t, kPeriod> p{};
        for (size_t k = 0; k < kPeriod; ++k) {
            double phase = 2.0 * M_PI * kToneHz * static_cast<double>(k) / kRate;
            p[k] = static_cast<int16_t>(std::lround(kAmplitude * std::sin(phase)));
        }
        return p;
    }();
    for (size_t i = 0; i < frames;) {
        const uint64_t n = first + i;
        const size_t phase = static_cast<size_t>(n % kPeriod);
        const size_t run = std::min(kPeriod - phase, frames - i);
        const bool on = InFlash(start_ms + n / kPeriod);
        for (size_t k = 0; k < run; ++k, ++i) {
            const int16_t v = on ? period[phase + k] : 0;
            out[2 * i] = v;
            out[2 * i + 1] = v;
        }
    }
}

std::shared_ptr<AudioRecord> HostAudioRecordPort::create(const std::string&) {
    return std::make_shared<HostAudioRecord>();
}

int HostAudioRecordPort::getMinFrameCount(size_t* frame_count, unsigned sample_rate, int format,
                                          unsigned) {
    if (frame_count == nullptr || sample_rate != kRate || format != 1) return -22;
    *frame_count = kMinFrames;
    return 0;
}

bool HostAudioRecordPort::setFlingerParameters(int, const std::string& key_values) {
    Log().Write(kLogIdSystem, kLogDebug, "orvex:::host",
                ("AudioFlinger::setParameters " + key_values).c_str());
    return true;
}

void* HostAacLibrary::open() { return dlopen(name(), RTLD_NOW); }
void* HostAacLibrary::symbol(void* library, const char* symbol) { return dlsym(library, symbol); }
void HostAacLibrary::close(void* library) {
    if (library != nullptr) dlclose(library);
}

}  // namespace host
}  // namespace platform
