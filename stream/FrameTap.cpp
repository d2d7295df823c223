#include "stream/FrameTap.h"

#include <atomic>
#include "sync/thread_mutex.h"

#include "base/Clocks.h"

namespace {

// The producers of the two tracks each hold the lock only while their frame is handed over;
// registration takes the same lock, so a removed sink is never called afterwards.
thread_mutex g_sinks_lock;
EncodedFrameSink* g_sinks[kMaxFrameSinks] ORVEX_GUARDED_BY(g_sinks_lock) = {};
std::atomic<int> g_sink_count{0};

bool AnySink() { return g_sink_count.load(std::memory_order_acquire) != 0; }

template <typename Call>
void Dispatch(Call call) {
    thread_mutex::Scoped hold(g_sinks_lock);
    for (EncodedFrameSink* sink : g_sinks) {
        if (sink != nullptr) call(sink);
    }
}

}  // namespace

bool AddFrameSink(EncodedFrameSink* sink) {
    if (sink == nullptr) return false;
    thread_mutex::Scoped hold(g_sinks_lock);
    for (EncodedFrameSink* existing : g_sinks) {
        if (existing == sink) return false;
    }
    for (EncodedFrameSink*& slot : g_sinks) {
        if (slot != nullptr) continue;
        slot = sink;
        g_sink_count.fetch_add(1, std::memory_order_release);
        return true;
    }
    return false;
}

void RemoveFrameSink(EncodedFrameSink* sink) {
    thread_mutex::Scoped hold(g_sinks_lock);
    for (EncodedFrameSink*& slot : g_sinks) {
        if (slot != sink || sink == nullptr) continue;
        slot = nullptr;
        g_sink_count.fetch_sub(1, std::memory_order_release);
    }
}

void TapVideoFrame(const uint8_t* data, size_t len) {
    if (data == nullptr || len == 0 || !AnySink()) return;
    uint32_t now = GetTimeStampMillsec();
    Dispatch([&](EncodedFrameSink* sink) { sink->OnVideoFrame(data, len, now); });
}

void TapAudioFrame(const uint8_t* data, size_t len, uint32_t time_ms) {
    if (data == nullptr || len == 0 || !AnySink()) return;
    // As the ring does: a producer without a clock of its own gets the monotonic one.
    if (time_ms == 0) time_ms = GetTimeStampMillsec();
    Dispatch([&](EncodedFrameSink* sink) { sink->OnAudioFrame(data, len, time_ms); });
}

void TapAudioPcm(const uint8_t* data, size_t len, uint32_t time_ms) {
    constexpr size_t kFrameBytes = 2 * 2;  // 16-bit samples, two channels
    if (data == nullptr || len < kFrameBytes || !AnySink()) return;
    if (time_ms == 0) time_ms = GetTimeStampMillsec();
    // The encoder's blocks are 16-bit aligned; an odd pointer would be a caller's fault.
    if (reinterpret_cast<uintptr_t>(data) % alignof(int16_t) != 0) return;
    const auto* samples = reinterpret_cast<const int16_t*>(data);
    Dispatch(
        [&](EncodedFrameSink* sink) { sink->OnAudioPcm(samples, len / kFrameBytes, time_ms); });
}
