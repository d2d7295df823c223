#pragma once

#include <pthread.h>

#include "sync/ThreadAnnotations.h"

// Plain non-recursive lock with virtual Lock/UnLock. Thread contract: Lock/UnLock from any
// thread; locking twice from one thread deadlocks. The destructor waits for a current holder.
class ORVEX_CAPABILITY("mutex") TLock {
public:
    TLock() { pthread_mutex_init(&mutex_, nullptr); }
    virtual ~TLock() {
        pthread_mutex_lock(&mutex_);
        pthread_mutex_unlock(&mutex_);
        pthread_mutex_destroy(&mutex_);
    }
    TLock(const TLock&) = delete;
    TLock& operator=(const TLock&) = delete;

    virtual void Lock() ORVEX_ACQUIRE() { pthread_mutex_lock(&mutex_); }
    virtual void UnLock() ORVEX_RELEASE() { pthread_mutex_unlock(&mutex_); }

    class ORVEX_SCOPED_CAPABILITY Scoped {
    public:
        explicit Scoped(TLock& l) ORVEX_ACQUIRE(l) : l_(l) { l_.Lock(); }
        ~Scoped() ORVEX_RELEASE() { l_.UnLock(); }
        Scoped(const Scoped&) = delete;
        Scoped& operator=(const Scoped&) = delete;

    private:
        TLock& l_;
    };

private:
    pthread_mutex_t mutex_;
};
