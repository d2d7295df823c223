#include "net/Tcp.h"

#include <arpa/inet.h>
#include <sys/socket.h>

#include "base/OrvexLog.h"

Tcp::Tcp() : Socket(1500) {}

void Tcp::Close() {
    if (m_fd == 0) return;
    OrvexDebugRaw("\n Tcp::Close() ");
    m_bind_addr = sockaddr_in{};
    m_connect_addr = sockaddr_in{};
    m_connected = 0;
    Socket::Close();
}

bool Tcp::Open(const char* host, int port) {
    Close();
    m_fd = socket(AF_INET, SOCK_STREAM, 0);
    int on = 1;
    if (setsockopt(m_fd, SOL_SOCKET, SO_KEEPALIVE, &on, sizeof on) != 0 ||
        setsockopt(m_fd, SOL_SOCKET, SO_REUSEADDR, &on, sizeof on) != 0) {
        ReportError();
        return false;
    }
    sockaddr_in addr{};
    addr.sin_family = AF_INET;
    addr.sin_port = htons(static_cast<uint16_t>(port));
    in_addr_t a = inet_addr(host != nullptr ? host : "");
    if (a == 0 || a == INADDR_NONE || IsMulticastAddress(a)) a = htonl(INADDR_ANY);
    addr.sin_addr.s_addr = a;
    m_bind_addr = addr;
    if (bind(m_fd, reinterpret_cast<sockaddr*>(&addr), sizeof addr) != 0) {
        ReportError();
        return false;
    }
    m_opened = 1;
    return true;
}

bool Tcp::Connect(const char* host, int port) {
    if (m_opened == 0) return false;
    m_connect_addr = sockaddr_in{};
    m_connect_addr.sin_family = AF_INET;
    m_connect_addr.sin_port = htons(static_cast<uint16_t>(port));
    m_connect_addr.sin_addr.s_addr = inet_addr(host != nullptr ? host : "");
    if (connect(m_fd, reinterpret_cast<sockaddr*>(&m_connect_addr), sizeof m_connect_addr) != 0) {
        OrvexDebugRaw("Socket error is:%d\n", -1);
        return false;
    }
    m_connected = 1;
    return true;
}

int Tcp::ReadLine(std::string* line, unsigned maxlen, unsigned timeout) {
    if (line == nullptr || m_connected == 0) return -1;
    line->clear();
    for (;;) {
        unsigned char c = 0;
        int n = Read(&c, 1, timeout);
        if (n == 0) continue;
        if (n < 0) return -1;
        if (c == 13 || c == 10) break;
        if (line->size() <= maxlen) line->push_back(static_cast<char>(c));
    }
    return static_cast<int>(line->size());
}
