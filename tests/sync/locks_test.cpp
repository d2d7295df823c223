#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <thread>

#include "sync/TLock.h"
#include "sync/thread_mutex.h"

namespace {

void Acquire(thread_mutex& m) ORVEX_ACQUIRE(m) { m.lock(); }
void Release(thread_mutex& m) ORVEX_RELEASE(m) { m.unlock(); }
void Acquire(TLock& l) ORVEX_ACQUIRE(l) { l.Lock(); }
void Release(TLock& l) ORVEX_RELEASE(l) { l.UnLock(); }

template <typename T>
class LockTest : public ::testing::Test {};
using LockTypes = ::testing::Types<thread_mutex, TLock>;
TYPED_TEST_SUITE(LockTest, LockTypes);

// Destroying a lock that another thread holds must wait for that thread to let go.
TYPED_TEST(LockTest, DestructorWaitsForHolder) {
    auto* lock = new TypeParam();
    std::atomic<bool> held{false};
    std::atomic<bool> released{false};
    std::thread holder([&] {
        Acquire(*lock);
        held = true;
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
        released = true;
        Release(*lock);
    });
    while (!held) std::this_thread::yield();
    delete lock;
    EXPECT_TRUE(released.load());
    holder.join();
}

}  // namespace
