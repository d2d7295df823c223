#pragma once

#include <memory>
#include <mutex>

#include "platform/AudioManagerPort.h"
#include "platform/PipManagerPort.h"

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
    std::mutex mutex_;
    std::shared_ptr<PipManagerListener> listener_;
};

class HostAudioManager final : public AudioManagerPort {
public:
    std::shared_ptr<AudioManagerClient> connect() override;
};

}  // namespace host
}  // namespace platform
