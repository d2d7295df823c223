#include "platform/android/AndroidBinder.h"

#include <limits>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include <binder/Binder.h>
#include <binder/IServiceManager.h>
#include <binder/Parcel.h>
#include <binder/ProcessState.h>
#include <utils/String16.h>

namespace platform {
namespace android_port {
namespace {

// Hands each transaction to the service as a ParcelReader over the Parcel's own bytes, so the
// service parses exactly what the sender wrote (int32 little-endian, in-place data padded to 4).
class ServiceBridge : public android::BBinder {
public:
    explicit ServiceBridge(std::shared_ptr<BinderService> service) : service_(std::move(service)) {}

protected:
    android::status_t onTransact(uint32_t code, const android::Parcel& data, android::Parcel* reply,
                                 uint32_t flags) override {
        ParcelReader reader(data.data(), data.dataSize());
        const int status = service_->onTransact(code, reader, flags);
        if (status == kBinderUnknownTransaction) {
            // Interface queries, dumps and pings get the platform's usual answers.
            return android::BBinder::onTransact(code, data, reply, flags);
        }
        return status;
    }

private:
    std::shared_ptr<BinderService> service_;
};

}  // namespace

int AndroidBinder::initWithDriver(const char* driver) {
    return android::ProcessState::initWithDriver(driver) != nullptr ? 0 : android::NO_INIT;
}

const void* AndroidBinder::defaultServiceManager() {
    return android::defaultServiceManager().get();
}

int AndroidBinder::addService(const char* name, std::shared_ptr<BinderService> service) {
    if (service == nullptr) {
        return android::BAD_VALUE;
    }
    {
        std::lock_guard<std::mutex> lock(mutex_);
        services_.push_back(service);
    }
    android::sp<android::IBinder> binder = new ServiceBridge(std::move(service));
    return android::defaultServiceManager()->addService(android::String16(name), binder, false);
}

void AndroidBinder::startThreadPool() { android::ProcessState::self()->startThreadPool(); }

int AndroidBinder::transact(const char* service, uint32_t code, const ParcelWriter& data) {
    android::sp<android::IBinder> binder =
        android::defaultServiceManager()->checkService(android::String16(service));
    if (binder == nullptr) {
        return android::NAME_NOT_FOUND;
    }
    android::Parcel parcel;
    const std::vector<uint8_t>& bytes = data.data();
    if (!bytes.empty()) {
        const android::status_t set = parcel.setData(bytes.data(), bytes.size());
        if (set != android::NO_ERROR) {
            return set;
        }
    }
    android::Parcel reply;
    return binder->transact(code, parcel, &reply);
}

}  // namespace android_port
}  // namespace platform
