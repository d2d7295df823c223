#pragma once

#include <memory>

#include "platform/AudioManagerPort.h"
#include "platform/CapturePorts.h"
#include "platform/PipManagerPort.h"
#include "sync/thread_mutex.h"

namespace platform {
namespace host {

// A Linux machine has no vendor TV managers: these log each call to the platform log under
// "orvex:::host" and succeed, so the service runs its "sa" paths unchanged.
// Thread contract: any thread.
class HostPipManager final : public PipManagerPort {
public:
    std::shared_ptr<PipManagerClient> connect() override;
    // The listener registered last (none before), so a host tool can deliver events.
    std::shared_ptr<PipManagerListener> listener();

private:
    friend class HostPipClient;
    thread_mutex mutex_;
    std::shared_ptr<PipManagerListener> listener_ ORVEX_GUARDED_BY(mutex_);
};

class HostAudioManager final : public AudioManagerPort {
public:
    std::shared_ptr<AudioManagerClient> connect() override;
};

class HostTvManager final : public TvManagerPort {
public:
    std::shared_ptr<TvManagerClient> connect() override;
};

// The PX audio-output library: every call logs and succeeds; the output path's handle is 4.
class HostPxAudioOut final : public PxAudioOutPort {
public:
    int Init(unsigned short first_field) override;
    int GetHandle(int path, int* handle) override;
    int Open(int path, int param, int* handle) override;
    int SetAttr(int handle, int attr, int* value) override;
    int Close(int handle) override;
    int DeInit() override;
};

}  // namespace host
}  // namespace platform
