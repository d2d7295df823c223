#include "platform/host/HostBinder.h"

#include <fcntl.h>
#include <poll.h>
#include <pthread.h>
#include <sys/epoll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/uio.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <system_error>
#include <utility>

#include "platform/Ports.h"
#include "platform/host/BinderWire.h"
#include "platform/host/HostLog.h"
#include "sync/thread_mutex.h"

namespace platform {
namespace host {
namespace {

using namespace binder_wire;

constexpr size_t kReadChunk = 64 * 1024;
// A connection keeps a buffer this big between transactions: any frame the rings can hold.
constexpr size_t kKeptBytes = 1u << 20;

}  // namespace

HostBinder::HostBinder() : HostBinder(BinderDir()) {}

HostBinder::HostBinder(std::string dir, int pool_threads)
    : dir_(std::move(dir)), pool_size_(pool_threads > 0 ? pool_threads : 1) {
    epoll_fd_.reset(epoll_create1(EPOLL_CLOEXEC));
    wake_fd_.reset(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
    if (epoll_fd_.valid() && wake_fd_.valid()) {
        epoll_event ev{};
        ev.events = EPOLLIN;
        ev.data.ptr = nullptr;
        if (epoll_ctl(epoll_fd_.get(), EPOLL_CTL_ADD, wake_fd_.get(), &ev) == 0) return;
    }
    HostLogf(kLogWarn, "binder: no epoll/eventfd (%s); services cannot be offered",
             strerror(errno));
    epoll_fd_.reset();
    wake_fd_.reset();
}

HostBinder::~HostBinder() { Stop(); }

std::string HostBinder::BinderDir() {
    const char* env = getenv("ORVEX_BINDER_DIR");
    if (env != nullptr && env[0] != '\0') return env;
    // Abstract names live in the network namespace, so a service started in a namespace of
    // its own (as the end-to-end scripts and a second service on one machine are) never meets
    // another's; the user id keeps two users' services apart within one namespace.
    return std::string(1, '\0') + "orvex-binder-" + std::to_string(getuid());
}

std::string HostBinder::ServicePath(const std::string& dir, const char* name) {
    return dir + "/" + name;
}

bool HostBinder::ValidName(const char* name) {
    if (name == nullptr || name[0] == '\0') return false;
    if (strcmp(name, ".") == 0 || strcmp(name, "..") == 0) return false;
    for (const char* p = name; *p != '\0'; ++p) {
        char c = *p;
        bool ok = (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') ||
                  c == '.' || c == '_' || c == '-';
        if (!ok) return false;
    }
    return true;
}

int HostBinder::initWithDriver(const char* driver) {
    driver_ = driver != nullptr ? driver : "";
    HostLogf(kLogDebug, "binder: driver %s (host: sockets in %s)", driver_.c_str(),
             PrintablePath(dir_).c_str());
    return 0;
}

const void* HostBinder::defaultServiceManager() {
    static const char kServiceManager = 0;
    return &kServiceManager;
}

int HostBinder::addService(const char* name, std::shared_ptr<BinderService> service) {
    if (!ValidName(name) || service == nullptr) return -EINVAL;
    const std::string path = ServicePath(dir_, name);
    const std::string shown = PrintablePath(path);
    const bool abstract = path[0] == '\0';
    sockaddr_un addr;
    const socklen_t addr_len = MakeAddress(path, &addr);
    if (addr_len == 0) {
        HostLogf(kLogDebug, "binder: socket path too long: %s", shown.c_str());
        return -ENAMETOOLONG;
    }
    thread_mutex::Scoped hold(mutex_);
    if (stopping_ || !epoll_fd_.valid()) return -EINVAL;
    struct stat st {};
    if (!abstract) {
        if (mkdir(dir_.c_str(), 0700) != 0 && errno != EEXIST) {
            int err = errno;
            HostLogf(kLogWarn, "binder: cannot create %s: %s", dir_.c_str(), strerror(err));
            return -err;
        }
        if (lstat(path.c_str(), &st) == 0) {
            if (!S_ISSOCK(st.st_mode)) {
                HostLogf(kLogWarn, "binder: %s exists and is not a socket", path.c_str());
                return -EEXIST;
            }
            // Nonblocking, so a live service with a full backlog still counts as live.
            int probe = ConnectTo(path, true);
            if (probe >= 0 || errno == EAGAIN) {
                if (probe >= 0) close(probe);
                HostLogf(kLogError,
                         "binder: %s is served by another running orvex; to run a second one, "
                         "give it a folder of its own (ORVEX_BINDER_DIR=/some/dir) or start it "
                         "in a network namespace of its own (unshare -n) without that variable",
                         path.c_str());
                return -EADDRINUSE;
            }
            unlink(path.c_str());  // left behind by a process that did not stop cleanly
        }
    }
    int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    if (fd < 0) return -errno;
    if (bind(fd, reinterpret_cast<const sockaddr*>(&addr), addr_len) != 0 || listen(fd, 16) != 0 ||
        (!abstract && lstat(path.c_str(), &st) != 0)) {
        int err = errno;
        if (err == EADDRINUSE && abstract) {
            HostLogf(kLogError,
                     "binder: %s is served by another running orvex in this network namespace; "
                     "to run a second one, start it in a network namespace of its own (unshare "
                     "-n)",
                     name);
        } else {
            HostLogf(kLogWarn, "binder: cannot listen on %s: %s", shown.c_str(), strerror(err));
        }
        close(fd);
        return -err;
    }
    auto listener = std::make_unique<Listener>();
    listener->name = name;
    listener->path = path;
    listener->fd = fd;
    listener->dev = st.st_dev;
    listener->ino = st.st_ino;
    listener->service = std::move(service);
    epoll_event ev{};
    ev.events = EPOLLIN;
    ev.data.ptr = listener.get();
    if (epoll_ctl(epoll_fd_.get(), EPOLL_CTL_ADD, fd, &ev) != 0) {
        int err = errno;
        close(fd);
        if (!abstract) unlink(path.c_str());
        return -err;
    }
    listeners_.push_back(std::move(listener));
    HostLogf(kLogDebug, "binder: service %s on %s", name, shown.c_str());
    return 0;
}

void HostBinder::startThreadPool() {
    thread_mutex::Scoped hold(mutex_);
    if (started_ || stopping_ || !epoll_fd_.valid()) return;
    started_ = true;
    for (int i = 0; i < pool_size_; ++i) {
        try {
            pool_.emplace_back(&HostBinder::PoolLoop, this);
        } catch (const std::system_error& e) {
            HostLogf(kLogWarn, "binder: pool thread %d not started: %s", i, e.what());
            break;
        }
    }
}

void HostBinder::PoolLoop() {
    pthread_setname_np(pthread_self(), "orvex-binder");
    for (;;) {
        epoll_event ev;
        int n = epoll_wait(epoll_fd_.get(), &ev, 1, -1);
        if (n < 0 && errno != EINTR) {
            HostLogf(kLogWarn, "binder: epoll_wait: %s", strerror(errno));
            return;
        }
        if (n <= 0) continue;
        auto* listener = static_cast<Listener*>(ev.data.ptr);
        if (listener == nullptr) return;  // the wake eventfd: Stop
        int fd = accept4(listener->fd, nullptr, nullptr, SOCK_CLOEXEC);
        if (fd < 0) {
            // EAGAIN: another pool thread took the connection. Running out of descriptors
            // would otherwise spin on the still-readable listener.
            if (errno == EMFILE || errno == ENFILE || errno == ENOBUFS || errno == ENOMEM) {
                HostLogf(kLogWarn, "binder: accept: %s", strerror(errno));
                usleep(100 * 1000);
            }
            continue;
        }
        if (!FromOwnUser(fd)) {
            close(fd);
            continue;
        }
        if (!TrackConnection(fd)) {
            close(fd);
            return;
        }
        SetTimeouts(fd, kStallSeconds);
        Serve(fd, *listener->service);
        UntrackConnection(fd);
        close(fd);
    }
}

bool HostBinder::FromOwnUser(int fd) {
    // An abstract name has no file whose mode keeps other users out, as the per-user folder
    // did; the kernel's word on who connected does instead.
    ucred peer{};
    socklen_t len = sizeof peer;
    if (getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &peer, &len) == 0 &&
        (peer.uid == getuid() || peer.uid == 0)) {
        return true;
    }
    if (!refused_told_.exchange(true)) {
        HostLogf(kLogWarn, "binder: a connection from user %d refused: only %d and root may send",
                 static_cast<int>(peer.uid), static_cast<int>(getuid()));
    }
    return false;
}

void HostBinder::Serve(int fd, BinderService& service) {
    std::vector<uint8_t> data;
    for (;;) {
        // Idle between transactions for as long as the client likes; the stall timeout only
        // applies once a transaction has begun.
        WaitReadable(fd);
        uint8_t header[kHeaderSize];
        ssize_t got = ReadFull(fd, header, sizeof header);
        if (got == 0) return;
        if (got != static_cast<ssize_t>(sizeof header)) {
            HostLogf(kLogDebug, "binder: connection dropped in a transaction header (%zd bytes)",
                     got);
            return;
        }
        const Header h = ReadHeader(header);
        const uint32_t code = h.code, flags = h.flags, size = h.size;
        if (size > kMaxTransactionSize) {
            HostLogf(kLogDebug, "binder: transaction %u of %u bytes refused", code, size);
            SendStatus(fd, kBadValue);
            DrainQueued(fd);
            return;
        }
        // Grown as bytes arrive, so a peer lying about the size costs only what it sent, and
        // kept for the next transaction, so a stream of frames allocates nothing.
        for (size_t at = 0; at < size;) {
            size_t want = std::min<size_t>(size - at, kReadChunk);
            if (data.size() < at + want) data.resize(at + want);
            if (ReadFull(fd, data.data() + at, want) != static_cast<ssize_t>(want)) {
                HostLogf(kLogDebug, "binder: transaction %u dropped after %zu of %u bytes", code,
                         at, size);
                return;
            }
            at += want;
        }
        ParcelReader reader(data.data(), size);
        if (!SendStatus(fd, Dispatch(service, code, reader, flags))) return;
        if (data.capacity() > kKeptBytes) std::vector<uint8_t>().swap(data);
    }
}

int HostBinder::Dispatch(BinderService& service, uint32_t code, ParcelReader& reader,
                         uint32_t flags) {
    try {
        return service.onTransact(code, reader, flags);
    } catch (const std::exception& e) {
        HostLogf(kLogDebug, "binder: transaction %u threw: %s", code, e.what());
    } catch (...) {
        HostLogf(kLogDebug, "binder: transaction %u threw", code);
    }
    return kUnknownError;
}

std::shared_ptr<BinderService> HostBinder::LocalService(const char* name) {
    thread_mutex::Scoped hold(mutex_);
    if (stopping_) return nullptr;
    for (const auto& listener : listeners_) {
        if (listener->name == name) return listener->service;
    }
    return nullptr;
}

bool HostBinder::TrackConnection(int fd) {
    thread_mutex::Scoped hold(mutex_);
    if (stopping_) return false;
    serving_.push_back(fd);
    return true;
}

void HostBinder::UntrackConnection(int fd) {
    thread_mutex::Scoped hold(mutex_);
    serving_.erase(std::remove(serving_.begin(), serving_.end(), fd), serving_.end());
}

void HostBinder::Stop() {
    // Taken out under the lock and joined outside it: a pool thread takes the lock to end.
    std::vector<std::thread> pool;
    std::vector<std::unique_ptr<Listener>> listeners;
    {
        thread_mutex::Scoped hold(mutex_);
        if (stopping_) return;
        stopping_ = true;
        // Wakes threads blocked on a client; they close the descriptor themselves.
        for (int fd : serving_) shutdown(fd, SHUT_RDWR);
        pool.swap(pool_);
        listeners.swap(listeners_);
    }
    if (wake_fd_.valid()) {
        uint64_t one = 1;
        ssize_t ignored = write(wake_fd_.get(), &one, sizeof one);
        (void)ignored;
    }
    for (std::thread& t : pool) t.join();
    for (auto& listener : listeners) {
        close(listener->fd);  // an abstract name goes with its socket
        // Only our own file: a newer service may have taken the name since.
        struct stat st;
        if (listener->path[0] != '\0' && lstat(listener->path.c_str(), &st) == 0 &&
            st.st_dev == listener->dev && st.st_ino == listener->ino) {
            unlink(listener->path.c_str());
        }
    }
    epoll_fd_.reset();
    wake_fd_.reset();
    thread_mutex::Scoped hold(outgoing_mutex_);
    for (auto& entry : outgoing_) {
        thread_mutex::Scoped hold_out(entry.second->mutex);
        if (entry.second->fd >= 0) close(entry.second->fd);
        entry.second->fd = -1;
    }
}

}  // namespace host
}  // namespace platform
