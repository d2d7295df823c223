#pragma once

#include "platform/PublishPort.h"

namespace platform {
namespace host {

// Publishing with libavformat: FLV over its RTMP client, MPEG-TS over libsrt. The stream is
// muxed as the encoders gave it. Every network wait ends within 5 s, or at once when the
// target's stop flag is raised (libavformat's interrupt callback). libavformat lives in
// liborvex_host_av.so, loaded at the first Open: ORVEX_HOST_AV_MODULE names the file, else it
// is the one beside the executable, else the one the build made. Not loading is an Open that
// fails with the loader's reason.
class HostPublish final : public PublishPort {
public:
    std::unique_ptr<PublishSession> Open(const PublishTarget& target, std::string* error) override;
};

}  // namespace host
}  // namespace platform
