#pragma once

#include "platform/PublishPort.h"

namespace platform {
namespace host {

// Publishing with libavformat: FLV over its RTMP client, MPEG-TS over libsrt. The stream is
// muxed as the encoders gave it. Every network wait ends within 5 s, or at once when the
// target's stop flag is raised (libavformat's interrupt callback).
class HostPublish final : public PublishPort {
public:
    std::unique_ptr<PublishSession> Open(const PublishTarget& target, std::string* error) override;
};

}  // namespace host
}  // namespace platform
