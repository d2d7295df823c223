#include "net/Udp.h"

#include <arpa/inet.h>
#include <sys/socket.h>
#include <unistd.h>

namespace {
// 0x140000: room for bursts of video packets at several megabits per second.
constexpr int kSocketBufferBytes = 1310720;
constexpr int kMulticastTtl = 5;
}  // namespace

Udp::Udp(unsigned mtu) : Socket(mtu) {}

bool Udp::Open(std::string host, int port) {
    if (m_opened != 0) return false;
    m_opened = 0;
    m_connected = 0;
    if (m_fd > 0) close(m_fd);
    m_fd = socket(AF_INET, SOCK_DGRAM, 0);
    int buffer = kSocketBufferBytes, on = 1, ttl = kMulticastTtl;
    if (setsockopt(m_fd, SOL_SOCKET, SO_RCVBUF, &buffer, sizeof buffer) != 0 ||
        setsockopt(m_fd, SOL_SOCKET, SO_SNDBUF, &buffer, sizeof buffer) != 0 ||
        setsockopt(m_fd, SOL_SOCKET, SO_REUSEADDR, &on, sizeof on) != 0 ||
        setsockopt(m_fd, IPPROTO_IP, IP_MULTICAST_TTL, &ttl, sizeof ttl) != 0) {
        ReportError();
        return false;
    }
    m_bind_addr = sockaddr_in{};
    m_bind_addr.sin_family = AF_INET;
    m_bind_addr.sin_port = htons(static_cast<uint16_t>(port));
    in_addr_t a = inet_addr(host.c_str());
    m_bind_addr.sin_addr.s_addr = a == INADDR_NONE || IsMulticastAddress(a) ? htonl(INADDR_ANY) : a;
    socklen_t len = sizeof m_bind_addr;
    if (bind(m_fd, reinterpret_cast<sockaddr*>(&m_bind_addr), sizeof m_bind_addr) != 0 ||
        getsockname(m_fd, reinterpret_cast<sockaddr*>(&m_bind_addr), &len) != 0) {
        ReportError();
        return false;
    }
    if (!SetMulticast(host.c_str())) return false;
    m_opened = 1;
    return true;
}

bool Udp::SetMulticast(const char* address) {
    in_addr_t a = inet_addr(address != nullptr ? address : "");
    if (IsMulticastAddress(a)) {
        int loop = 1;
        ip_mreq group{};
        group.imr_multiaddr.s_addr = a;
        group.imr_interface.s_addr = htonl(INADDR_ANY);
        if (setsockopt(m_fd, IPPROTO_IP, IP_MULTICAST_LOOP, &loop, sizeof loop) != 0 ||
            setsockopt(m_fd, IPPROTO_IP, IP_ADD_MEMBERSHIP, &group, sizeof group) != 0) {
            ReportError();
            return false;
        }
    }
    if (a != INADDR_NONE) return true;
    int on = 1;
    if (setsockopt(m_fd, SOL_SOCKET, SO_BROADCAST, &on, sizeof on) != 0) {
        ReportError();
        return false;
    }
    return true;
}

bool Udp::Connect(std::string host, int port) {
    if (m_opened == 0) return false;
    m_connect_addr = sockaddr_in{};
    if (!SetMulticast(host.c_str())) return false;
    m_connect_addr.sin_family = AF_INET;
    m_connect_addr.sin_port = htons(static_cast<uint16_t>(port));
    m_connect_addr.sin_addr.s_addr = inet_addr(host.c_str());
    if (connect(m_fd, reinterpret_cast<sockaddr*>(&m_connect_addr), sizeof m_connect_addr) != 0) {
        ReportError();
        return false;
    }
    m_connected = 1;
    return true;
}

int Udp::Read(unsigned char* buffer, unsigned short length, unsigned int timeout) {
    if (m_opened == 0) return -1;
    return Socket::Read(buffer, length, timeout);
}

int Udp::Write(unsigned char* buffer, unsigned short length, unsigned int timeout) {
    if (m_opened == 0 || m_connected == 0) return -1;
    return Socket::Write(buffer, length, timeout);
}
