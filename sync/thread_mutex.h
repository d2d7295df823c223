#pragma once

#include <pthread.h>
#include <time.h>

#include <chrono>

#include "sync/ThreadAnnotations.h"

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
    friend class thread_condition;
    pthread_mutex_t mutex_;
};

// A condition variable over thread_mutex. It waits on the mutex itself: condition_variable_any
// takes a second, internal lock on every wait and notify, which costs the hot rings extra
// context switches. Deadlines are on the steady clock.
// Thread contract: any thread; waiters hold the mutex they pass.
class thread_condition {
public:
    thread_condition() {
        pthread_condattr_t attr;
        pthread_condattr_init(&attr);
        pthread_condattr_setclock(&attr, CLOCK_MONOTONIC);  // what steady_clock reads
        pthread_cond_init(&cond_, &attr);
        pthread_condattr_destroy(&attr);
    }
    ~thread_condition() { pthread_cond_destroy(&cond_); }
    thread_condition(const thread_condition&) = delete;
    thread_condition& operator=(const thread_condition&) = delete;

    void wait(thread_mutex& m) ORVEX_REQUIRES(m) { pthread_cond_wait(&cond_, &m.mutex_); }
    // False when the deadline passed.
    bool wait_until(thread_mutex& m, std::chrono::steady_clock::time_point until)
        ORVEX_REQUIRES(m) {
        auto ns = std::chrono::duration_cast<std::chrono::nanoseconds>(until.time_since_epoch());
        if (ns.count() < 0) ns = std::chrono::nanoseconds(0);
        timespec at{};
        at.tv_sec = static_cast<time_t>(ns.count() / 1000000000);
        at.tv_nsec = static_cast<long>(ns.count() % 1000000000);
        return pthread_cond_timedwait(&cond_, &m.mutex_, &at) == 0;
    }
    template <typename Rep, typename Period>
    bool wait_for(thread_mutex& m, std::chrono::duration<Rep, Period> d) ORVEX_REQUIRES(m) {
        return wait_until(m,
                          std::chrono::steady_clock::now() +
                              std::chrono::duration_cast<std::chrono::steady_clock::duration>(d));
    }
    void notify_one() { pthread_cond_signal(&cond_); }
    void notify_all() { pthread_cond_broadcast(&cond_); }

private:
    pthread_cond_t cond_;
};
