#include "auth/Md5.h"

#include <cstddef>

namespace auth {
namespace {

// floor(|sin(i + 1)| * 2^32), RFC 1321 §3.4.
constexpr uint32_t kSine[64] = {
    0xd76aa478, 0xe8c7b756, 0x242070db, 0xc1bdceee, 0xf57c0faf, 0x4787c62a, 0xa8304613, 0xfd469501,
    0x698098d8, 0x8b44f7af, 0xffff5bb1, 0x895cd7be, 0x6b901122, 0xfd987193, 0xa679438e, 0x49b40821,
    0xf61e2562, 0xc040b340, 0x265e5a51, 0xe9b6c7aa, 0xd62f105d, 0x02441453, 0xd8a1e681, 0xe7d3fbc8,
    0x21e1cde6, 0xc33707d6, 0xf4d50d87, 0x455a14ed, 0xa9e3e905, 0xfcefa3f8, 0x676f02d9, 0x8d2a4c8a,
    0xfffa3942, 0x8771f681, 0x6d9d6122, 0xfde5380c, 0xa4beea44, 0x4bdecfa9, 0xf6bb4b60, 0xbebfbc70,
    0x289b7ec6, 0xeaa127fa, 0xd4ef3085, 0x04881d05, 0xd9d4d039, 0xe6db99e5, 0x1fa27cf8, 0xc4ac5665,
    0xf4292244, 0x432aff97, 0xab9423a7, 0xfc93a039, 0x655b59c3, 0x8f0ccc92, 0xffeff47d, 0x85845dd1,
    0x6fa87e4f, 0xfe2ce6e0, 0xa3014314, 0x4e0811a1, 0xf7537e82, 0xbd3af235, 0x2ad7d2bb, 0xeb86d391,
};

// Left rotations, four per round.
constexpr unsigned kShift[4][4] = {
    {7, 12, 17, 22}, {5, 9, 14, 20}, {4, 11, 16, 23}, {6, 10, 15, 21}};

constexpr size_t kBlock = 64;

uint32_t Rotl(uint32_t x, unsigned n) { return (x << n) | (x >> (32 - n)); }

// Words are little endian whatever the host's order; read byte by byte (no type punning, and
// 32-bit ARM may not like unaligned loads).
uint32_t LoadLe(const uint8_t* p) {
    return uint32_t{p[0]} | uint32_t{p[1]} << 8 | uint32_t{p[2]} << 16 | uint32_t{p[3]} << 24;
}

// A streaming MD5, so HMAC can hash the padded key and the message without joining them.
class Md5State {
public:
    void Update(const uint8_t* data, size_t size) {
        total_ += size;
        if (used_ > 0) {
            size_t take = kBlock - used_ < size ? kBlock - used_ : size;
            for (size_t i = 0; i < take; ++i) pending_[used_ + i] = data[i];
            used_ += take;
            data += take;
            size -= take;
            if (used_ < kBlock) return;
            Compress(pending_);
            used_ = 0;
        }
        for (; size >= kBlock; data += kBlock, size -= kBlock) Compress(data);
        for (size_t i = 0; i < size; ++i) pending_[i] = data[i];
        used_ = size;
    }
    void Update(std::string_view bytes) {
        Update(reinterpret_cast<const uint8_t*>(bytes.data()), bytes.size());
    }

    Md5Digest Final() {
        // The length in bits is 64 bits wide even where size_t is 32 (RFC 1321 §3.2).
        const uint64_t bits = total_ * 8;
        uint8_t tail[2 * kBlock] = {};
        for (size_t i = 0; i < used_; ++i) tail[i] = pending_[i];
        tail[used_] = 0x80;
        // One block when the length still fits after the 0x80 byte, else two.
        const size_t padded = used_ + 1 + 8 <= kBlock ? kBlock : 2 * kBlock;
        for (int i = 0; i < 8; ++i) tail[padded - 8 + i] = static_cast<uint8_t>(bits >> (8 * i));
        Compress(tail);
        if (padded == 2 * kBlock) Compress(tail + kBlock);
        Md5Digest out;
        for (int w = 0; w < 4; ++w)
            for (int i = 0; i < 4; ++i) out[4 * w + i] = static_cast<uint8_t>(h_[w] >> (8 * i));
        return out;
    }

private:
    void Compress(const uint8_t* block) {
        uint32_t m[16];
        for (int i = 0; i < 16; ++i) m[i] = LoadLe(block + 4 * i);
        uint32_t a = h_[0], b = h_[1], c = h_[2], d = h_[3];
        for (unsigned i = 0; i < 64; ++i) {
            const unsigned round = i / 16;
            uint32_t f;
            unsigned g;
            switch (round) {
                case 0:
                    f = (b & c) | (~b & d);
                    g = i;
                    break;
                case 1:
                    f = (d & b) | (~d & c);
                    g = (5 * i + 1) % 16;
                    break;
                case 2:
                    f = b ^ c ^ d;
                    g = (3 * i + 5) % 16;
                    break;
                default:
                    f = c ^ (b | ~d);
                    g = (7 * i) % 16;
                    break;
            }
            const uint32_t next = b + Rotl(a + f + kSine[i] + m[g], kShift[round][i % 4]);
            a = d;
            d = c;
            c = b;
            b = next;
        }
        h_[0] += a;
        h_[1] += b;
        h_[2] += c;
        h_[3] += d;
    }

    uint32_t h_[4] = {0x67452301, 0xefcdab89, 0x98badcfe, 0x10325476};
    uint8_t pending_[kBlock] = {};
    size_t used_ = 0;
    uint64_t total_ = 0;
};

std::string ToHex(const Md5Digest& digest) {
    static constexpr char kHex[] = "0123456789abcdef";
    std::string out(2 * digest.size(), '0');
    for (size_t i = 0; i < digest.size(); ++i) {
        out[2 * i] = kHex[digest[i] >> 4];
        out[2 * i + 1] = kHex[digest[i] & 0x0f];
    }
    return out;
}

}  // namespace

Md5Digest Md5(std::string_view bytes) {
    Md5State state;
    state.Update(bytes);
    return state.Final();
}

std::string Md5Hex(std::string_view bytes) { return ToHex(Md5(bytes)); }

std::string HmacMd5Hex(std::string_view key, std::string_view message) {
    // A key longer than the block is replaced by its digest (RFC 2104 §2); shorter keys are
    // zero padded to the block.
    uint8_t block_key[kBlock] = {};
    if (key.size() > kBlock) {
        const Md5Digest hashed = Md5(key);
        for (size_t i = 0; i < hashed.size(); ++i) block_key[i] = hashed[i];
    } else {
        for (size_t i = 0; i < key.size(); ++i) block_key[i] = static_cast<uint8_t>(key[i]);
    }
    uint8_t pad[kBlock];
    for (size_t i = 0; i < kBlock; ++i) pad[i] = block_key[i] ^ 0x36;
    Md5State inner;
    inner.Update(pad, kBlock);
    inner.Update(message);
    const Md5Digest inner_digest = inner.Final();
    for (size_t i = 0; i < kBlock; ++i) pad[i] = block_key[i] ^ 0x5c;
    Md5State outer;
    outer.Update(pad, kBlock);
    outer.Update(inner_digest.data(), inner_digest.size());
    return ToHex(outer.Final());
}

bool EqualInConstantTime(std::string_view a, std::string_view b) {
    // Lengths are not secret (a digest is always 32 digits); the content is, so every byte is
    // looked at whatever the first difference.
    if (a.size() != b.size()) return false;
    // volatile keeps the compiler from turning the loop back into an early-exit compare.
    volatile uint8_t diff = 0;
    for (size_t i = 0; i < a.size(); ++i)
        diff = diff | static_cast<uint8_t>(static_cast<uint8_t>(a[i]) ^ static_cast<uint8_t>(b[i]));
    return diff == 0;
}

}  // namespace auth
