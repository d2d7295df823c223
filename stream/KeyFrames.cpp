#include "stream/KeyFrames.h"

#include <atomic>
#include <chrono>

#include "platform/CapturePorts.h"
#include "platform/Ports.h"

namespace stream {

namespace {

std::atomic<uint64_t> g_last_request_ms{0};

uint64_t SteadyMs() {
    return static_cast<uint64_t>(std::chrono::duration_cast<std::chrono::milliseconds>(
                                     std::chrono::steady_clock::now().time_since_epoch())
                                     .count());
}

}  // namespace

bool KeyFrameDue(uint64_t now_ms, uint64_t* last) {
    if (*last != 0 && now_ms - *last < kKeyFrameMinSpacingMs) return false;
    *last = now_ms == 0 ? 1 : now_ms;
    return true;
}

bool AskForKeyFrame() {
    const uint64_t now = SteadyMs();
    uint64_t last = g_last_request_ms.load(std::memory_order_relaxed);
    uint64_t next = last;
    if (!KeyFrameDue(now, &next)) return false;
    // Two viewers at once: one of them asks.
    if (!g_last_request_ms.compare_exchange_strong(last, next)) return false;
    return platform::MediaRecorders().RequestKeyFrame();
}

}  // namespace stream
