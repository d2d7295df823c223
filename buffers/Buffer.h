#pragma once

#include <cstdint>

// Growable byte buffer in which packets are built.
// Thread contract: NOT thread safe; owned by one object and used by its thread.
class Buffer {
public:
    Buffer() = default;
    virtual ~Buffer();
    Buffer(const Buffer&) = delete;
    Buffer& operator=(const Buffer&) = delete;

    virtual void FreeBuffer();
    // New storage of `size` bytes; the old content is lost. False for size 0.
    virtual bool AllocateBuffer(unsigned size);
    // At least `size` bytes of storage; growing loses the content (callers refill).
    virtual bool ExtendBuffer(unsigned size);
    // Replaces the content with n bytes at the start of the storage.
    virtual bool FillData(const unsigned char* p, unsigned n);
    // Appends n bytes after the content, moving it into a larger block when needed.
    virtual bool AppendData(const unsigned char* p, unsigned n);
    virtual void ClearData();

    unsigned char* GetData() const { return m_data; }
    unsigned char* GetStart() const { return m_start; }
    unsigned GetCapacity() const { return m_capacity; }
    unsigned GetLength() const { return m_length; }
    // Content start back at the storage start with `length` bytes counted (at most capacity).
    void Rewind(unsigned length);

private:
    unsigned char* m_data = nullptr;
    uint32_t m_capacity = 0;
    unsigned char* m_start = nullptr;
    uint32_t m_length = 0;
};
