#pragma once

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <string>
#include <vector>

#include "platform/PublishPort.h"

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
        std::unique_lock<std::mutex> hold(mutex_);
        return changed_.wait_for(hold, std::chrono::milliseconds(ms), [&] { return pred(*this); });
    }

    // Read under WaitFor's lock.
    int attempts_locked() const { return attempts_; }
    size_t writes_locked() const { return writes_.size(); }
    int sessions_locked() const { return static_cast<int>(opened_.size()); }
    int64_t last_pts_locked() const { return writes_.empty() ? -1 : writes_.back().pts_ms; }

private:
    friend class FakePublishSession;
    bool Record(int session, bool video, bool key, int64_t pts, const uint8_t* data, size_t len,
                const std::atomic<bool>* stop);

    std::mutex mutex_;
    std::condition_variable changed_;
    bool refuse_ = false;
    bool drop_ = false;
    bool stall_ = false;
    int attempts_ = 0;
    std::vector<PublishTarget> opened_;
    std::vector<Write> writes_;
};

}  // namespace fake
}  // namespace platform
