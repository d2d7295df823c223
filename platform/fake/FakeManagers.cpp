#include "platform/fake/FakeManagers.h"

#include <string>

#include "sync/thread_mutex.h"

namespace platform {
namespace fake {
namespace {

class FakeAudioClient final : public AudioManagerClient {
public:
    explicit FakeAudioClient(CallJournal& journal) : journal_(journal) {}
    int setAudioCaptureSource(int path, int source) override {
        journal_.Add("AudioManager::setAudioCaptureSource(" + std::to_string(path) + ", " +
                     std::to_string(source) + ")");
        return 0;
    }
    void disconnect() override { journal_.Add("AudioManager::disconnect"); }

private:
    CallJournal& journal_;
};

}  // namespace

class FakePipClient final : public PipManagerClient {
public:
    explicit FakePipClient(FakePipManager& owner) : owner_(owner) {}
    int setListener(std::shared_ptr<PipManagerListener> listener) override {
        owner_.journal_.Add("PipManager::setListener");
        thread_mutex::Scoped hold(owner_.mutex_);
        owner_.listener_ = std::move(listener);
        return owner_.listener_result_;
    }
    void disconnect() override { owner_.journal_.Add("PipManager::disconnect"); }

private:
    FakePipManager& owner_;
};

std::shared_ptr<PipManagerClient> FakePipManager::connect() {
    journal_.Add("PipManager::connect");
    if (!connectable_) return nullptr;
    return std::make_shared<FakePipClient>(*this);
}

std::shared_ptr<PipManagerListener> FakePipManager::listener() {
    thread_mutex::Scoped hold(mutex_);
    return listener_;
}

void FakePipManager::DeliverEvent(int event_type) {
    std::shared_ptr<PipManagerListener> l = listener();
    if (l) l->eventCallback(event_type);
}

std::shared_ptr<AudioManagerClient> FakeAudioManager::connect() {
    journal_.Add("AudioManager::connect");
    if (!connectable_) return nullptr;
    return std::make_shared<FakeAudioClient>(journal_);
}

}  // namespace fake
}  // namespace platform
