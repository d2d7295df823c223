#include "webrtc/Sha1.h"

#include <cstring>

namespace webrtc {
namespace {

uint32_t Rotl(uint32_t x, int k) { return (x << k) | (x >> (32 - k)); }

}  // namespace

Sha1::Sha1() : h_{0x67452301, 0xefcdab89, 0x98badcfe, 0x10325476, 0xc3d2e1f0} {}

void Sha1::Block(const uint8_t* block) {
    uint32_t w[80];
    for (int i = 0; i < 16; ++i) {
        w[i] = uint32_t(block[4 * i]) << 24 | uint32_t(block[4 * i + 1]) << 16 |
               uint32_t(block[4 * i + 2]) << 8 | block[4 * i + 3];
    }
    for (int i = 16; i < 80; ++i) w[i] = Rotl(w[i - 3] ^ w[i - 8] ^ w[i - 14] ^ w[i - 16], 1);
    uint32_t a = h_[0], b = h_[1], c = h_[2], d = h_[3], e = h_[4];
    for (int i = 0; i < 80; ++i) {
        uint32_t f, k;
        if (i < 20) {
            f = (b & c) | (~b & d);
            k = 0x5a827999;
        } else if (i < 40) {
            f = b ^ c ^ d;
            k = 0x6ed9eba1;
        } else if (i < 60) {
            f = (b & c) | (b & d) | (c & d);
            k = 0x8f1bbcdc;
        } else {
            f = b ^ c ^ d;
            k = 0xca62c1d6;
        }
        const uint32_t t = Rotl(a, 5) + f + e + k + w[i];
        e = d;
        d = c;
        c = Rotl(b, 30);
        b = a;
        a = t;
    }
    h_[0] += a;
    h_[1] += b;
    h_[2] += c;
    h_[3] += d;
    h_[4] += e;
}

void Sha1::Update(const uint8_t* p, size_t n) {
    if (n == 0) return;
    total_ += n;
    if (buffered_ > 0) {
        const size_t take = n < kBlockSize - buffered_ ? n : kBlockSize - buffered_;
        memcpy(buffer_ + buffered_, p, take);
        buffered_ += take;
        p += take;
        n -= take;
        if (buffered_ < kBlockSize) return;
        Block(buffer_);
        buffered_ = 0;
    }
    for (; n >= kBlockSize; p += kBlockSize, n -= kBlockSize) Block(p);
    if (n > 0) memcpy(buffer_, p, n);
    buffered_ = n;
}

void Sha1::Final(uint8_t digest[kDigestSize]) {
    const uint64_t bits = total_ * 8;
    // 0x80, zeros up to 56 mod 64, then the length in bits, big-endian.
    uint8_t pad[kBlockSize + 8] = {0x80};
    const size_t zeros = (buffered_ < 56 ? 56 : 120) - buffered_;
    for (int i = 0; i < 8; ++i) pad[zeros + i] = uint8_t(bits >> (56 - 8 * i));
    Update(pad, zeros + 8);
    for (int i = 0; i < 5; ++i) {
        digest[4 * i] = uint8_t(h_[i] >> 24);
        digest[4 * i + 1] = uint8_t(h_[i] >> 16);
        digest[4 * i + 2] = uint8_t(h_[i] >> 8);
        digest[4 * i + 3] = uint8_t(h_[i]);
    }
}

HmacSha1::HmacSha1(const uint8_t* key, size_t key_size) {
    // RFC 2104 §2: a key longer than a block is first hashed to 20 bytes.
    uint8_t k[Sha1::kBlockSize] = {};
    if (key_size > Sha1::kBlockSize) {
        Sha1 hash;
        hash.Update(key, key_size);
        hash.Final(k);
    } else {
        memcpy(k, key, key_size);
    }
    uint8_t inner_key[Sha1::kBlockSize];
    for (size_t i = 0; i < Sha1::kBlockSize; ++i) {
        inner_key[i] = k[i] ^ 0x36;
        outer_key_[i] = k[i] ^ 0x5c;
    }
    inner_.Update(inner_key, sizeof inner_key);
}

void HmacSha1::Final(uint8_t mac[Sha1::kDigestSize]) {
    uint8_t inner[Sha1::kDigestSize];
    inner_.Final(inner);
    Sha1 outer;
    outer.Update(outer_key_, sizeof outer_key_);
    outer.Update(inner, sizeof inner);
    outer.Final(mac);
}

}  // namespace webrtc
