#pragma once

#include <openssl/evp.h>
#include <openssl/hmac.h>
#include <zlib.h>

#include <algorithm>
#include <cstdint>
#include <string>
#include <vector>

// A browser's connectivity check (RFC 8445 §7.2.2) as the WebRTC tests and the load tool send
// it: USERNAME, USE-CANDIDATE, MESSAGE-INTEGRITY, FINGERPRINT.
namespace webrtc::test {

inline void Put16(std::vector<uint8_t>& b, size_t at, uint16_t v) {
    b[at] = static_cast<uint8_t>(v >> 8);
    b[at + 1] = static_cast<uint8_t>(v);
}

inline std::vector<uint8_t> BindingRequest(const std::string& username,
                                           const std::string& password) {
    using Bytes = std::vector<uint8_t>;
    Bytes m = {0x00, 0x01, 0, 0, 0x21, 0x12, 0xA4, 0x42, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12};
    auto attribute = [&m](uint16_t type, const Bytes& value) {
        const size_t at = m.size();
        m.resize(at + 4 + ((value.size() + 3) & ~size_t{3}), 0);
        Put16(m, at, type);
        Put16(m, at + 2, static_cast<uint16_t>(value.size()));
        std::copy(value.begin(), value.end(), m.begin() + static_cast<long>(at) + 4);
        Put16(m, 2, static_cast<uint16_t>(m.size() - 20));
    };
    attribute(0x0006, Bytes(username.begin(), username.end()));
    attribute(0x0025, {});
    // The length covers MESSAGE-INTEGRITY (24 bytes) while it is computed (RFC 5389 §15.4),
    // then FINGERPRINT (8 bytes) while that is (§15.5).
    Put16(m, 2, static_cast<uint16_t>(m.size() - 20 + 24));
    uint8_t mac[20];
    unsigned mac_len = 0;
    HMAC(EVP_sha1(), password.data(), static_cast<int>(password.size()), m.data(), m.size(), mac,
         &mac_len);
    attribute(0x0008, Bytes(mac, mac + 20));
    Put16(m, 2, static_cast<uint16_t>(m.size() - 20 + 8));
    const uint32_t crc =
        static_cast<uint32_t>(crc32(0, m.data(), static_cast<uInt>(m.size()))) ^ 0x5354554e;
    attribute(0x8028, {static_cast<uint8_t>(crc >> 24), static_cast<uint8_t>(crc >> 16),
                       static_cast<uint8_t>(crc >> 8), static_cast<uint8_t>(crc)});
    return m;
}

}  // namespace webrtc::test
