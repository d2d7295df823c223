#include "platform/host/BinderWire.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/uio.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>
#include <cstring>

namespace platform {
namespace host {
namespace binder_wire {

void PutLe32(uint8_t* at, uint32_t v) {
    for (int i = 0; i < 4; ++i) at[i] = static_cast<uint8_t>(v >> (8 * i));
}

uint32_t GetLe32(const uint8_t* at) {
    return uint32_t{at[0]} | uint32_t{at[1]} << 8 | uint32_t{at[2]} << 16 | uint32_t{at[3]} << 24;
}

socklen_t MakeAddress(const std::string& path, sockaddr_un* addr) {
    if (path.empty() || path.size() >= sizeof addr->sun_path) return 0;
    memset(addr, 0, sizeof *addr);
    addr->sun_family = AF_UNIX;
    memcpy(addr->sun_path, path.data(), path.size());
    // An abstract name is every byte the length covers, so it must not take the padding.
    if (path[0] == '\0')
        return static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + path.size());
    return sizeof *addr;
}

std::string PrintablePath(const std::string& path) {
    if (path.empty() || path[0] != '\0') return path;
    return "@" + path.substr(1);
}

int ConnectTo(const std::string& path, bool nonblocking) {
    sockaddr_un addr;
    const socklen_t addr_len = MakeAddress(path, &addr);
    if (addr_len == 0) {
        errno = ENAMETOOLONG;
        return -1;
    }
    int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | (nonblocking ? SOCK_NONBLOCK : 0), 0);
    if (fd < 0) return -1;
    if (connect(fd, reinterpret_cast<const sockaddr*>(&addr), addr_len) != 0) {
        int saved = errno;
        close(fd);
        errno = saved;
        return -1;
    }
    return fd;
}

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

void DrainQueued(int fd) {
    shutdown(fd, SHUT_WR);
    uint8_t sink[4096];
    for (int i = 0; i < 256 && recv(fd, sink, sizeof sink, MSG_DONTWAIT) > 0; ++i) {
    }
}

void WaitReadable(int fd) {
    pollfd p{fd, POLLIN, 0};
    while (poll(&p, 1, -1) < 0 && errno == EINTR) {
    }
}

void WriteHeader(const Header& h, uint8_t out[kHeaderSize]) {
    PutLe32(out, h.code);
    PutLe32(out + 4, h.flags);
    PutLe32(out + 8, h.size);
}

Header ReadHeader(const uint8_t in[kHeaderSize]) {
    return Header{GetLe32(in), GetLe32(in + 4), GetLe32(in + 8)};
}

}  // namespace binder_wire
}  // namespace host
}  // namespace platform
