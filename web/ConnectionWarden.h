#pragma once

#include <cstdint>
#include <functional>
#include <map>

#include "sync/thread_mutex.h"

// Keeps connections that have not become viewers from crowding out those that would: a
// connection waiting for its request (connected, or between requests) must send it whole
// within a deadline, and at most `waiting_max` may wait at once. When one more arrives, the
// oldest waiting connection of the address with the most of them is closed, so a crowd of
// idle or trickling connections gives way to newcomers, and a viewer that is being answered
// or is watching is never touched. Closing is `close(fd)` of the caller's (a shutdown, which
// its server then notices), called under the warden's lock so that it never reaches a
// descriptor number that its connection has already given back.
// Thread contract: thread safe.
class ConnectionWarden {
public:
    struct Limits {
        int waiting_max = 32;
        uint64_t request_deadline_ms = 5000;
    };
    using Closer = std::function<void(int fd)>;

    ConnectionWarden(Limits limits, Closer close);

    // A new connection; true when another was closed to make room for it.
    bool Opened(const void* id, int fd, uint32_t address, uint64_t now_ms);
    // A whole request arrived: the connection is being answered, out of the deadline's reach.
    void Answering(const void* id);
    // The answer is done; the connection waits for its next request from `now_ms`.
    void Answered(const void* id, uint64_t now_ms);
    void Closed(const void* id);
    // Closes the connections that waited past the deadline; how many.
    int Sweep(uint64_t now_ms);

    int waiting() const;

private:
    struct Entry {
        int fd;
        uint32_t address;
        uint64_t since_ms;
        bool waiting;
        bool closing;    // closed by the warden, not yet gone
        uint64_t order;  // when it came, among those of one millisecond too
    };
    // Closes one waiting connection other than `newcomer`.
    void Evict(const void* newcomer) ORVEX_REQUIRES(m_lock);

    const Limits m_limits;
    const Closer m_close;
    mutable thread_mutex m_lock;
    std::map<const void*, Entry> m_entries ORVEX_GUARDED_BY(m_lock);
    uint64_t m_arrivals ORVEX_GUARDED_BY(m_lock) = 0;
};
