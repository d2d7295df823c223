#include "rtp/SendLoopState.h"

namespace {
constexpr uint32_t kCounterWrap = 4294967293u;
constexpr int32_t kAheadLimitMs = 251;
}  // namespace

unsigned PositionMs(uint32_t timestamp, unsigned rate) {
    if (rate == 0) return 0;
    // Through 64 bits, so that a slow clock wraps like the time stamps instead of overflowing.
    return static_cast<unsigned>(
        static_cast<uint64_t>(timestamp / static_cast<double>(rate) * 1000.0));
}

void AdvanceTimestamp(uint32_t* timestamp, unsigned rate, uint32_t item_ms,
                      uint32_t* last_item_ms) {
    if (item_ms >= *last_item_ms) {
        // A gap of up to 49 days times any 32-bit rate stays below 2^64; the time stamp wraps
        // modulo 2^32, as RTP time stamps do.
        *timestamp += static_cast<uint32_t>(
            static_cast<uint64_t>(rate * ((item_ms - *last_item_ms) / 1000.0)));
    }
    *last_item_ms = item_ms;
}

bool H264SendState::MustWaitForAudio(unsigned video_ms, unsigned audio_ms) const {
    return n_ >= 2 && static_cast<int32_t>(video_ms - audio_ms) >= kAheadLimitMs;
}

bool H264SendState::TakeFirstItem() {
    bool was = first_;
    first_ = false;
    return was;
}

H264SendState::Verdict H264SendState::Admit(bool paused) {
    unsigned q = p_ + 1;
    if (q == 3 && !latched_) {
        p_ = 0;
        latched_ = true;
    } else {
        p_ = q % 21;
    }
    if (paused) {
        resume_ = 2;
        return kDrop;
    }
    if (resume_ == 2 || resume_ == 3) {
        if (p_ != 0) {
            resume_ = 3;
            return kDrop;
        }
        resume_ = 1;
    }
    return kSend;
}

void H264SendState::AfterSend(uint16_t* sequence) {
    if (++n_ > kCounterWrap) n_ = 0;
    if (*sequence + 10 >= 65435) *sequence = 1;
}

bool AacSendState::VideoLags(unsigned audio_ms, unsigned video_ms) const {
    return n_ >= 2 && static_cast<int32_t>(audio_ms - video_ms) >= kAheadLimitMs;
}

void AacSendState::AfterSend(uint16_t* sequence) {
    uint16_t next = static_cast<uint16_t>(*sequence + 1);
    *sequence = next > 65533 ? 0 : next;
    if (++n_ > kCounterWrap) n_ = 0;
}
