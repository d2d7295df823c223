#pragma once

#include <netinet/in.h>

#include <map>
#include <memory>
#include <string>
#include <vector>

#include "sync/TLock.h"

// One client destination of a send session.
struct DestSocketInfo {
    int port;        // host order
    std::string ip;  // dotted IPv4, as the RTSP layer gave it
    bool waiting;    // added while the table admits new ones at a key picture only
};

// The destinations of a send session, keyed by the requesting RTSP session, and the send
// thread's own copy of them (ascending key order), refreshed once per loop turn.
// Thread contract: Add, Del and Clear from any thread, under the owner's class-wide lock
// (passed in); Refresh and targets() only from the send thread (or, for a driven sender, under
// its drive lock).
class DestSocketTable {
public:
    explicit DestSocketTable(TLock& lock) : lock_(lock) {}

    // A key already present gets the new value. A new key waits for AdmitWaiting while
    // SetJoinAtKey is on: it is left out of targets() until then.
    void Add(void* key, int port, const std::string& ip);
    // Called as a run starts: turned on, the destinations already present wait as well, since
    // none of them has had a picture of this run.
    void SetJoinAtKey(bool on);
    // Lets the waiting destinations in (at a key picture); false when none was waiting.
    bool AdmitWaiting();
    void Del(void* key);
    // Forgets every destination; the send thread's copy stays as it is.
    void Clear();
    void MarkChanged();
    // Rebuilds the send thread's copy if anything changed since the last rebuild.
    void Refresh();
    const std::vector<sockaddr_in>& targets() const { return targets_; }
    size_t size();

private:
    TLock& lock_;
    std::map<void*, std::unique_ptr<DestSocketInfo>> map_;
    bool changed_ = true;
    bool join_at_key_ = false;
    std::vector<sockaddr_in> targets_;  // send thread only
};
