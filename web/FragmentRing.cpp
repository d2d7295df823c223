#include "web/FragmentRing.h"

#include <algorithm>
#include <chrono>
#include <cstring>

namespace {

void PutWord(uint8_t* p, uint32_t v) { memcpy(p, &v, sizeof v); }
uint32_t GetWord(const uint8_t* p) {
    uint32_t v;
    memcpy(&v, p, sizeof v);
    return v;
}

constexpr uint32_t kKeyFlag = 1;

}  // namespace

FragmentRing::FragmentRing(size_t capacity) : m_ring(std::max<size_t>(capacity, 64)) {}

void FragmentRing::Restart(const uint8_t* init, size_t len, const std::string& content_type) {
    thread_mutex::Scoped hold(m_lock);
    m_init.assign(init, init + len);
    m_content_type = content_type;
    m_last_key = kNoKey;
    if (++m_generation == 0) m_generation = 1;
    m_written.notify_all();
}

bool FragmentRing::Append(const uint8_t* head, size_t head_len, const uint8_t* body,
                          size_t body_len, bool key) {
    const size_t total = kRecordHeader + head_len + body_len;
    if (total > m_ring.size() / 4) return false;
    uint8_t header[kRecordHeader];
    PutWord(header, static_cast<uint32_t>(head_len + body_len));
    PutWord(header + 4, key ? kKeyFlag : 0);
    thread_mutex::Scoped hold(m_lock);
    if (m_generation == 0) return false;
    const uint64_t at = m_write_pos;
    m_ring.Put(at, header, kRecordHeader);
    m_ring.Put(at + kRecordHeader, head, head_len);
    m_ring.Put(at + kRecordHeader + head_len, body, body_len);
    m_write_pos = at + total;
    m_last_write = std::chrono::steady_clock::now();
    if (key) {
        m_last_key = at;
        m_last_key_write = m_last_write;
    }
    m_written.notify_all();
    return true;
}

void FragmentRing::Stop() {
    thread_mutex::Scoped hold(m_lock);
    m_stopped = true;
    m_written.notify_all();
}

bool FragmentRing::WaitForStart(Reader* reader, std::string* content_type, int wait_ms) {
    using std::chrono::milliseconds;
    const auto begin = std::chrono::steady_clock::now();
    const auto until = begin + milliseconds(wait_ms);
    thread_mutex::Scoped hold(m_lock);
    auto ready = [&]() ORVEX_REQUIRES(m_lock) {
        const auto now = std::chrono::steady_clock::now();
        return m_last_key != kNoKey && !Overwritten(m_last_key) &&
               now - m_last_write < milliseconds(kLiveMs) &&
               (now - m_last_key_write < milliseconds(kFreshKeyMs) ||
                now - begin >= milliseconds(kFreshWaitMs));
    };
    while (!m_stopped && !ready() && std::chrono::steady_clock::now() < until) {
        m_written.wait_until(m_lock, std::min(until, begin + milliseconds(kFreshWaitMs)));
    }
    if (m_stopped || !ready()) return false;
    *reader = Reader{};
    reader->generation = m_generation;
    reader->pos = m_last_key;
    *content_type = m_content_type;
    return true;
}

long FragmentRing::Read(Reader* reader, uint8_t* out, size_t cap, int wait_ms, const char** why) {
    const auto until = std::chrono::steady_clock::now() + std::chrono::milliseconds(wait_ms);
    thread_mutex::Scoped hold(m_lock);
    for (;;) {
        if (m_stopped) {
            *why = "the service stops";
            return -1;
        }
        if (reader->generation != m_generation) {
            *why = "the stream changed";
            return -1;
        }
        if (reader->init_sent < m_init.size()) {
            size_t n = std::min(cap, m_init.size() - reader->init_sent);
            memcpy(out, m_init.data() + reader->init_sent, n);
            reader->init_sent += n;
            return static_cast<long>(n);
        }
        if (reader->record_left == 0) {
            // Between fragments a reader may skip: to the latest key fragment when it has
            // fallen far behind, or when what it would read next is gone.
            const uint64_t lag = m_write_pos - reader->pos;
            if ((lag > m_ring.size() / 4 || Overwritten(reader->pos)) && m_last_key != kNoKey &&
                m_last_key > reader->pos && !Overwritten(m_last_key)) {
                reader->pos = m_last_key;
                ++reader->skips;
            }
            if (Overwritten(reader->pos)) {
                *why = "it fell behind by more than the ring holds";
                return -1;
            }
            if (reader->pos == m_write_pos) {
                if (!m_written.wait_until(m_lock, until)) return 0;
                continue;
            }
            uint8_t header[kRecordHeader];
            m_ring.Get(reader->pos, header, kRecordHeader);
            reader->pos += kRecordHeader;
            reader->record_left = GetWord(header);
        }
        if (Overwritten(reader->pos)) {
            *why = "it stopped reading in the middle of a fragment";
            return -1;
        }
        size_t n = static_cast<size_t>(std::min<uint64_t>(cap, reader->record_left));
        m_ring.Get(reader->pos, out, n);
        reader->pos += n;
        reader->record_left -= n;
        return static_cast<long>(n);
    }
}
