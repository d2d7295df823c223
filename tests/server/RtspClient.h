#pragma once

#include <arpa/inet.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstdlib>
#include <string>

// A raw RTSP client over TCP from a chosen loopback source address, reading answers by their
// framing (header block, then Content-Length bytes).
class RtspClient {
public:
    RtspClient(const char* source, int port) {
        fd_ = socket(AF_INET, SOCK_STREAM, 0);
        sockaddr_in from{};
        from.sin_family = AF_INET;
        from.sin_addr.s_addr = inet_addr(source);
        bind(fd_, reinterpret_cast<sockaddr*>(&from), sizeof from);
        sockaddr_in to{};
        to.sin_family = AF_INET;
        to.sin_port = htons(static_cast<uint16_t>(port));
        to.sin_addr.s_addr = inet_addr("127.0.0.1");
        connected_ = connect(fd_, reinterpret_cast<sockaddr*>(&to), sizeof to) == 0;
        timeval limit{5, 0};
        setsockopt(fd_, SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof limit);
    }
    ~RtspClient() { Close(); }
    bool connected() const { return connected_; }
    void Close() {
        if (fd_ >= 0) close(fd_);
        fd_ = -1;
    }
    void Send(const std::string& request) { (void)!write(fd_, request.data(), request.size()); }
    // One answer: the header block and its body.
    std::string Answer() {
        std::string text;
        char c;
        while (text.find("\r\n\r\n") == std::string::npos) {
            if (recv(fd_, &c, 1, 0) != 1) return text;
            text.push_back(c);
        }
        size_t at = text.find("Content-Length: ");
        if (at != std::string::npos) {
            size_t body = static_cast<size_t>(atoi(text.c_str() + at + 16));
            while (body-- > 0 && recv(fd_, &c, 1, 0) == 1) text.push_back(c);
        }
        return text;
    }
    std::string Exchange(const std::string& request) {
        Send(request);
        return Answer();
    }
    // True when the server closed (or reset) the connection without sending anything more.
    bool ClosedWithoutAnswer() {
        char c;
        ssize_t n = recv(fd_, &c, 1, 0);
        return n == 0 || (n < 0 && errno == ECONNRESET);
    }

private:
    int fd_ = -1;
    bool connected_ = false;
};
