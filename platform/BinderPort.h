#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

// Port to the platform's binder (Android: ProcessState, defaultServiceManager, BBinder,
// Parcel) in the vendor domain. The service side registers a named service whose
// transactions run on the binder pool threads; the client side (the platform's media
// recorder, or a host tool) sends transactions to a named service.
// Thread contract: Init/addService/startThreadPool from one thread at start-up; transact from
// any thread; BinderService::onTransact is called on pool threads, possibly concurrently.

namespace platform {

// Status codes as Android's binder numbers them.
constexpr int kBinderOk = 0;
constexpr int kBinderUnknownTransaction = -74;  // UNKNOWN_TRANSACTION (-EBADMSG)

// Reads a transaction's data the way Parcel does: int32 little-endian, in-place bytes padded
// to a multiple of 4. Never reads past the data: what is missing reads as 0 / null.
class ParcelReader {
public:
    ParcelReader(const uint8_t* data, size_t size) : data_(data), size_(size) {}
    int32_t readInt32();
    // `len` bytes in place, or null when fewer remain (the position then moves to the end).
    const uint8_t* readInplace(size_t len);
    size_t dataAvail() const { return size_ - pos_; }

private:
    const uint8_t* data_;
    size_t size_;
    size_t pos_ = 0;
};

// Builds transaction data in the same layout.
class ParcelWriter {
public:
    void writeInt32(int32_t v);
    void writeInplace(const void* data, size_t len);  // padded to a multiple of 4
    const std::vector<uint8_t>& data() const { return data_; }
    void clear() { data_.clear(); }

private:
    std::vector<uint8_t> data_;
};

class BinderService {
public:
    virtual ~BinderService() = default;
    // kBinderOk, or kBinderUnknownTransaction for codes the service does not handle (the
    // platform's default handling then answers).
    virtual int onTransact(uint32_t code, ParcelReader& data, uint32_t flags) = 0;
};

class BinderPort {
public:
    virtual ~BinderPort() = default;
    // ProcessState::initWithDriver(driver); 0 on success.
    virtual int initWithDriver(const char* driver) = 0;
    // The service manager's address, for the log only.
    virtual const void* defaultServiceManager() = 0;
    virtual int addService(const char* name, std::shared_ptr<BinderService> service) = 0;
    virtual void startThreadPool() = 0;
    // Client side: one transaction to a named service; its status.
    virtual int transact(const char* service, uint32_t code, const ParcelWriter& data) = 0;
};

}  // namespace platform
