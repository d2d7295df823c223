#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "buffers/ByteRing.h"
#include "sync/thread_mutex.h"

// The frames waiting for one media server: a byte ring allocated once, so that the frame tap
// only copies. It holds at most `bytes` and at most `span_ms` of stream time; a frame that
// does not fit is dropped, and so is everything after it up to the next key frame (the
// pictures between depend on what was lost).
// Thread contract: one producer (the tap, which serialises its calls) and one consumer.
class PublishQueue {
public:
    enum class Kind : uint8_t { kVideo = 1, kAudio = 2 };
    struct Frame {
        Kind kind = Kind::kVideo;
        bool key = false;
        uint32_t time_ms = 0;
        size_t len = 0;  // bytes in the consumer's buffer
    };

    PublishQueue(size_t bytes, uint32_t span_ms);

    // Producer. False when the frame was dropped. Never waits beyond the consumer's copy.
    bool Push(Kind kind, bool key, uint32_t time_ms, const uint8_t* data, size_t len);

    // Consumer: the oldest frame, copied into `buffer` (grown only when a frame is larger than
    // any before). Waits up to `wait_ms`; false when none came or Stop was called.
    // `*dropped` gets the frames dropped since the previous Pop.
    bool Pop(Frame* frame, std::vector<uint8_t>* buffer, int wait_ms, unsigned* dropped);

    // Producer: a frame is missing; what follows is dropped up to the next key frame.
    void DropToKeyFrame();
    // Wakes the consumer; Pop then returns false at once.
    void Stop();

private:
    struct Header {
        uint32_t len;
        uint32_t time_ms;
        uint8_t kind;
        uint8_t key;
        uint8_t pad[2];
    };
    void CopyIn(const void* data, size_t len) ORVEX_REQUIRES(m_lock);

    ByteRing m_ring;  // read and written under m_lock
    const uint32_t m_span_ms;
    thread_mutex m_lock;
    thread_condition m_ready;
    uint64_t m_head ORVEX_GUARDED_BY(m_lock) = 0;  // bytes ever written
    uint64_t m_tail ORVEX_GUARDED_BY(m_lock) = 0;  // bytes ever read
    bool m_dropping ORVEX_GUARDED_BY(m_lock) = false;
    unsigned m_dropped ORVEX_GUARDED_BY(m_lock) = 0;
    bool m_stopped ORVEX_GUARDED_BY(m_lock) = false;
};
