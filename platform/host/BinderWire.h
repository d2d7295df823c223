#pragma once

#include <sys/socket.h>
#include <sys/types.h>
#include <sys/un.h>

#include <cstddef>
#include <cstdint>
#include <string>

namespace platform {
namespace host {
// The host binder stand-in's wire: a transaction is a 12-byte header (uint32 code, uint32
// flags, uint32 size, little-endian) and `size` bytes of Parcel data; the reply is an int32
// status. Socket helpers that read and write it whole.
// Thread contract: free functions over one descriptor; any thread.
namespace binder_wire {

constexpr size_t kHeaderSize = 12;

struct Header {
    uint32_t code;
    uint32_t flags;
    uint32_t size;
};

void PutLe32(uint8_t* at, uint32_t v);
uint32_t GetLe32(const uint8_t* at);
void WriteHeader(const Header& h, uint8_t out[kHeaderSize]);
Header ReadHeader(const uint8_t in[kHeaderSize]);

// A socket's path: a file, or, when it begins with a NUL byte, a name in Linux's abstract
// namespace (no file; scoped to the network namespace). The address's length, or 0 when the
// path does not fit.
socklen_t MakeAddress(const std::string& path, sockaddr_un* addr);
// The path as logs show it: an abstract name with '@' for its NUL byte, as ss(8) does.
std::string PrintablePath(const std::string& path);
// A connected socket, or -1 with errno set.
int ConnectTo(const std::string& path, bool nonblocking);
// The bytes read: `len`, fewer when the peer closed first, -1 on an error or a timeout.
ssize_t ReadFull(int fd, void* buf, size_t len);
bool SendAll(int fd, const void* buf, size_t len);
// Header and payload in one call, so the service wakes once for a transaction, not twice.
bool SendBoth(int fd, const uint8_t* header, size_t header_len, const uint8_t* data, size_t len);
bool SendStatus(int fd, int status);
void SetTimeouts(int fd, int seconds);
// Closing with unread bytes queued resets the connection, which can cost the peer the reply
// just sent; what already arrived is read and dropped, up to a bound.
void DrainQueued(int fd);
// Blocks until `fd` has data or its peer (or Stop) shut it down.
void WaitReadable(int fd);

}  // namespace binder_wire
}  // namespace host
}  // namespace platform
