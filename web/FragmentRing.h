#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "buffers/ByteRing.h"
#include "sync/thread_mutex.h"

// The live fMP4 stream as every web viewer gets it: one ring of fragments that the muxer
// writes once and each viewer copies out at its own pace, so memory stays the same whatever
// the viewers do. A viewer starts with the stream's init segment and the latest key fragment;
// one that falls a quarter of the ring behind skips ahead to the latest key fragment, and one
// overtaken in the middle of a fragment (it stopped reading) is ended.
// Thread contract: one writer (Restart, Append) at a time; Read and WaitForStart from any
// number of viewer threads; Stop from any thread.
class FragmentRing {
public:
    explicit FragmentRing(size_t capacity);
    FragmentRing(const FragmentRing&) = delete;
    FragmentRing& operator=(const FragmentRing&) = delete;

    // A new stream (first picture, or a new picture size): the init segment and the MIME type
    // with codecs that viewers start with. Viewers of the previous stream end.
    void Restart(const uint8_t* init, size_t len, const std::string& content_type);
    // One fragment in two pieces (its boxes, then the sample). False, and nothing written,
    // when it would take more than a quarter of the ring.
    bool Append(const uint8_t* head, size_t head_len, const uint8_t* body, size_t body_len,
                bool key);
    // Every reader ends; later reads end at once.
    void Stop();

    struct Reader {
        uint32_t generation = 0;   // the stream it reads; 0 before WaitForStart succeeds
        uint64_t pos = 0;          // where its next bytes are, counted since the ring began
        uint64_t record_left = 0;  // bytes of the fragment under way still to copy
        size_t init_sent = 0;
        unsigned skips = 0;  // times it fell behind and skipped to a key fragment
    };
    // Waits up to `wait_ms` for a live stream (a fragment written within kLiveMs) with a key
    // fragment and points the reader at it. What is left of a stream whose capture stopped is
    // not served: the next capture may have another size, and its time goes on after a gap.
    // A key fragment older than kFreshKeyMs is taken only after kFreshWaitMs without a newer
    // one: a viewer that starts far behind the live edge must decode its way forward at once,
    // which stalls a browser's playback just as it begins.
    bool WaitForStart(Reader* reader, std::string* content_type, int wait_ms);
    // Copies the reader's next bytes: their count, 0 when none came within `wait_ms`, -1 when
    // the reader's stream has ended (`why` says how).
    long Read(Reader* reader, uint8_t* out, size_t cap, int wait_ms, const char** why);

    size_t capacity() const { return m_ring.size(); }

private:
    static constexpr size_t kRecordHeader = 8;  // length (4 bytes) and flags (4 bytes)
    static constexpr uint64_t kNoKey = UINT64_MAX;
    static constexpr int kLiveMs = 1000;
    static constexpr int kFreshKeyMs = 300;
    static constexpr int kFreshWaitMs = 3000;

    bool Overwritten(uint64_t pos) const ORVEX_REQUIRES(m_lock) {
        return m_ring.Overrun(m_write_pos, pos);
    }

    thread_mutex m_lock;
    thread_condition m_written;
    // Records of kRecordHeader then the fragment, read and written under m_lock (its size is
    // fixed); pages become resident only as fragments reach them, so an idle viewer costs no
    // memory.
    ByteRing m_ring;
    uint64_t m_write_pos ORVEX_GUARDED_BY(m_lock) = 0;
    uint64_t m_last_key ORVEX_GUARDED_BY(m_lock) = kNoKey;
    std::chrono::steady_clock::time_point m_last_write ORVEX_GUARDED_BY(m_lock);
    std::chrono::steady_clock::time_point m_last_key_write ORVEX_GUARDED_BY(m_lock);
    uint32_t m_generation ORVEX_GUARDED_BY(m_lock) = 0;
    std::vector<uint8_t> m_init ORVEX_GUARDED_BY(m_lock);
    std::string m_content_type ORVEX_GUARDED_BY(m_lock);
    bool m_stopped ORVEX_GUARDED_BY(m_lock) = false;
};
