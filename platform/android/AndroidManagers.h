#pragma once

#include <memory>

#include "platform/AudioManagerPort.h"
#include "platform/CapturePorts.h"
#include "platform/PipManagerPort.h"

namespace platform {
namespace android_port {

// The vendor's TV, picture-in-picture and audio managers (declared in vendor/orvex_vendor.h).
// Thread contract: as the ports; each client wraps one vendor connection.
class AndroidPipManager final : public PipManagerPort {
public:
    std::shared_ptr<PipManagerClient> connect() override;
};

class AndroidAudioManager final : public AudioManagerPort {
public:
    std::shared_ptr<AudioManagerClient> connect() override;
};

class AndroidTvManager final : public TvManagerPort {
public:
    std::shared_ptr<TvManagerClient> connect() override;
};

}  // namespace android_port
}  // namespace platform
