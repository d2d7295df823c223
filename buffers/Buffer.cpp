#include "buffers/Buffer.h"

#include <cstring>

Buffer::~Buffer() { delete[] m_data; }

void Buffer::FreeBuffer() {
    delete[] m_data;
    m_data = nullptr;
    m_capacity = 0;
    m_start = nullptr;
    m_length = 0;
}

bool Buffer::AllocateBuffer(unsigned size) {
    if (size == 0) return false;
    FreeBuffer();
    m_data = new unsigned char[size];
    m_start = m_data;
    m_capacity = size;
    return true;
}

bool Buffer::ExtendBuffer(unsigned size) {
    if (m_capacity >= size) return true;
    return AllocateBuffer(size);
}

bool Buffer::FillData(const unsigned char* p, unsigned n) {
    if (p == nullptr || n == 0) return false;
    if (m_capacity < n && !AllocateBuffer(n)) return false;
    memcpy(m_data, p, n);
    m_start = m_data;
    m_length = n;
    return true;
}

bool Buffer::AppendData(const unsigned char* p, unsigned n) {
    if (p == nullptr || n == 0) return false;
    if (m_data == nullptr && m_capacity == 0 && !AllocateBuffer(n)) return false;
    uint64_t needed = static_cast<uint64_t>(m_length) + n;
    uint64_t room = static_cast<uint64_t>(m_data + m_capacity - m_start);
    if (room < needed) {
        if (m_length > 0 && m_start == nullptr) return false;
        unsigned char* block = new unsigned char[needed];
        if (m_length > 0) memcpy(block, m_start, m_length);
        delete[] m_data;
        m_data = block;
        m_start = block;
        m_capacity = static_cast<uint32_t>(needed);
    }
    memcpy(m_start + m_length, p, n);
    m_length += n;
    return true;
}

void Buffer::ClearData() {
    m_length = 0;
    m_start = m_data;
}

void Buffer::Rewind(unsigned length) {
    m_start = m_data;
    m_length = length <= m_capacity ? length : m_capacity;
}
