#include "platform/fake/FakePublish.h"

#include "sync/thread_mutex.h"

namespace platform {
namespace fake {

class FakePublishSession final : public PublishSession {
public:
    FakePublishSession(FakePublish* owner, int number, const std::atomic<bool>* stop)
        : owner_(owner), number_(number), stop_(stop) {}
    bool WriteVideo(const uint8_t* data, size_t len, int64_t pts_ms, bool key) override {
        return owner_->Record(number_, true, key, pts_ms, data, len, stop_);
    }
    bool WriteAudio(const uint8_t* data, size_t len, int64_t pts_ms) override {
        return owner_->Record(number_, false, false, pts_ms, data, len, stop_);
    }

private:
    FakePublish* owner_;
    int number_;
    const std::atomic<bool>* stop_;
};

std::unique_ptr<PublishSession> FakePublish::Open(const PublishTarget& target, std::string* error) {
    thread_mutex::Scoped hold(mutex_);
    ++attempts_;
    changed_.notify_all();
    if (refuse_) {
        if (error != nullptr) *error = "connection refused";
        return nullptr;
    }
    opened_.push_back(target);
    drop_ = false;
    return std::make_unique<FakePublishSession>(this, static_cast<int>(opened_.size()),
                                                target.stop);
}

bool FakePublish::Record(int session, bool video, bool key, int64_t pts, const uint8_t* data,
                         size_t len, const std::atomic<bool>* stop) {
    thread_mutex::Scoped hold(mutex_);
    // A stalled server: the write waits as a full socket would, until the stall ends or the
    // owner stops (polled, as the host's interrupt callback polls the flag).
    while (stall_ && (stop == nullptr || !stop->load())) {
        changed_.wait_for(mutex_, std::chrono::milliseconds(5));
    }
    if (drop_ || (stop != nullptr && stop->load())) return false;
    writes_.push_back(Write{session, video, key, pts, std::vector<uint8_t>(data, data + len)});
    changed_.notify_all();
    return true;
}

void FakePublish::SetRefuse(bool refuse) {
    thread_mutex::Scoped hold(mutex_);
    refuse_ = refuse;
}

void FakePublish::DropConnection() {
    thread_mutex::Scoped hold(mutex_);
    drop_ = true;
}

void FakePublish::SetStall(bool stall) {
    thread_mutex::Scoped hold(mutex_);
    stall_ = stall;
    changed_.notify_all();
}

int FakePublish::attempts() {
    thread_mutex::Scoped hold(mutex_);
    return attempts_;
}

std::vector<PublishTarget> FakePublish::opened() {
    thread_mutex::Scoped hold(mutex_);
    return opened_;
}

std::vector<FakePublish::Write> FakePublish::writes() {
    thread_mutex::Scoped hold(mutex_);
    return writes_;
}

}  // namespace fake
}  // namespace platform
