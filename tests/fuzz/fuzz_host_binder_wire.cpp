// Arbitrary bytes written by a peer on a connection to a host binder service, then the peer
// hangs up: the stand-in must read them as transactions (or refuse them), answer, and close,
// never reading past what arrived or waiting for more.
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <string>

#include "platform/host/BinderWire.h"
#include "platform/host/HostBinder.h"

namespace {

class ParcelService : public platform::BinderService {
public:
    int onTransact(uint32_t code, platform::ParcelReader& data, uint32_t) override {
        int32_t length = data.readInt32();
        if (length > 0 && data.readInplace(static_cast<size_t>(length)) == nullptr) return -22;
        data.readInt32();
        return code == 101 ? platform::kBinderOk : platform::kBinderUnknownTransaction;
    }
};

struct Server {
    std::string dir;
    std::unique_ptr<platform::host::HostBinder> binder;
    Server() {
        char pattern[] = "/tmp/orvex-fuzz-binder-XXXXXX";
        dir = mkdtemp(pattern) != nullptr ? pattern : "/tmp";
        binder = std::make_unique<platform::host::HostBinder>(dir, 1);
        if (binder->addService("orvex.rtp", std::make_shared<ParcelService>()) != 0) abort();
        binder->startThreadPool();
    }
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    static Server* server = new Server();  // lives as long as the process
    if (size > 1 << 16) return 0;
    int fd = platform::host::binder_wire::ConnectTo(server->dir + "/orvex.rtp", false);
    if (fd < 0) abort();
    platform::host::binder_wire::SetTimeouts(fd, 10);  // a service that never closes fails here
    if (platform::host::binder_wire::SendAll(fd, data, size)) shutdown(fd, SHUT_WR);
    uint8_t replies[4096];
    ssize_t n;
    while ((n = recv(fd, replies, sizeof replies, 0)) > 0) {
    }
    if (n < 0 && (errno == EAGAIN || errno == EWOULDBLOCK)) abort();  // the service hung
    close(fd);
    return 0;
}
