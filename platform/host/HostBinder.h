#pragma once

#include <sys/types.h>

#include <atomic>
#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "platform/BinderPort.h"
#include "platform/UniqueFd.h"
#include "sync/thread_mutex.h"

namespace platform {
namespace host {

// Binder on Linux: each service listens on a Unix stream socket at <dir>/<name> (by default
// an abstract name, which belongs to the network namespace; see BinderDir), and a connection
// carries transactions in the Parcel layout of BinderPort.h, one after another.
//
//   request  uint32 code, uint32 flags, uint32 size, then `size` bytes of Parcel data
//   reply    int32 status: what the service's onTransact returned
//
// All integers are little-endian. Only this process's user and root may connect. A size above
// kMaxTransactionSize is answered with kBadValue and the connection is closed; a connection
// that ends, or stalls for kStallSeconds, in the middle of a transaction is dropped without a
// reply. A pool thread serves one connection until it closes, so transactions on different
// connections run concurrently and clients beyond the pool's size wait in the listen backlog
// until a connection ends.
//
// A transaction to a service registered on this same object is dispatched in-process: its
// onTransact runs on the caller's thread over the caller's bytes, as binder runs a call into
// its own process, with no socket, copy or thread hand-off. Other processes (orvex-feed) use
// the sockets.
//
// Thread contract: addService/startThreadPool/Stop from one thread; transact from any thread
// (one connection per service, transactions to the same service are serialised).
class HostBinder final : public BinderPort {
public:
    static constexpr uint32_t kMaxTransactionSize = 16u << 20;
    static constexpr int kPoolThreads = 4;
    static constexpr int kStallSeconds = 5;
    // Status values as Android's binder numbers them.
    static constexpr int kBadValue = -22;            // BAD_VALUE
    static constexpr int kDeadObject = -32;          // DEAD_OBJECT: nobody listens
    static constexpr int kUnknownError = INT32_MIN;  // UNKNOWN_ERROR: onTransact threw

    // Sockets in BinderDir().
    HostBinder();
    explicit HostBinder(std::string dir, int pool_threads = kPoolThreads);
    ~HostBinder() override;

    HostBinder(const HostBinder&) = delete;
    HostBinder& operator=(const HostBinder&) = delete;

    int initWithDriver(const char* driver) override;
    const void* defaultServiceManager() override;
    // 0, or a negative errno: bad name (-EINVAL), the name served by a live socket
    // (-EADDRINUSE, logged with how to run a second service), a file of that name that is not a
    // socket (-EEXIST), socket errors.
    int addService(const char* name, std::shared_ptr<BinderService> service) override;
    void startThreadPool() override;
    int transact(const char* service, uint32_t code, const ParcelWriter& data) override;

    // Waits for transactions in progress, stops the pool, closes every connection and removes
    // this object's socket files. Further calls do nothing.
    void Stop();

    const std::string& dir() const { return dir_; }
    const std::string& driver() const { return driver_; }

    // $ORVEX_BINDER_DIR (a folder, for scripts that want the sockets as files), else
    // "\0orvex-binder-UID": Linux abstract names, one set per network namespace and user.
    static std::string BinderDir();
    // Where the service `name` listens, given a BinderDir().
    static std::string ServicePath(const std::string& dir, const char* name);
    // One path component of [A-Za-z0-9._-], neither "." nor "..".
    static bool ValidName(const char* name);

private:
    struct Listener {
        std::string name;
        std::string path;
        int fd = -1;
        dev_t dev = 0;
        ino_t ino = 0;
        std::shared_ptr<BinderService> service;
    };
    struct Outgoing {
        thread_mutex mutex;
        int fd ORVEX_GUARDED_BY(mutex) = -1;
    };

    static int Dispatch(BinderService& service, uint32_t code, ParcelReader& reader,
                        uint32_t flags);
    std::shared_ptr<BinderService> LocalService(const char* name);
    void PoolLoop();
    void Serve(int fd, BinderService& service);
    bool FromOwnUser(int fd);
    bool TrackConnection(int fd);
    void UntrackConnection(int fd);
    Outgoing& OutgoingFor(const std::string& service);
    int TransactOn(Outgoing& out, const std::string& path, const uint8_t header[12],
                   const std::vector<uint8_t>& data) ORVEX_REQUIRES(out.mutex);

    const std::string dir_;
    const int pool_size_;
    std::string driver_;
    UniqueFd epoll_fd_;
    UniqueFd wake_fd_;  // an eventfd in the epoll set: readable once Stop begins

    std::atomic<bool> refused_told_{false};  // another user's connection was logged once

    thread_mutex mutex_;
    bool stopping_ ORVEX_GUARDED_BY(mutex_) = false;
    bool started_ ORVEX_GUARDED_BY(mutex_) = false;
    std::vector<std::unique_ptr<Listener>> listeners_ ORVEX_GUARDED_BY(mutex_);
    std::vector<int> serving_ ORVEX_GUARDED_BY(mutex_);
    std::vector<std::thread> pool_ ORVEX_GUARDED_BY(mutex_);

    thread_mutex outgoing_mutex_;
    std::map<std::string, std::unique_ptr<Outgoing>> outgoing_ ORVEX_GUARDED_BY(outgoing_mutex_);
};

}  // namespace host
}  // namespace platform
