// The client side of the host binder stand-in: transactions to a named service, in-process
// when this object serves it, else over the service's socket.
#include <unistd.h>

#include "platform/host/BinderWire.h"
#include "platform/host/HostBinder.h"
#include "sync/thread_mutex.h"

namespace platform {
namespace host {

using namespace binder_wire;

HostBinder::Outgoing& HostBinder::OutgoingFor(const std::string& service) {
    thread_mutex::Scoped hold(outgoing_mutex_);
    std::unique_ptr<Outgoing>& out = outgoing_[service];
    if (out == nullptr) out = std::make_unique<Outgoing>();
    return *out;
}

int HostBinder::transact(const char* service, uint32_t code, const ParcelWriter& data) {
    if (!ValidName(service) || data.data().size() > kMaxTransactionSize) return kBadValue;
    uint8_t header[kHeaderSize];
    WriteHeader(Header{code, 0, static_cast<uint32_t>(data.data().size())}, header);
    Outgoing& out = OutgoingFor(service);
    thread_mutex::Scoped hold(out.mutex);
    if (std::shared_ptr<BinderService> local = LocalService(service)) {
        ParcelReader reader(data.data().data(), data.data().size());
        return Dispatch(*local, code, reader, 0);
    }
    return TransactOn(out, ServicePath(dir_, service), header, data.data());
}

int HostBinder::TransactOn(Outgoing& out, const std::string& path, const uint8_t header[12],
                           const std::vector<uint8_t>& data) {
    for (;;) {
        bool reused = out.fd >= 0;
        if (!reused) {
            out.fd = ConnectTo(path, false);
            if (out.fd < 0) return kDeadObject;
        }
        if (SendBoth(out.fd, header, kHeaderSize, data.data(), data.size())) {
            break;
        }
        close(out.fd);
        out.fd = -1;
        // A kept connection fails this way after the service restarted: connect again, once.
        if (!reused) return kDeadObject;
    }
    uint8_t reply[4];
    if (ReadFull(out.fd, reply, sizeof reply) != static_cast<ssize_t>(sizeof reply)) {
        close(out.fd);
        out.fd = -1;
        return kDeadObject;
    }
    return static_cast<int32_t>(GetLe32(reply));
}

}  // namespace host
}  // namespace platform
