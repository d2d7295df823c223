#pragma once

#include <memory>
#include <mutex>
#include <vector>

#include "platform/BinderPort.h"

namespace platform {
namespace android_port {

// libbinder in the vendor domain (the driver is given by the caller, e.g. /dev/vndbinder).
// Thread contract: as BinderPort; the registered services are guarded by a mutex.
class AndroidBinder final : public BinderPort {
public:
    int initWithDriver(const char* driver) override;
    const void* defaultServiceManager() override;
    int addService(const char* name, std::shared_ptr<BinderService> service) override;
    void startThreadPool() override;
    int transact(const char* service, uint32_t code, const ParcelWriter& data) override;

private:
    std::mutex mutex_;
    // The services stay registered for the life of the process; keeping them here too means a
    // service manager that drops its reference cannot leave a pool thread with a dead object.
    std::vector<std::shared_ptr<BinderService>> services_;
};

}  // namespace android_port
}  // namespace platform
