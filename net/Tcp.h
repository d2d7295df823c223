#pragma once

#include <string>

#include "net/Socket.h"

// A stream socket: opened (created and bound), connected, or wrapping an accepted connection.
// Thread contract: NOT thread safe; used by its connection's thread.
class Tcp : public Socket {
public:
    Tcp();

    void Close() override;
    // Creates and binds (no listen). A 0, malformed, empty or multicast host binds to every
    // address. 1 on success, 0 on failure.
    virtual bool Open(const char* host, int port);
    virtual bool Connect(const char* host, int port);
    // One line without its terminator (CR or LF), at most maxlen + 1 characters kept; waits
    // through quiet periods. Its length, or -1 when the connection failed or closed.
    virtual int ReadLine(std::string* line, unsigned maxlen, unsigned timeout);

    bool connected() const { return m_connected != 0; }

protected:
    int m_connected = 0;
};
