#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <string>
#include <vector>

#include "platform/PublishPort.h"
#include "sync/thread_mutex.h"

namespace platform {
namespace fake {

// A media server that the test scripts: it records every connection attempt and everything
// written, refuses connections while told to, and can hold writes (a stalled server) until
// released or the publisher stops.
// Thread contract: any thread.
class FakePublish final : public PublishPort {
public:
    struct Write {
        int session;  // 1 for the first session opened
        bool video;
        bool key;
        int64_t pts_ms;
        std::vector<uint8_t> data;
    };

    std::unique_ptr<PublishSession> Open(const PublishTarget& target, std::string* error) override;

    // Opens fail (with "connection refused") while this is set.
    void SetRefuse(bool refuse);
    // The next write of the current session fails, as a dropped connection does.
    void DropConnection();
    // Writes wait while this is set (or until the target's stop flag is raised).
    void SetStall(bool stall);

    int attempts();
    std::vector<PublishTarget> opened();
    std::vector<Write> writes();
    // Waits up to `ms` for `pred()` to hold, under the fake's lock.
    template <typename Pred>
    bool WaitFor(int ms, Pred pred) {
        const auto until = std::chrono::steady_clock::now() + std::chrono::milliseconds(ms);
        thread_mutex::Scoped hold(mutex_);
        while (!pred(*this)) {
            if (!changed_.wait_until(mutex_, until)) return pred(*this);
        }
        return true;
    }

    // Read under WaitFor's lock, by its predicate.
    int attempts_locked() const ORVEX_NO_THREAD_SAFETY_ANALYSIS { return attempts_; }
    size_t writes_locked() const ORVEX_NO_THREAD_SAFETY_ANALYSIS { return writes_.size(); }
    int sessions_locked() const ORVEX_NO_THREAD_SAFETY_ANALYSIS {
        return static_cast<int>(opened_.size());
    }
    int64_t last_pts_locked() const ORVEX_NO_THREAD_SAFETY_ANALYSIS {
        return writes_.empty() ? -1 : writes_.back().pts_ms;
    }

private:
    friend class FakePublishSession;
    bool Record(int session, bool video, bool key, int64_t pts, const uint8_t* data, size_t len,
                const std::atomic<bool>* stop);

    thread_mutex mutex_;
    thread_condition changed_;
    bool refuse_ ORVEX_GUARDED_BY(mutex_) = false;
    bool drop_ ORVEX_GUARDED_BY(mutex_) = false;
    bool stall_ ORVEX_GUARDED_BY(mutex_) = false;
    int attempts_ ORVEX_GUARDED_BY(mutex_) = 0;
    std::vector<PublishTarget> opened_ ORVEX_GUARDED_BY(mutex_);
    std::vector<Write> writes_ ORVEX_GUARDED_BY(mutex_);
};

}  // namespace fake
}  // namespace platform
