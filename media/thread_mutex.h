#pragma once

#include <pthread.h>

#include "media/ThreadAnnotations.h"

// Plain non-recursive mutex. Thread contract: lock/unlock from any thread; locking twice from
// one thread deadlocks. The destructor waits for a current holder before destroying.
class ORVEX_CAPABILITY("mutex") thread_mutex {
public:
    thread_mutex() { pthread_mutex_init(&mutex_, nullptr); }
    ~thread_mutex() {
        pthread_mutex_lock(&mutex_);
        pthread_mutex_unlock(&mutex_);
        pthread_mutex_destroy(&mutex_);
    }
    thread_mutex(const thread_mutex&) = delete;
    thread_mutex& operator=(const thread_mutex&) = delete;

    void lock() ORVEX_ACQUIRE() { pthread_mutex_lock(&mutex_); }
    void unlock() ORVEX_RELEASE() { pthread_mutex_unlock(&mutex_); }

    class ORVEX_SCOPED_CAPABILITY Scoped {
    public:
        explicit Scoped(thread_mutex& m) ORVEX_ACQUIRE(m) : m_(m) { m_.lock(); }
        ~Scoped() ORVEX_RELEASE() { m_.unlock(); }
        Scoped(const Scoped&) = delete;
        Scoped& operator=(const Scoped&) = delete;

    private:
        thread_mutex& m_;
    };

private:
    pthread_mutex_t mutex_;
};
