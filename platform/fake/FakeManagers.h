#pragma once

#include <atomic>
#include <memory>

#include "platform/AudioManagerPort.h"
#include "platform/PipManagerPort.h"
#include "platform/fake/CallJournal.h"
#include "sync/thread_mutex.h"

namespace platform {
namespace fake {

// PIP manager that records its calls in the journal; tests choose whether connect succeeds
// and what setListener returns, and deliver events to the registered listener.
// Thread contract: any thread.
class FakePipManager final : public PipManagerPort {
public:
    explicit FakePipManager(CallJournal& journal) : journal_(journal) {}
    std::shared_ptr<PipManagerClient> connect() override;

    void set_connectable(bool yes) { connectable_ = yes; }
    void set_listener_result(int result) { listener_result_ = result; }
    std::shared_ptr<PipManagerListener> listener();
    // Calls the registered listener's eventCallback, as the platform's thread would.
    void DeliverEvent(int event_type);

private:
    friend class FakePipClient;
    CallJournal& journal_;
    std::atomic<bool> connectable_{true};
    std::atomic<int> listener_result_{0};
    thread_mutex mutex_;
    std::shared_ptr<PipManagerListener> listener_ ORVEX_GUARDED_BY(mutex_);
};

// Audio manager that records its calls in the journal.
class FakeAudioManager final : public AudioManagerPort {
public:
    explicit FakeAudioManager(CallJournal& journal) : journal_(journal) {}
    std::shared_ptr<AudioManagerClient> connect() override;
    void set_connectable(bool yes) { connectable_ = yes; }

private:
    CallJournal& journal_;
    std::atomic<bool> connectable_{true};
};

}  // namespace fake
}  // namespace platform
