#include "web/ConnectionWarden.h"

#include <algorithm>

ConnectionWarden::ConnectionWarden(Limits limits, Closer close)
    : m_limits(limits), m_close(std::move(close)) {}

bool ConnectionWarden::Opened(const void* id, int fd, uint32_t address, uint64_t now_ms) {
    thread_mutex::Scoped hold(m_lock);
    m_entries[id] = Entry{fd, address, now_ms, true, false, ++m_arrivals};
    int waiting = 0;
    for (const auto& e : m_entries) waiting += e.second.waiting && !e.second.closing ? 1 : 0;
    if (waiting <= m_limits.waiting_max) return false;
    Evict(id);
    return true;
}

void ConnectionWarden::Evict(const void* newcomer) {
    // An address with the most waiting connections gives one up: among those, the oldest, so
    // that a newcomer is never the one to go unless its address is the crowd.
    std::map<uint32_t, int> per_address;
    int most = 0;
    for (const auto& e : m_entries) {
        if (e.second.waiting && !e.second.closing)
            most = std::max(most, ++per_address[e.second.address]);
    }
    Entry* victim = nullptr;
    for (auto& e : m_entries) {
        Entry& c = e.second;
        if (e.first == newcomer || !c.waiting || c.closing || per_address[c.address] != most)
            continue;
        if (victim == nullptr || c.since_ms < victim->since_ms ||
            (c.since_ms == victim->since_ms && c.order < victim->order)) {
            victim = &c;
        }
    }
    if (victim == nullptr) return;
    victim->closing = true;
    m_close(victim->fd);
}

void ConnectionWarden::Answering(const void* id) {
    thread_mutex::Scoped hold(m_lock);
    auto it = m_entries.find(id);
    if (it != m_entries.end()) it->second.waiting = false;
}

void ConnectionWarden::Answered(const void* id, uint64_t now_ms) {
    thread_mutex::Scoped hold(m_lock);
    auto it = m_entries.find(id);
    if (it == m_entries.end()) return;
    it->second.waiting = true;
    it->second.since_ms = now_ms;
}

void ConnectionWarden::Closed(const void* id) {
    thread_mutex::Scoped hold(m_lock);
    m_entries.erase(id);
}

int ConnectionWarden::Sweep(uint64_t now_ms) {
    thread_mutex::Scoped hold(m_lock);
    int closed = 0;
    for (auto& e : m_entries) {
        Entry& c = e.second;
        if (c.waiting && !c.closing && now_ms - c.since_ms >= m_limits.request_deadline_ms) {
            c.closing = true;
            m_close(c.fd);
            ++closed;
        }
    }
    return closed;
}

int ConnectionWarden::waiting() const {
    thread_mutex::Scoped hold(m_lock);
    int n = 0;
    for (const auto& e : m_entries) n += e.second.waiting && !e.second.closing ? 1 : 0;
    return n;
}
