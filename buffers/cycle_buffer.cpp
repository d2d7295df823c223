#include "buffers/cycle_buffer.h"

#include <chrono>
#include <cstring>

#include "base/Clocks.h"
#include "base/OrvexLog.h"

namespace {
constexpr const char* kTag = "orvex:::cycle_buffer";
}

cycle_buffer::cycle_buffer(unsigned size) {
    m_capacity = size > 0 ? size : 1;
    m_start = new unsigned char[m_capacity];
    m_end = m_start + m_capacity - 1;
}

cycle_buffer::~cycle_buffer() { delete[] m_start; }

cycle_buffer::Snapshot cycle_buffer::Snap() {
    thread_mutex::Scoped hold(m_lock);
    return Snapshot{m_read.load(std::memory_order_acquire),
                    m_write.load(std::memory_order_acquire)};
}

// (read - write) modulo capacity, less the byte that always stays unused.
uint32_t cycle_buffer::FreeOf(const Snapshot& s) const {
    if (s.read == s.write) return m_capacity - 1;
    return (s.read + m_capacity - s.write) % m_capacity - 1;
}

uint32_t cycle_buffer::UsedOf(const Snapshot& s) const {
    if (s.read == s.write) return 0;
    return m_capacity - (s.read + m_capacity - s.write) % m_capacity;
}

unsigned cycle_buffer::free_space() {
    thread_mutex::Scoped hold(m_lock);
    return FreeOf(Snapshot{m_read.load(std::memory_order_acquire), m_reserved});
}
unsigned cycle_buffer::used_space() { return UsedOf(Snap()); }

uint32_t cycle_buffer::Advance(uint32_t at, uint32_t len) const {
    return static_cast<uint32_t>((static_cast<uint64_t>(at) + len) % m_capacity);
}

void cycle_buffer::CopyIn(uint32_t at, const unsigned char* src, uint32_t len) {
    if (len == 0) return;
    uint32_t to_end = static_cast<uint32_t>(m_end - (m_start + at)) + 1;
    if (to_end < len) {
        memcpy(m_start + at, src, to_end);
        memcpy(m_start, src + to_end, len - to_end);
    } else {
        memcpy(m_start + at, src, len);
    }
}

void cycle_buffer::CopyOut(uint32_t at, unsigned char* dst, uint32_t len) const {
    if (len == 0) return;
    uint32_t to_end = static_cast<uint32_t>(m_end - (m_start + at)) + 1;
    if (to_end < len) {
        memcpy(dst, m_start + at, to_end);
        memcpy(dst + to_end, m_start, len - to_end);
    } else {
        memcpy(dst, m_start + at, len);
    }
}

void cycle_buffer::CountWritten(uint32_t len) {
    if (m_readable.load(std::memory_order_relaxed) == 1) return;
    m_written_before_readable += len;
    if (m_written_before_readable > m_threshold) m_readable.store(1, std::memory_order_relaxed);
}

void cycle_buffer::Wait() {
    ++m_waiters;
    m_changed.wait(m_lock);
    --m_waiters;
}

// Takes len bytes after every earlier reservation; false (with the free space) when they do not
// fit. A reset that is waiting for writes under way holds new writers back until it is done.
bool cycle_buffer::Reserve(uint64_t len, uint32_t* at, uint32_t* ticket, uint32_t* free) {
    thread_mutex::Scoped hold(m_lock);
    while (m_resets_waiting > 0) Wait();
    *free = FreeOf(Snapshot{m_read.load(std::memory_order_acquire), m_reserved});
    if (*free < len) return false;
    CountWritten(static_cast<uint32_t>(len));
    *at = m_reserved;
    m_reserved = Advance(m_reserved, static_cast<uint32_t>(len));
    *ticket = m_next_ticket++;
    ++m_in_flight;
    return true;
}

// Makes a copied reservation readable once every reservation before it is.
void cycle_buffer::Publish(uint32_t at, uint32_t len, uint32_t ticket) {
    bool writers_wait, reader_served = false;
    {
        thread_mutex::Scoped hold(m_lock);
        while (m_published_ticket != ticket) Wait();
        m_write.store(Advance(at, len), std::memory_order_release);
        ++m_published_ticket;
        --m_in_flight;
        writers_wait = m_waiters > 0;
        if (m_reader_wants > 0 && ReaderSatisfied(m_reader_wants)) {
            m_reader_wants = 0;  // one ring per wait
            reader_served = true;
        }
    }
    // Outside the lock, so a woken thread does not at once block on it again.
    if (writers_wait) m_changed.notify_all();
    if (reader_served) RingBell(false);
}

int cycle_buffer::write(const unsigned char* data, int len) {
    if (len <= 0 || data == nullptr) return 0;
    uint32_t at = 0, ticket = 0, free = 0;
    if (!Reserve(static_cast<uint32_t>(len), &at, &ticket, &free)) {
        OrvexPrintLog(kTag,
                      "\n cycle_buffer::write:free_space_size < len free_space_size:%d,len:%d,\n",
                      static_cast<int>(free), len);
        return 0;
    }
    CopyIn(at, data, static_cast<uint32_t>(len));
    Publish(at, static_cast<uint32_t>(len), ticket);
    return len;
}

int cycle_buffer::read(unsigned char* dst, int len) {
    if (m_readable.load(std::memory_order_relaxed) != 1) return 0;
    if (len < 0 || (dst == nullptr && len > 0)) return 0;
    Snapshot s = Snap();
    if (UsedOf(s) < static_cast<uint32_t>(len)) return 0;
    CopyOut(s.read, dst, static_cast<uint32_t>(len));
    m_read.store(Advance(s.read, static_cast<uint32_t>(len)), std::memory_order_release);
    return len;
}

bool cycle_buffer::newwrite(const unsigned char* data, int len, unsigned timestamp, bool) {
    if (len < 0 || (data == nullptr && len > 0)) return false;
    if (timestamp == 0) timestamp = GetTimeStampMillsec();
    uint32_t total = static_cast<uint32_t>(len) + kItemHeaderSize;
    uint32_t at = 0, ticket = 0, free = 0;
    if (!Reserve(static_cast<uint64_t>(len) + kItemHeaderSize, &at, &ticket, &free)) {
        OrvexPrintLog(kTag,
                      "\n cycle_buffer::newwrite:free_space_size < ( len + buffer_item_header_size "
                      ") free_space_size:%d,len:%d,buffer_item_header_size:%d,\n",
                      static_cast<int>(free), len, kItemHeaderSize);
        return false;
    }
    unsigned char header[kItemHeaderSize];
    int32_t length = len;
    memcpy(header, &length, 4);
    memcpy(header + 4, &timestamp, 4);
    // Header and payload are published by one store, so the consumer never sees half an item.
    CopyIn(at, header, kItemHeaderSize);
    CopyIn(Advance(at, kItemHeaderSize), data, static_cast<uint32_t>(len));
    Publish(at, total, ticket);
    return true;
}

bool cycle_buffer::newread(Buffer_Item& item) {
    if (m_item_stream_valid.load(std::memory_order_relaxed) == 0) {
        OrvexPuts("\n video FRAME_SIZE is not enough !--1 ");
        OrvexLog(kTag, "\n video FRAME_SIZE is not enough !--1 \n");
        return false;
    }
    if (m_readable.load(std::memory_order_relaxed) != 1) return false;
    Snapshot s = Snap();
    uint32_t used = UsedOf(s);
    if (used < kItemHeaderSize + 1) return false;
    unsigned char header[kItemHeaderSize];
    CopyOut(s.read, header, kItemHeaderSize);
    int32_t length;
    uint32_t timestamp;
    memcpy(&length, header, 4);
    memcpy(&timestamp, header + 4, 4);
    item.length = length;
    item.timestamp = timestamp;
    uint32_t payload_at = Advance(s.read, kItemHeaderSize);
    if (length < 0 || length > kFrameSizeMax) {
        OrvexPrintLog(kTag, "\n video FRAME_SIZE is not enough,bufferitem.length  = %d,! --2 \n",
                      length);
        m_item_stream_valid.store(0, std::memory_order_relaxed);
        // The header is consumed; the payload stays in the ring unread.
        m_read.store(payload_at, std::memory_order_release);
        return false;
    }
    // Items are published whole, so a short ring here means it was corrupted by raw use.
    if (used < kItemHeaderSize + static_cast<uint32_t>(length)) return false;
    CopyOut(payload_at, item.data, static_cast<uint32_t>(length));
    m_read.store(Advance(payload_at, static_cast<uint32_t>(length)), std::memory_order_release);
    return true;
}

// Writes already under way finish first (their items are emptied with the rest); new ones wait.
void cycle_buffer::reset() {
    thread_mutex::Scoped hold(m_lock);
    ++m_resets_waiting;
    while (m_in_flight > 0) Wait();
    --m_resets_waiting;
    m_read.store(0, std::memory_order_release);
    m_write.store(0, std::memory_order_release);
    m_reserved = 0;
    if (m_waiters > 0) m_changed.notify_all();
}

bool cycle_buffer::ReaderSatisfied(uint32_t len) {
    if (m_readable.load(std::memory_order_relaxed) != 1) return false;
    return UsedOf(Snapshot{m_read.load(std::memory_order_acquire),
                           m_write.load(std::memory_order_acquire)}) >= len;
}

void cycle_buffer::RingBell(bool wake) {
    {
        thread_mutex::Scoped hold(m_bell_lock);
        if (wake) {
            m_bell_wake = true;
        } else {
            m_bell_data = true;
        }
    }
    m_bell.notify_one();
}

bool cycle_buffer::wait_readable(uint32_t len, unsigned max_ms) {
    auto until = std::chrono::steady_clock::now() + std::chrono::milliseconds(max_ms);
    {
        // A ring left by an earlier wait that timed out is not for this one.
        thread_mutex::Scoped bell(m_bell_lock);
        m_bell_data = false;
    }
    {
        thread_mutex::Scoped hold(m_lock);
        if (ReaderSatisfied(len)) return false;
        m_reader_wants = len > 0 ? len : 1;
    }
    {
        thread_mutex::Scoped bell(m_bell_lock);
        while (!m_bell_data && !m_bell_wake) {
            if (!m_bell.wait_until(m_bell_lock, until)) break;
        }
        m_bell_data = m_bell_wake = false;
    }
    thread_mutex::Scoped hold(m_lock);
    m_reader_wants = 0;
    return true;
}

void cycle_buffer::wake_reader() { RingBell(true); }
