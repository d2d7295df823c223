#pragma once

#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <memory>
#include <string>

#include "rtsp/RtspResponse.h"

// A connected pair of stream sockets: `peer` is the client's end, the other end is wrapped
// by an RtspResponse as the listener would wrap an accepted connection.
struct RtspWire {
    RtspWire() {
        int fds[2];
        socketpair(AF_UNIX, SOCK_STREAM, 0, fds);
        peer = fds[1];
        sockaddr_in local{}, remote{};
        local.sin_family = remote.sin_family = AF_INET;
        local.sin_addr.s_addr = htonl(0x7F000001);
        remote.sin_addr.s_addr = htonl(0x7F000002);
        server = std::make_unique<RtspResponse>(fds[0], local, remote);
    }
    ~RtspWire() {
        if (peer >= 0) close(peer);
    }
    void Send(const std::string& bytes) const {
        ssize_t n = write(peer, bytes.data(), bytes.size());
        (void)n;
    }
    // Everything the server has written so far.
    std::string Received() const {
        std::string out;
        char buf[4096];
        for (;;) {
            ssize_t n = recv(peer, buf, sizeof buf, MSG_DONTWAIT);
            if (n <= 0) break;
            out.append(buf, static_cast<size_t>(n));
        }
        return out;
    }
    void CloseClient() {
        close(peer);
        peer = -1;
    }

    int peer = -1;
    std::unique_ptr<RtspResponse> server;
};
