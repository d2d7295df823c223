#pragma once

#include <atomic>
#include <cstdint>
#include <mutex>

#include "sync/thread_mutex.h"

// Largest payload of one framed item (one encoded frame).
constexpr int kFrameSizeMax = 1000000;
// Item header: 32-bit length, 32-bit millisecond time, in the processor's byte order.
constexpr int kItemHeaderSize = 8;

// One item taken out of a ring. About a megabyte: keep it off small thread stacks.
struct Buffer_Item {
    int32_t length;
    uint32_t timestamp;
    unsigned char data[kFrameSizeMax];
};

// Byte ring from producer threads to one consumer thread, used either raw (write/read) or framed
// (newwrite/newread). One byte always stays unused so that full and empty differ.
// Thread contract: any number of threads may write (write, newwrite) and reset at once; each
// write lands whole or not at all, and a reset waits for the writes already under way, then
// empties the ring. One consumer (read, newread, wait_readable) at a time; reset only while it
// is stopped; wake_reader from any thread.
// No allocation after construction.
class cycle_buffer {
public:
    explicit cycle_buffer(unsigned size);
    ~cycle_buffer();
    cycle_buffer(const cycle_buffer&) = delete;
    cycle_buffer& operator=(const cycle_buffer&) = delete;

    // Appends len bytes; returns len, or 0 (with a message) when they do not fit.
    int write(const unsigned char* data, int len);
    // Removes exactly len bytes; returns len, or 0 when fewer are there or not yet readable.
    int read(unsigned char* dst, int len);
    // Appends one item (header and payload, published together); timestamp 0 stamps it with
    // GetTimeStampMillsec(). False, ring unchanged, when it does not fit. `flag` is unused.
    bool newwrite(const unsigned char* data, int len, unsigned timestamp, bool flag);
    // Removes one item. An item longer than kFrameSizeMax invalidates the item stream for good.
    bool newread(Buffer_Item& item);
    // Empties the ring; the readable and item-stream states stay as they are.
    void reset();
    // For the consumer with nothing to take: returns once `len` bytes can be read, after a
    // wake_reader that has not yet ended a wait, or after `max_ms`, whichever comes first. The
    // write that brings the bytes ends the wait at once, so a consumer need not poll. False when
    // `len` bytes were readable already: the consumer could not use what is there (a drop, a
    // broken item stream) and must pace itself rather than look again at once.
    bool wait_readable(uint32_t len, unsigned max_ms);
    // Ends the consumer's current or next wait_readable (to stop it without a timeout).
    void wake_reader();

    unsigned capacity() const { return m_capacity; }
    // What a writer can put in now (writes under way count as used).
    unsigned free_space();
    // What the consumer can take now.
    unsigned used_space();
    bool item_stream_valid() const { return m_item_stream_valid.load(std::memory_order_relaxed); }

private:
    struct Snapshot {
        uint32_t read;
        uint32_t write;
    };
    Snapshot Snap();
    uint32_t FreeOf(const Snapshot& s) const;
    uint32_t UsedOf(const Snapshot& s) const;
    void CopyIn(uint32_t at, const unsigned char* src, uint32_t len);
    void CopyOut(uint32_t at, unsigned char* dst, uint32_t len) const;
    uint32_t Advance(uint32_t at, uint32_t len) const;
    void CountWritten(uint32_t len) ORVEX_REQUIRES(m_lock);
    bool Reserve(uint64_t len, uint32_t* at, uint32_t* ticket, uint32_t* free);
    void Publish(uint32_t at, uint32_t len, uint32_t ticket);
    void Wait() ORVEX_REQUIRES(m_lock);
    bool ReaderSatisfied(uint32_t len) ORVEX_REQUIRES(m_lock);
    void RingBell(bool wake);

    thread_mutex m_lock;
    unsigned char* m_start;
    unsigned char* m_end;  // last byte of the storage
    uint32_t m_capacity;
    // Offsets from m_start. The consumer alone moves m_read; writers move m_write under the
    // lock; the release store of a position publishes the bytes copied before it.
    std::atomic<uint32_t> m_read{0};
    std::atomic<uint32_t> m_write{0};
    // Writers reserve [m_write, m_reserved) under the lock, copy into their part outside it and
    // publish in the order they reserved (tickets), so m_write only ever covers whole copies.
    uint32_t m_reserved ORVEX_GUARDED_BY(m_lock) = 0;
    uint32_t m_next_ticket ORVEX_GUARDED_BY(m_lock) = 0;
    uint32_t m_published_ticket ORVEX_GUARDED_BY(m_lock) = 0;
    uint32_t m_in_flight ORVEX_GUARDED_BY(m_lock) = 0;
    uint32_t m_resets_waiting ORVEX_GUARDED_BY(m_lock) = 0;
    uint32_t m_waiters ORVEX_GUARDED_BY(m_lock) = 0;  // writers and resets in Wait
    thread_condition m_changed;                       // a publish or a reset finished
    // What the consumer waits for in wait_readable (0: it does not wait), so that only the
    // publish that brings that much wakes it. It sleeps on a bell of its own, rung after the
    // ring's lock is released.
    uint32_t m_reader_wants ORVEX_GUARDED_BY(m_lock) = 0;
    thread_mutex m_bell_lock;
    thread_condition m_bell;
    bool m_bell_data ORVEX_GUARDED_BY(m_bell_lock) = false;  // the publish the wait asked for
    bool m_bell_wake ORVEX_GUARDED_BY(m_bell_lock) = false;  // kept for a wait not yet begun
    uint32_t m_threshold = 0;
    std::atomic<int> m_readable{0};
    uint32_t m_written_before_readable ORVEX_GUARDED_BY(m_lock) = 0;
    std::atomic<int> m_item_stream_valid{1};
};
