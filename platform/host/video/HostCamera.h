#pragma once

#include <memory>
#include <string>

#include "platform/CapturePorts.h"
#include "sync/thread_mutex.h"

namespace platform {
namespace host {

// The host's stand-in for the television's picture camera: it keeps the parameters it is
// given and who holds the lock; the picture itself comes from the media recorder's pattern.
// Thread contract: any thread.
class HostCamera final : public Camera {
public:
    static const char* const kDefaultParameters;

    std::string getParameters() override;
    int setParameters(const std::string& flattened) override;
    int unlock() override;
    int lock() override;

    // True until unlock hands it to a recorder.
    bool locked() override;

private:
    thread_mutex mutex_;
    std::string parameters_ ORVEX_GUARDED_BY(mutex_) = kDefaultParameters;
    bool locked_ ORVEX_GUARDED_BY(mutex_) = true;
};

// Every camera id connects, to a fresh HostCamera. Thread contract: any thread.
class HostCameraPort final : public CameraPort {
public:
    std::shared_ptr<Camera> connect(int camera_id, const std::string& package, int uid,
                                    int pid) override;
};

}  // namespace host
}  // namespace platform
