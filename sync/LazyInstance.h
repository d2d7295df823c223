#pragma once

#include <atomic>

#include "sync/TLock.h"

// The singletons' creation: a lock-free read of the published pointer, and creation checked
// again under the owner's lock, so two first callers make one object.
template <typename T, typename Make>
T* LazyInstance(std::atomic<T*>& slot, TLock& lock, Make make) {
    T* p = slot.load(std::memory_order_acquire);
    if (p != nullptr) return p;
    TLock::Scoped hold(lock);
    p = slot.load(std::memory_order_relaxed);
    if (p == nullptr) {
        p = make();
        slot.store(p, std::memory_order_release);
    }
    return p;
}
