#pragma once

#include <string>

#include "platform/PublishPort.h"

namespace platform {
namespace host {

// What HostPublish asks of the libavformat module (liborvex_host_av.so), which is loaded only
// when a server is first published to, so that FFmpeg's libraries (and all they pull in) stay
// unmapped in a service that does not publish. Both sides are built by the same build.
//
// The module's one entry point: a connected session with its header written, which the caller
// owns, or null with `*error` set.
using AvPublishOpen = PublishSession* (*)(const PublishTarget& target, std::string* error);
constexpr char kAvPublishOpen[] = "orvex_host_av_open";

}  // namespace host
}  // namespace platform
