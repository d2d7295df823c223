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
#include "platform/host/HostLog.h"

namespace platform {
namespace host {
namespace {

constexpr size_t kHeaderSize = 12;
constexpr size_t kReadChunk = 64 * 1024;
// A connection keeps a buffer this big between transactions: any frame the rings can hold.
constexpr size_t kKeptBytes = 1u << 20;

void PutLe32(uint8_t* at, uint32_t v) {
    for (int i = 0; i < 4; ++i) at[i] = static_cast<uint8_t>(v >> (8 * i));
}

uint32_t GetLe32(const uint8_t* at) {
    return uint32_t{at[0]} | uint32_t{at[1]} << 8 | uint32_t{at[2]} << 16 | uint32_t{at[3]} << 24;
}

bool MakeAddress(const std::string& path, sockaddr_un* addr) {
    if (path.size() >= sizeof addr->sun_path) return false;
    memset(addr, 0, sizeof *addr);
    addr->sun_family = AF_UNIX;
    memcpy(addr->sun_path, path.c_str(), path.size() + 1);
    return true;
}

// A connected socket, or -1 with errno set.
int ConnectTo(const std::string& path, bool nonblocking) {
    sockaddr_un addr;
    if (!MakeAddress(path, &addr)) {
        errno = ENAMETOOLONG;
        return -1;
    }
    int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | (nonblocking ? SOCK_NONBLOCK : 0), 0);
    if (fd < 0) return -1;
    if (connect(fd, reinterpret_cast<const sockaddr*>(&addr), sizeof addr) != 0) {
        int saved = errno;
        close(fd);
        errno = saved;
        return -1;
    }
    return fd;
}

// The bytes read: `len`, fewer when the peer closed first, -1 on an error or a timeout.
ssize_t ReadFull(int fd, void* buf, size_t len) {
    size_t got = 0;
    while (got < len) {
        ssize_t n = recv(fd, static_cast<uint8_t*>(buf) + got, len - got, 0);
        if (n == 0) break;
        if (n < 0) {
            if (errno == EINTR) continue;
            return -1;
        }
        got += static_cast<size_t>(n);
    }
    return static_cast<ssize_t>(got);
}

bool SendAll(int fd, const void* buf, size_t len) {
    size_t sent = 0;
    while (sent < len) {
        ssize_t n = send(fd, static_cast<const uint8_t*>(buf) + sent, len - sent, MSG_NOSIGNAL);
        if (n < 0) {
            if (errno == EINTR) continue;
            return false;
        }
        sent += static_cast<size_t>(n);
    }
    return true;
}

// Header and payload in one call, so the service wakes once for a transaction, not twice.
bool SendBoth(int fd, const uint8_t* header, size_t header_len, const uint8_t* data, size_t len) {
    iovec parts[2] = {{const_cast<uint8_t*>(header), header_len},
                      {const_cast<uint8_t*>(data), len}};
    msghdr msg{};
    msg.msg_iov = parts;
    msg.msg_iovlen = 2;
    while (msg.msg_iovlen > 0) {
        ssize_t n = sendmsg(fd, &msg, MSG_NOSIGNAL);
        if (n < 0) {
            if (errno == EINTR) continue;
            return false;
        }
        auto sent = static_cast<size_t>(n);
        while (msg.msg_iovlen > 0 && sent >= msg.msg_iov->iov_len) {
            sent -= msg.msg_iov->iov_len;
            ++msg.msg_iov;
            --msg.msg_iovlen;
        }
        if (msg.msg_iovlen > 0) {
            msg.msg_iov->iov_base = static_cast<uint8_t*>(msg.msg_iov->iov_base) + sent;
            msg.msg_iov->iov_len -= sent;
        }
    }
    return true;
}

bool SendStatus(int fd, int status) {
    uint8_t reply[4];
    PutLe32(reply, static_cast<uint32_t>(status));
    return SendAll(fd, reply, sizeof reply);
}

void SetTimeouts(int fd, int seconds) {
    timeval tv{};
    tv.tv_sec = seconds;
    setsockopt(fd, SOL_SOCKET, SO_RCVTIMEO, &tv, sizeof tv);
    setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &tv, sizeof tv);
}

// Closing with unread bytes queued resets the connection, which can cost the peer the reply
// just sent; what already arrived is read and dropped, up to a bound.
void DrainQueued(int fd) {
    shutdown(fd, SHUT_WR);
    uint8_t sink[4096];
    for (int i = 0; i < 256 && recv(fd, sink, sizeof sink, MSG_DONTWAIT) > 0; ++i) {
    }
}

// Blocks until `fd` has data or its peer (or Stop) shut it down.
void WaitReadable(int fd) {
    pollfd p{fd, POLLIN, 0};
    while (poll(&p, 1, -1) < 0 && errno == EINTR) {
    }
}

}  // namespace

HostBinder::HostBinder() : HostBinder(BinderDir()) {}

HostBinder::HostBinder(std::string dir, int pool_threads)
    : dir_(std::move(dir)), pool_size_(pool_threads > 0 ? pool_threads : 1) {
    epoll_fd_ = epoll_create1(EPOLL_CLOEXEC);
    wake_fd_ = eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
    if (epoll_fd_ >= 0 && wake_fd_ >= 0) {
        epoll_event ev{};
        ev.events = EPOLLIN;
        ev.data.ptr = nullptr;
        if (epoll_ctl(epoll_fd_, EPOLL_CTL_ADD, wake_fd_, &ev) == 0) return;
    }
    HostLogf(kLogWarn, "binder: no epoll/eventfd (%s); services cannot be offered",
             strerror(errno));
    if (epoll_fd_ >= 0) close(epoll_fd_);
    if (wake_fd_ >= 0) close(wake_fd_);
    epoll_fd_ = wake_fd_ = -1;
}

HostBinder::~HostBinder() { Stop(); }

std::string HostBinder::BinderDir() {
    const char* env = getenv("ORVEX_BINDER_DIR");
    if (env != nullptr && env[0] != '\0') return env;
    // Per user, so that two users' services never meet in one folder.
    const char* runtime = getenv("XDG_RUNTIME_DIR");
    if (runtime != nullptr && runtime[0] == '/') return std::string(runtime) + "/orvex-binder";
    return "/tmp/orvex-binder-" + std::to_string(getuid());
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
    HostLogf(kLogDebug, "binder: driver %s (host: sockets in %s)", driver_.c_str(), dir_.c_str());
    return 0;
}

const void* HostBinder::defaultServiceManager() {
    static const char kServiceManager = 0;
    return &kServiceManager;
}

int HostBinder::addService(const char* name, std::shared_ptr<BinderService> service) {
    if (!ValidName(name) || service == nullptr) return -EINVAL;
    std::string path = dir_ + "/" + name;
    sockaddr_un addr;
    if (!MakeAddress(path, &addr)) {
        HostLogf(kLogDebug, "binder: socket path too long: %s", path.c_str());
        return -ENAMETOOLONG;
    }
    std::lock_guard<std::mutex> hold(mutex_);
    if (stopping_ || epoll_fd_ < 0) return -EINVAL;
    if (mkdir(dir_.c_str(), 0700) != 0 && errno != EEXIST) {
        int err = errno;
        HostLogf(kLogWarn, "binder: cannot create %s: %s", dir_.c_str(), strerror(err));
        return -err;
    }
    struct stat st;
    if (lstat(path.c_str(), &st) == 0) {
        if (!S_ISSOCK(st.st_mode)) {
            HostLogf(kLogWarn, "binder: %s exists and is not a socket", path.c_str());
            return -EEXIST;
        }
        // Nonblocking, so a live service with a full backlog still counts as live.
        int probe = ConnectTo(path, true);
        if (probe >= 0 || errno == EAGAIN) {
            if (probe >= 0) close(probe);
            HostLogf(kLogWarn,
                     "binder: %s is served by another running orvex; to run a second one, give it "
                     "a folder of its own: ORVEX_BINDER_DIR=/some/dir",
                     path.c_str());
            return -EADDRINUSE;
        }
        unlink(path.c_str());  // left behind by a process that did not stop cleanly
    }
    int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    if (fd < 0) return -errno;
    if (bind(fd, reinterpret_cast<const sockaddr*>(&addr), sizeof addr) != 0 ||
        listen(fd, 16) != 0 || lstat(path.c_str(), &st) != 0) {
        int err = errno;
        HostLogf(kLogWarn, "binder: cannot listen on %s: %s", path.c_str(), strerror(err));
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
    if (epoll_ctl(epoll_fd_, EPOLL_CTL_ADD, fd, &ev) != 0) {
        int err = errno;
        close(fd);
        unlink(path.c_str());
        return -err;
    }
    listeners_.push_back(std::move(listener));
    HostLogf(kLogDebug, "binder: service %s on %s", name, path.c_str());
    return 0;
}

void HostBinder::startThreadPool() {
    std::lock_guard<std::mutex> hold(mutex_);
    if (started_ || stopping_ || epoll_fd_ < 0) return;
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
        int n = epoll_wait(epoll_fd_, &ev, 1, -1);
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
        uint32_t code = GetLe32(header);
        uint32_t flags = GetLe32(header + 4);
        uint32_t size = GetLe32(header + 8);
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
    std::lock_guard<std::mutex> hold(mutex_);
    if (stopping_) return nullptr;
    for (const auto& listener : listeners_) {
        if (listener->name == name) return listener->service;
    }
    return nullptr;
}

bool HostBinder::TrackConnection(int fd) {
    std::lock_guard<std::mutex> hold(mutex_);
    if (stopping_) return false;
    serving_.push_back(fd);
    return true;
}

void HostBinder::UntrackConnection(int fd) {
    std::lock_guard<std::mutex> hold(mutex_);
    serving_.erase(std::remove(serving_.begin(), serving_.end(), fd), serving_.end());
}

void HostBinder::Stop() {
    {
        std::lock_guard<std::mutex> hold(mutex_);
        if (stopping_) return;
        stopping_ = true;
        // Wakes threads blocked on a client; they close the descriptor themselves.
        for (int fd : serving_) shutdown(fd, SHUT_RDWR);
    }
    if (wake_fd_ >= 0) {
        uint64_t one = 1;
        ssize_t ignored = write(wake_fd_, &one, sizeof one);
        (void)ignored;
    }
    for (std::thread& t : pool_) t.join();
    pool_.clear();
    for (auto& listener : listeners_) {
        close(listener->fd);
        // Only our own file: a newer service may have taken the name since.
        struct stat st;
        if (lstat(listener->path.c_str(), &st) == 0 && st.st_dev == listener->dev &&
            st.st_ino == listener->ino) {
            unlink(listener->path.c_str());
        }
    }
    listeners_.clear();
    if (epoll_fd_ >= 0) close(epoll_fd_);
    if (wake_fd_ >= 0) close(wake_fd_);
    epoll_fd_ = wake_fd_ = -1;
    std::lock_guard<std::mutex> hold(outgoing_mutex_);
    for (auto& entry : outgoing_) {
        std::lock_guard<std::mutex> hold_out(entry.second->mutex);
        if (entry.second->fd >= 0) close(entry.second->fd);
        entry.second->fd = -1;
    }
}

HostBinder::Outgoing& HostBinder::OutgoingFor(const std::string& service) {
    std::lock_guard<std::mutex> hold(outgoing_mutex_);
    std::unique_ptr<Outgoing>& out = outgoing_[service];
    if (out == nullptr) out = std::make_unique<Outgoing>();
    return *out;
}

int HostBinder::transact(const char* service, uint32_t code, const ParcelWriter& data) {
    if (!ValidName(service) || data.data().size() > kMaxTransactionSize) return kBadValue;
    uint8_t header[kHeaderSize];
    PutLe32(header, code);
    PutLe32(header + 4, 0);
    PutLe32(header + 8, static_cast<uint32_t>(data.data().size()));
    Outgoing& out = OutgoingFor(service);
    std::lock_guard<std::mutex> hold(out.mutex);
    if (std::shared_ptr<BinderService> local = LocalService(service)) {
        ParcelReader reader(data.data().data(), data.data().size());
        return Dispatch(*local, code, reader, 0);
    }
    return TransactOn(out, dir_ + "/" + service, header, data.data());
}

int HostBinder::TransactOn(Outgoing& out, const std::string& path, const uint8_t header[12],
                           const std::vector<uint8_t>& data) {
    for (;;) {
        bool reused = out.fd >= 0;
        if (!reused) {
            out.fd = ConnectTo(path, false);
            if (out.fd < 0) return kDeadObject;
        }
        if (SendBoth(out.fd, header, kHeaderSize, data.data(), data.size())) {
            break;
        }
        close(out.fd);
        out.fd = -1;
        // A kept connection fails this way after the service restarted: connect again, once.
        if (!reused) return kDeadObject;
    }
    uint8_t reply[4];
    if (ReadFull(out.fd, reply, sizeof reply) != static_cast<ssize_t>(sizeof reply)) {
        close(out.fd);
        out.fd = -1;
        return kDeadObject;
    }
    return static_cast<int32_t>(GetLe32(reply));
}

}  // namespace host
}  // namespace platform
