#include "webrtc/Stun.h"

#include <netinet/in.h>
#include <sys/socket.h>

#include <openssl/hmac.h>
#include <zlib.h>

#include <cstring>

namespace webrtc {
namespace {

constexpr size_t kHeaderSize = 20;
constexpr size_t kHmacSize = 20;  // HMAC-SHA1
// Larger checks than this are not hashed: a browser's are about 100 bytes.
constexpr size_t kMaxHashed = 1500;
constexpr uint32_t kMagicCookie = 0x2112a442;
constexpr uint16_t kBindingRequest = 0x0001;
constexpr uint16_t kBindingSuccess = 0x0101;

constexpr uint16_t kUsername = 0x0006;
constexpr uint16_t kMessageIntegrity = 0x0008;
constexpr uint16_t kXorMappedAddress = 0x0020;
constexpr uint16_t kPriority = 0x0024;
constexpr uint16_t kUseCandidate = 0x0025;
constexpr uint16_t kFingerprint = 0x8028;
constexpr uint16_t kIceControlled = 0x8029;
constexpr uint16_t kIceControlling = 0x802a;

constexpr size_t kIntegritySize = 4 + kHmacSize;
constexpr size_t kFingerprintSize = 4 + 4;
constexpr uint32_t kFingerprintXor = 0x5354554e;  // "STUN", RFC 5389 §15.5
constexpr size_t kMaxUsername = 512;              // RFC 5389 §15.3: less than 513 bytes

uint16_t Get16(const uint8_t* p) { return uint16_t(p[0] << 8 | p[1]); }
uint32_t Get32(const uint8_t* p) {
    return uint32_t(p[0]) << 24 | uint32_t(p[1]) << 16 | uint32_t(p[2]) << 8 | p[3];
}
void Put16(uint8_t* p, uint16_t v) {
    p[0] = uint8_t(v >> 8);
    p[1] = uint8_t(v);
}
void Put32(uint8_t* p, uint32_t v) {
    Put16(p, uint16_t(v >> 16));
    Put16(p + 2, uint16_t(v));
}

// CRC-32 of ISO 3309 / ITU-T V.42, as RFC 5389 §15.5 asks: zlib's.
uint32_t Crc32(const uint8_t* p, size_t n) {
    return static_cast<uint32_t>(crc32(0, p, static_cast<uInt>(n)));
}

// One attribute at `offset` in a message of `n` bytes whose header has been checked; false when
// its padded value overruns the message.
struct Attribute {
    uint16_t type;
    uint16_t size;
    const uint8_t* value;
    size_t next;  // offset of the following attribute
};
bool AttributeAt(const uint8_t* p, size_t n, size_t offset, Attribute* a) {
    if (n - offset < 4) return false;
    a->type = Get16(p + offset);
    a->size = Get16(p + offset + 2);
    const size_t padded = (size_t(a->size) + 3) & ~size_t(3);
    if (n - offset - 4 < padded) return false;
    a->value = p + offset + 4;
    a->next = offset + 4 + padded;
    return true;
}

// The keyed hash of RFC 5389 §15.4 over the message's first `upto` bytes (a header and whole
// attributes), as though its length field ended the message right after a MESSAGE-INTEGRITY
// attribute placed at `upto`.
bool IntegrityOf(const uint8_t* p, size_t upto, std::string_view password, uint8_t mac[kHmacSize]) {
    if (upto < kHeaderSize || upto > kMaxHashed) return false;
    uint8_t message[kMaxHashed];
    memcpy(message, p, upto);
    Put16(message + 2, uint16_t(upto - kHeaderSize + kIntegritySize));
    unsigned len = 0;
    return HMAC(EVP_sha1(), password.data(), static_cast<int>(password.size()), message, upto, mac,
                &len) != nullptr &&
           len == kHmacSize;
}

}  // namespace

bool LooksLikeStun(const uint8_t* p, size_t n) {
    if (n < kHeaderSize || p[0] > 3) return false;
    const size_t length = Get16(p + 2);
    return length % 4 == 0 && length == n - kHeaderSize && Get32(p + 4) == kMagicCookie;
}

StunRead ReadStunBindingRequest(const uint8_t* p, size_t n, StunBindingRequest* out) {
    if (!LooksLikeStun(p, n)) return StunRead::kNotStun;
    if (Get16(p) != kBindingRequest) return StunRead::kNotBindingRequest;
    memcpy(out->transaction, p + 8, sizeof out->transaction);
    out->username = {};
    out->use_candidate = out->has_integrity = out->has_fingerprint = false;
    out->priority = 0;
    out->ice_controlling = false;
    out->tie_breaker = 0;
    Attribute a;
    for (size_t offset = kHeaderSize; offset < n; offset = a.next) {
        if (!AttributeAt(p, n, offset, &a)) return StunRead::kMalformed;
        if (a.type == kFingerprint) {
            if (a.size != 4 || a.next != n) return StunRead::kMalformed;
            out->has_fingerprint = true;
            if (Get32(a.value) != (Crc32(p, offset) ^ kFingerprintXor)) {
                return StunRead::kBadFingerprint;
            }
            continue;
        }
        if (out->has_integrity) continue;  // §15.4: ignored after MESSAGE-INTEGRITY
        switch (a.type) {
            case kUsername:
                if (a.size > kMaxUsername) return StunRead::kMalformed;
                out->username = {reinterpret_cast<const char*>(a.value), a.size};
                break;
            case kMessageIntegrity:
                if (a.size != kHmacSize) return StunRead::kMalformed;
                out->has_integrity = true;
                break;
            case kPriority:
                if (a.size != 4) return StunRead::kMalformed;
                out->priority = Get32(a.value);
                break;
            case kUseCandidate:
                if (a.size != 0) return StunRead::kMalformed;
                out->use_candidate = true;
                break;
            case kIceControlled:
            case kIceControlling:
                if (a.size != 8) return StunRead::kMalformed;
                out->ice_controlling = a.type == kIceControlling;
                out->tie_breaker = uint64_t(Get32(a.value)) << 32 | Get32(a.value + 4);
                break;
            default:
                // 0x0000-0x7fff are comprehension-required (RFC 5389 §15).
                if (a.type < 0x8000) return StunRead::kMalformed;
                break;
        }
    }
    return StunRead::kOk;
}

std::string_view LocalUfragOf(std::string_view username) {
    return username.substr(0, username.find(':'));
}

bool CheckStunIntegrity(const uint8_t* p, size_t n, std::string_view password) {
    if (!LooksLikeStun(p, n)) return false;
    Attribute a;
    for (size_t offset = kHeaderSize; offset < n; offset = a.next) {
        if (!AttributeAt(p, n, offset, &a)) return false;
        if (a.type != kMessageIntegrity) continue;
        if (a.size != kHmacSize) return false;
        uint8_t mac[kHmacSize];
        if (!IntegrityOf(p, offset, password, mac)) return false;
        uint8_t differ = 0;
        for (size_t i = 0; i < kHmacSize; ++i) differ |= mac[i] ^ a.value[i];
        return differ == 0;
    }
    return false;
}

size_t WriteStunBindingSuccess(const StunBindingRequest& req, const sockaddr* from,
                               std::string_view password, uint8_t* out, size_t cap) {
    // XOR-MAPPED-ADDRESS (RFC 5389 §15.2): family, port XOR the cookie's top half, address
    // XOR the cookie (IPv4) or the cookie and the transaction (IPv6).
    uint8_t mapped[4 + 20];
    size_t mapped_size;
    if (from->sa_family == AF_INET) {
        const auto* in = reinterpret_cast<const sockaddr_in*>(from);
        const auto* ip = reinterpret_cast<const uint8_t*>(&in->sin_addr);
        mapped_size = 8;
        Put16(mapped, 1);
        Put16(mapped + 2, uint16_t(ntohs(in->sin_port) ^ (kMagicCookie >> 16)));
        for (int i = 0; i < 4; ++i) mapped[4 + i] = ip[i] ^ uint8_t(kMagicCookie >> (24 - 8 * i));
    } else if (from->sa_family == AF_INET6) {
        const auto* in6 = reinterpret_cast<const sockaddr_in6*>(from);
        const auto* ip = reinterpret_cast<const uint8_t*>(&in6->sin6_addr);
        mapped_size = 20;
        Put16(mapped, 2);
        Put16(mapped + 2, uint16_t(ntohs(in6->sin6_port) ^ (kMagicCookie >> 16)));
        for (int i = 0; i < 4; ++i) mapped[4 + i] = ip[i] ^ uint8_t(kMagicCookie >> (24 - 8 * i));
        for (int i = 4; i < 16; ++i) mapped[4 + i] = ip[i] ^ req.transaction[i - 4];
    } else {
        return 0;
    }
    const size_t total = kHeaderSize + 4 + mapped_size + kIntegritySize + kFingerprintSize;
    if (cap < total) return 0;

    uint8_t* w = out;
    Put16(w, kBindingSuccess);
    Put16(w + 2, uint16_t(total - kHeaderSize));
    Put32(w + 4, kMagicCookie);
    memcpy(w + 8, req.transaction, sizeof req.transaction);
    w += kHeaderSize;
    Put16(w, kXorMappedAddress);
    Put16(w + 2, uint16_t(mapped_size));
    memcpy(w + 4, mapped, mapped_size);
    w += 4 + mapped_size;

    Put16(w, kMessageIntegrity);
    Put16(w + 2, kHmacSize);
    if (!IntegrityOf(out, size_t(w - out), password, w + 4)) return 0;
    w += kIntegritySize;

    Put16(w, kFingerprint);
    Put16(w + 2, 4);
    Put32(w + 4, Crc32(out, size_t(w - out)) ^ kFingerprintXor);
    return total;
}

}  // namespace webrtc
