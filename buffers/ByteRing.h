#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>

// Fixed storage addressed by stream positions: byte `at` of everything ever written lives at
// at % size(), so writers and readers keep 64-bit positions that never wrap and a reader knows
// it was overrun when the writer is more than size() ahead of it. Copies in and out wrap at
// the end. It frames nothing and locks nothing: the ring that owns it does both.
// Thread contract: the owner's lock covers every call.
class ByteRing {
public:
    // The storage is left uninitialised: its pages become resident only as writes reach them,
    // and only written bytes are ever read.
    explicit ByteRing(size_t size);
    ByteRing(const ByteRing&) = delete;
    ByteRing& operator=(const ByteRing&) = delete;

    // `len` is at most size().
    void Put(uint64_t at, const void* src, size_t len);
    void Get(uint64_t at, void* dst, size_t len) const;
    // Whether a reader at `pos` lost bytes to a writer now at `write_pos`.
    bool Overrun(uint64_t write_pos, uint64_t pos) const { return write_pos - pos > size_; }

    size_t size() const { return size_; }

private:
    const size_t size_;
    const std::unique_ptr<uint8_t[]> data_;
};
