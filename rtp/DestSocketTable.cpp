#include "rtp/DestSocketTable.h"

#include <arpa/inet.h>

void DestSocketTable::Add(void* key, int port, const std::string& ip) {
    TLock::Scoped hold(lock_);
    auto it = map_.find(key);
    const bool waiting = it != map_.end() ? it->second->waiting : join_at_key_;
    map_[key] = std::make_unique<DestSocketInfo>(DestSocketInfo{port, ip, waiting});
    changed_ = true;
}

void DestSocketTable::SetJoinAtKey(bool on) {
    TLock::Scoped hold(lock_);
    join_at_key_ = on;
    if (!on) return;
    for (auto& entry : map_) entry.second->waiting = true;
    changed_ = true;
}

bool DestSocketTable::AdmitWaiting() {
    TLock::Scoped hold(lock_);
    bool any = false;
    for (auto& entry : map_) {
        any = any || entry.second->waiting;
        entry.second->waiting = false;
    }
    if (any) changed_ = true;
    return any;
}

void DestSocketTable::Del(void* key) {
    TLock::Scoped hold(lock_);
    map_.erase(key);
    changed_ = true;
}

void DestSocketTable::Clear() {
    TLock::Scoped hold(lock_);
    map_.clear();
}

void DestSocketTable::MarkChanged() {
    TLock::Scoped hold(lock_);
    changed_ = true;
}

size_t DestSocketTable::size() {
    TLock::Scoped hold(lock_);
    return map_.size();
}

void DestSocketTable::Refresh() {
    TLock::Scoped hold(lock_);
    if (!changed_) return;
    targets_.clear();
    for (const auto& entry : map_) {
        if (entry.second->waiting) continue;
        sockaddr_in to{};
        to.sin_family = AF_INET;
        to.sin_port = htons(static_cast<uint16_t>(entry.second->port));
        to.sin_addr.s_addr = inet_addr(entry.second->ip.c_str());
        targets_.push_back(to);
    }
    changed_ = false;
}
