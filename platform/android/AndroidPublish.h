#pragma once

#include "platform/PublishPort.h"

namespace platform {
namespace android_port {

// The television's vendor partition has no muxer library to publish with: every Open fails,
// and the publisher says so once.
class AndroidPublish final : public PublishPort {
public:
    std::unique_ptr<PublishSession> Open(const PublishTarget& target, std::string* error) override;
};

}  // namespace android_port
}  // namespace platform
