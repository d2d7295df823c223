#include "capture/AudioSampleClock.h"

AudioSampleClock::AudioSampleClock(unsigned sample_rate, unsigned samples_per_frame)
    : m_rate(sample_rate > 0 ? sample_rate : 1), m_per_frame(samples_per_frame) {}

uint32_t AudioSampleClock::Next(uint32_t now_ms) {
    uint32_t stamp = m_anchor_ms + static_cast<uint32_t>(m_samples * 1000 / m_rate);
    // Differences modulo 2^32, as the millisecond clock wraps.
    const int32_t drift = static_cast<int32_t>(now_ms - stamp);
    if (!m_anchored || drift > static_cast<int32_t>(kMaxDriftMs) ||
        drift < -static_cast<int32_t>(kMaxDriftMs)) {
        m_anchored = true;
        m_anchor_ms = now_ms;
        m_samples = 0;
        stamp = now_ms;
    }
    m_samples += m_per_frame;
    return stamp != 0 ? stamp : 1;
}
