#include "buffers/ByteRing.h"

#include <algorithm>
#include <cstring>

ByteRing::ByteRing(size_t size) : size_(size), data_(new uint8_t[size]) {}

void ByteRing::Put(uint64_t at, const void* src, size_t len) {
    const size_t offset = static_cast<size_t>(at % size_);
    const size_t first = std::min(len, size_ - offset);
    const uint8_t* from = static_cast<const uint8_t*>(src);
    memcpy(data_.get() + offset, from, first);
    memcpy(data_.get(), from + first, len - first);
}

void ByteRing::Get(uint64_t at, void* dst, size_t len) const {
    const size_t offset = static_cast<size_t>(at % size_);
    const size_t first = std::min(len, size_ - offset);
    uint8_t* to = static_cast<uint8_t*>(dst);
    memcpy(to, data_.get() + offset, first);
    memcpy(to + first, data_.get(), len - first);
}
