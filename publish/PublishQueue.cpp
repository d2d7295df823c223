#include "publish/PublishQueue.h"

#include <chrono>
#include <cstring>

PublishQueue::PublishQueue(size_t bytes, uint32_t span_ms) : m_ring(bytes), m_span_ms(span_ms) {}

void PublishQueue::CopyIn(const void* data, size_t len) {
    m_ring.Put(m_head, data, len);
    m_head += len;
}

bool PublishQueue::Push(Kind kind, bool key, uint32_t time_ms, const uint8_t* data, size_t len) {
    const bool restart = kind == Kind::kVideo && key;
    thread_mutex::Scoped hold(m_lock);
    if (m_stopped) return false;
    if (m_dropping && !restart) {
        ++m_dropped;
        return false;
    }
    bool fits = sizeof(Header) + len <= m_ring.size() - (m_head - m_tail);
    if (fits && m_head != m_tail) {
        Header oldest{};
        m_ring.Get(m_tail, &oldest, sizeof oldest);
        fits = static_cast<int32_t>(time_ms - oldest.time_ms) <= static_cast<int32_t>(m_span_ms);
    }
    if (!fits) {
        m_dropping = true;
        ++m_dropped;
        return false;
    }
    m_dropping = false;
    Header header{static_cast<uint32_t>(len),
                  time_ms,
                  static_cast<uint8_t>(kind),
                  static_cast<uint8_t>(key ? 1 : 0),
                  {0, 0}};
    const bool was_empty = m_head == m_tail;
    CopyIn(&header, sizeof header);
    CopyIn(data, len);
    if (was_empty) m_ready.notify_one();
    return true;
}

bool PublishQueue::Pop(Frame* frame, std::vector<uint8_t>* buffer, int wait_ms, unsigned* dropped) {
    thread_mutex::Scoped hold(m_lock);
    const auto until = std::chrono::steady_clock::now() + std::chrono::milliseconds(wait_ms);
    while (!m_stopped && m_head == m_tail) {
        if (!m_ready.wait_until(m_lock, until)) break;
    }
    if (dropped != nullptr) {
        *dropped = m_dropped;
        m_dropped = 0;
    }
    if (m_stopped || m_head == m_tail) return false;
    Header header{};
    m_ring.Get(m_tail, &header, sizeof header);
    if (buffer->size() < header.len) buffer->resize(header.len);
    m_ring.Get(m_tail + sizeof header, buffer->data(), header.len);
    m_tail += sizeof header + header.len;
    frame->kind = static_cast<Kind>(header.kind);
    frame->key = header.key != 0;
    frame->time_ms = header.time_ms;
    frame->len = header.len;
    return true;
}

void PublishQueue::Stop() {
    thread_mutex::Scoped hold(m_lock);
    m_stopped = true;
    m_ready.notify_all();
}

void PublishQueue::DropToKeyFrame() {
    thread_mutex::Scoped hold(m_lock);
    m_dropping = true;
    ++m_dropped;
}
