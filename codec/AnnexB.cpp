#include "codec/AnnexB.h"

size_t FindStartCode(const uint8_t* data, size_t size, size_t from) {
    for (size_t i = from; i + 3 <= size; ++i) {
        if (data[i + 2] > 1) {
            i += 2;  // no start code can begin at i, i + 1 or i + 2
        } else if (data[i] == 0 && data[i + 1] == 0 && data[i + 2] == 1) {
            return i;
        }
    }
    return size;
}

size_t FindFourByteStartCode(const uint8_t* data, size_t size, size_t from) {
    for (size_t at = FindStartCode(data, size, from + 1); at < size;
         at = FindStartCode(data, size, at + 1)) {
        if (data[at - 1] == 0) return at - 1;
    }
    return size;
}

size_t StartCodeLength(const uint8_t* p, size_t len) {
    if (len >= 4 && p[0] == 0 && p[1] == 0 && p[2] == 0 && p[3] == 1) return 4;
    if (len >= 3 && p[0] == 0 && p[1] == 0 && p[2] == 1) return 3;
    return 0;
}

namespace {

// Exp-Golomb reader over a NAL unit's payload that steps over emulation prevention bytes.
class BitReader {
public:
    BitReader(const uint8_t* p, size_t len) : m_p(p), m_len(len) {}

    // False when the bits run out first.
    bool ReadUe(uint32_t* value) {
        int zeros = 0;
        int bit;
        while ((bit = ReadBit()) == 0) {
            if (++zeros > 31) return false;
        }
        if (bit < 0) return false;
        uint32_t rest = 0;
        for (int i = 0; i < zeros; ++i) {
            bit = ReadBit();
            if (bit < 0) return false;
            rest = rest << 1 | static_cast<uint32_t>(bit);
        }
        *value = (uint32_t{1} << zeros) - 1 + rest;
        return true;
    }

private:
    int ReadBit() {
        if (m_bit == 0) {
            if (m_at >= 2 && m_at < m_len && m_p[m_at] == 3 && m_p[m_at - 1] == 0 &&
                m_p[m_at - 2] == 0) {
                ++m_at;
            }
            if (m_at >= m_len) return -1;
        }
        const int bit = (m_p[m_at] >> (7 - m_bit)) & 1;
        if (++m_bit == 8) {
            m_bit = 0;
            ++m_at;
        }
        return bit;
    }

    const uint8_t* m_p;
    size_t m_len;
    size_t m_at = 0;
    int m_bit = 0;
};

}  // namespace

SliceKind SliceKindOf(const uint8_t* nal, size_t len) {
    if (len < 2) return SliceKind::kUnknown;
    const uint8_t type = nal[0] & 0x1F;
    if (type == 5) return SliceKind::kIdr;
    if (type != 1) return SliceKind::kUnknown;
    BitReader bits(nal + 1, len - 1);
    uint32_t first_mb = 0, slice_type = 0;
    if (!bits.ReadUe(&first_mb) || !bits.ReadUe(&slice_type) || slice_type > 9) {
        return SliceKind::kUnknown;
    }
    switch (slice_type % 5) {
        case 1:
            return SliceKind::kB;
        case 2:
        case 4:
            return SliceKind::kI;
        default:
            return SliceKind::kP;  // P and SP
    }
}
