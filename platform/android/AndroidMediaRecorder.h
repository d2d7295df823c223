#pragma once

#include <memory>
#include <string>

#include "platform/CapturePorts.h"

namespace platform {
namespace android_port {

// MediaRecorder through libmedia. Thread contract: the capture thread.
class AndroidMediaRecorderPort final : public MediaRecorderPort {
public:
    std::shared_ptr<MediaRecorder> create(const std::string& package) override;
};

}  // namespace android_port
}  // namespace platform
