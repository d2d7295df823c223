#include "rtp/FrameLatency.h"

#include <algorithm>
#include <cstdio>

namespace {

struct Summary {
    uint32_t median;
    uint32_t max;
};

// Reorders `v`; the median of an even count is the upper of the middle two.
Summary Summarise(uint32_t* v, size_t n) {
    std::nth_element(v, v + n / 2, v + n);
    uint32_t median = v[n / 2];
    return Summary{median, *std::max_element(v, v + n)};
}

}  // namespace

bool FrameLatency::Add(uint32_t ring_wait_ms, uint32_t send_us, char* line, size_t size) {
    m_wait[m_count] = ring_wait_ms;
    m_send[m_count] = send_us;
    if (++m_count < kFrames) return false;
    m_count = 0;
    Summary wait = Summarise(m_wait, kFrames);
    Summary send = Summarise(m_send, kFrames);
    snprintf(line, size,
             "latency of the last %zu frames: ring wait p50 %u ms, max %u ms; "
             "sending p50 %u us, max %u us",
             kFrames, wait.median, wait.max, send.median, send.max);
    return true;
}
