#pragma once

#include <netinet/in.h>

#include <string>

// Base of every network endpoint: one descriptor, a bound and a connected IPv4 address, and
// reads and writes behind a readiness wait of fixed length (ten seconds), so that no reader or
// writer blocks for ever. Descriptor 0 means "no socket": it is never treated as live.
// Thread contract: NOT thread safe; used by one thread at a time.
class Socket {
public:
    explicit Socket(unsigned mtu);
    virtual ~Socket();
    Socket(const Socket&) = delete;
    Socket& operator=(const Socket&) = delete;

    // Resets the connection (linger on, 0 s) and closes; descriptor becomes 0.
    virtual void Close();
    // One readiness wait, then one transfer. `timeout` is ignored: the wait is always the
    // fixed one. -1 on failure or a peer's close, 0 when the wait ran out, else bytes moved.
    virtual int Write(unsigned char* buf, int len, unsigned timeout);
    virtual int Read(unsigned char* buf, int len, unsigned timeout);
    virtual sockaddr_in GetBindAddr();
    virtual sockaddr_in GetConnectAddr();
    virtual unsigned GetMTU();

    // mode bit 0: readable, bit 1: writable. 0 ready, 2 interrupted, 1 failed, 3 timed out.
    int Select(int mode);
    void ReportError();

    int descriptor() const { return m_fd; }
    bool opened() const { return m_opened != 0; }

    // The readiness wait, ten seconds in service. Tests shorten it.
    static void SetReadinessWaitMs(int ms);
    static int ReadinessWaitMs();

protected:
    int m_opened = 0;
    int m_fd = -1;
    sockaddr_in m_bind_addr{};
    sockaddr_in m_connect_addr{};
    unsigned m_mtu;
};

// The address in dotted form ("192.168.1.20"), as inet_ntoa gives it.
std::string DottedAddress(const sockaddr_in& a);

// True for 224.0.0.0 to 239.255.255.255; `addr` in network order.
bool IsMulticastAddress(in_addr_t addr);
