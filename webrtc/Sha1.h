#pragma once

#include <cstddef>
#include <cstdint>

namespace webrtc {

// SHA-1 (FIPS 180-4) and HMAC-SHA1 (RFC 2104), incremental and on the stack, for STUN's
// MESSAGE-INTEGRITY: the layer stays free of libraries and allocations, and the keyed input is
// fed in pieces (the header with its length adjusted, then the attributes as they stand).
// Thread contract: one object per thread; no shared state.
class Sha1 {
public:
    static constexpr size_t kDigestSize = 20;
    static constexpr size_t kBlockSize = 64;

    Sha1();
    void Update(const uint8_t* p, size_t n);
    void Final(uint8_t digest[kDigestSize]);

private:
    void Block(const uint8_t* block);

    uint32_t h_[5];
    uint64_t total_ = 0;  // bytes fed
    uint8_t buffer_[kBlockSize];
    size_t buffered_ = 0;
};

class HmacSha1 {
public:
    HmacSha1(const uint8_t* key, size_t key_size);
    void Update(const uint8_t* p, size_t n) { inner_.Update(p, n); }
    void Final(uint8_t mac[Sha1::kDigestSize]);

private:
    Sha1 inner_;
    uint8_t outer_key_[Sha1::kBlockSize];  // key XOR opad, kept for Final
};

}  // namespace webrtc
