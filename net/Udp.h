#pragma once

#include <string>

#include "net/Socket.h"

// A datagram socket: binds the server side of an RTP port pair, joins a multicast group when
// the address asks for it, and can be connected to one peer.
// Thread contract: NOT thread safe; used by one thread.
class Udp : public Socket {
public:
    explicit Udp(unsigned mtu);

    using Socket::Read;
    using Socket::Write;

    // Binds `port` on `host` (the wildcard address for a multicast, empty or malformed host;
    // port 0 learns the system's choice). False, changing nothing, when already open.
    bool Open(std::string host, int port);
    // Multicast address: loop on and join the group. An address that does not parse (the
    // empty one and 255.255.255.255 included) turns broadcast on.
    bool SetMulticast(const char* address);
    bool Connect(std::string host, int port);
    int Read(unsigned char* buffer, unsigned short length, unsigned int timeout);
    // -1 unless open and connected.
    int Write(unsigned char* buffer, unsigned short length, unsigned int timeout);

    bool connected() const { return m_connected != 0; }

protected:
    int m_connected = 0;
};
