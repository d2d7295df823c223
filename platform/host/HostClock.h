#pragma once

#include <time.h>

#include <cstdint>

namespace platform {
namespace host {

// The one clock the host's synthetic picture and sound share, so a client can measure A/V
// sync: the picture flashes and the tone beeps during the first 100 ms of every second.
inline uint64_t HostClockMs() {
    timespec ts{};
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<uint64_t>(ts.tv_sec) * 1000u + static_cast<uint64_t>(ts.tv_nsec / 1000000);
}

constexpr uint64_t kFlashMs = 100;

inline bool InFlash(uint64_t ms) { return ms % 1000 < kFlashMs; }

}  // namespace host
}  // namespace platform
