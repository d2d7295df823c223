#pragma once

#include <cstdint>

// Stamps the frames of an audio stream by the samples before them: the first frame takes the
// time it is handed over, each later one that time plus the duration of the samples before it,
// so that stamps step by one frame whatever block size the capture reads. When the capture's
// clock and the system's part by more than kMaxDriftMs, the stamps follow the system's again.
// Thread contract: NOT thread safe; the encoder thread's own.
class AudioSampleClock {
public:
    static constexpr uint32_t kMaxDriftMs = 200;

    AudioSampleClock(unsigned sample_rate, unsigned samples_per_frame);

    // The stamp of the next frame, in the milliseconds of `now_ms`; never 0, which would ask
    // the ring for the write time.
    uint32_t Next(uint32_t now_ms);

private:
    unsigned m_rate;
    unsigned m_per_frame;
    bool m_anchored = false;
    uint32_t m_anchor_ms = 0;
    uint64_t m_samples = 0;
};
