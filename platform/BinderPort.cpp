#include "platform/BinderPort.h"

#include <cstring>

namespace platform {

int32_t ParcelReader::readInt32() {
    if (size_ - pos_ < 4) {
        pos_ = size_;
        return 0;
    }
    int32_t v =
        static_cast<int32_t>(uint32_t{data_[pos_]} | uint32_t{data_[pos_ + 1]} << 8 |
                             uint32_t{data_[pos_ + 2]} << 16 | uint32_t{data_[pos_ + 3]} << 24);
    pos_ += 4;
    return v;
}

const uint8_t* ParcelReader::readInplace(size_t len) {
    size_t padded = (len + 3) & ~size_t{3};
    if (padded < len || size_ - pos_ < len) {
        pos_ = size_;
        return nullptr;
    }
    const uint8_t* at = data_ + pos_;
    pos_ = size_ - pos_ < padded ? size_ : pos_ + padded;
    return at;
}

void ParcelWriter::writeInt32(int32_t v) {
    uint32_t u = static_cast<uint32_t>(v);
    for (int i = 0; i < 4; ++i) data_.push_back(static_cast<uint8_t>(u >> (8 * i)));
}

void ParcelWriter::writeInplace(const void* data, size_t len) {
    const uint8_t* p = static_cast<const uint8_t*>(data);
    if (len > 0) data_.insert(data_.end(), p, p + len);
    data_.resize((data_.size() + 3) & ~size_t{3}, 0);
}

}  // namespace platform
