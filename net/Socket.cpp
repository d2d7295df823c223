#include "net/Socket.h"

#include <arpa/inet.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>

#include "base/OrvexLog.h"

namespace {
std::atomic<int> g_wait_ms{10000};
}

void Socket::SetReadinessWaitMs(int ms) { g_wait_ms.store(ms, std::memory_order_relaxed); }
int Socket::ReadinessWaitMs() { return g_wait_ms.load(std::memory_order_relaxed); }

bool IsMulticastAddress(in_addr_t addr) {
    uint32_t first_octet = ntohl(addr) >> 24;
    return first_octet >= 224 && first_octet <= 239;
}

std::string DottedAddress(const sockaddr_in& a) {
    char text[INET_ADDRSTRLEN] = {};
    inet_ntop(AF_INET, &a.sin_addr, text, sizeof text);
    return text;
}

Socket::Socket(unsigned mtu) : m_mtu(mtu) {}

Socket::~Socket() { Socket::Close(); }

void Socket::Close() {
    // A never-opened socket (-1) passes here harmlessly; a closed one (0) is skipped.
    if (m_fd != 0) {
        OrvexDebugRaw("\n Socket::Close ,socketfd:%d,\n", m_fd);
        linger reset{1, 0};
        setsockopt(m_fd, SOL_SOCKET, SO_LINGER, &reset, sizeof reset);
        close(m_fd);
    }
    m_opened = 0;
    m_fd = 0;
}

int Socket::Select(int mode) {
    pollfd p{};
    p.fd = m_fd;
    if (mode & 1) p.events |= POLLIN;
    if (mode & 2) p.events |= POLLOUT;
    int n = poll(&p, 1, ReadinessWaitMs());
    if (n == 1) return 0;
    if (n < 0) {
        if (errno == EINTR) return 2;
        ReportError();
        return 1;
    }
    return 3;
}

void Socket::ReportError() { OrvexDebugRaw("Socket error is:"); }

int Socket::Read(unsigned char* buf, int len, unsigned) {
    if (buf == nullptr || m_opened == 0) return -1;
    int ready = Select(1);
    if (ready == 3) return 0;
    if (ready != 0) return -1;
    ssize_t n = recvfrom(m_fd, buf, static_cast<size_t>(len > 0 ? len : 0), 0, nullptr, nullptr);
    return n < 1 ? -1 : static_cast<int>(n);
}

int Socket::Write(unsigned char* buf, int len, unsigned) {
    if (buf == nullptr || m_opened == 0) return -1;
    int ready = Select(2);
    if (ready == 3) return 0;
    if (ready != 0) return -1;
    // MSG_NOSIGNAL: a client that went away must not take the process down with SIGPIPE.
    ssize_t n = sendto(m_fd, buf, static_cast<size_t>(len > 0 ? len : 0), MSG_NOSIGNAL, nullptr, 0);
    return n < 1 ? -1 : static_cast<int>(n);
}

sockaddr_in Socket::GetBindAddr() { return m_bind_addr; }
sockaddr_in Socket::GetConnectAddr() { return m_connect_addr; }
unsigned Socket::GetMTU() { return m_mtu; }
