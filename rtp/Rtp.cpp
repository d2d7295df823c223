#include "rtp/Rtp.h"

#include <cstring>

#include "codec/H264Packetiser.h"

namespace {

uint32_t GetBig32(const unsigned char* p) {
    return (uint32_t{p[0]} << 24) | (uint32_t{p[1]} << 16) | (uint32_t{p[2]} << 8) | p[3];
}

}  // namespace

Rtp::Rtp(unsigned mtu) : Udp(mtu) {}

Rtp::~Rtp() { m_packet.FreeBuffer(); }

bool Rtp::CreateRtpPacket(unsigned char* payload, unsigned short length, unsigned char payloadType,
                          int timestamp, int ssrc, int marker) {
    unsigned needed = static_cast<unsigned>(length) + kRtpHeaderSize;
    if (m_packet.GetCapacity() < needed) m_packet.ExtendBuffer(needed);
    WriteRtpHeader(m_packet.GetData(), marker != 0, payloadType, m_sequence,
                   static_cast<uint32_t>(timestamp), static_cast<uint32_t>(ssrc));
    ++m_sequence;
    m_packet.Rewind(kRtpHeaderSize);
    return m_packet.AppendData(payload, length);
}

int Rtp::Write(unsigned char* payload, unsigned short length, signed char payloadType,
               int timestamp, int ssrc, int marker, unsigned int timeout) {
    CreateRtpPacket(payload, length, static_cast<unsigned char>(payloadType), timestamp, ssrc,
                    marker);
    int sent =
        Udp::Write(m_packet.GetStart(), static_cast<unsigned short>(m_packet.GetLength()), timeout);
    return sent < kRtpHeaderSize ? -1 : sent - kRtpHeaderSize;
}

int Rtp::Read(unsigned char* payload, unsigned short length, signed char* payloadType,
              unsigned short* sequence, int* timestamp, unsigned int* ssrc, unsigned int timeout) {
    unsigned needed = static_cast<unsigned>(length) + kRtpHeaderSize;
    if (m_packet.GetCapacity() < needed) m_packet.ExtendBuffer(needed);
    m_packet.Rewind(0);
    int n = Udp::Read(m_packet.GetData(),
                      static_cast<unsigned short>(m_packet.GetCapacity() & 0xFFFF), timeout);
    if (n < kRtpHeaderSize) return -1;
    const unsigned char* h = m_packet.GetData();
    if (h[0] != 0x80) return -1;
    m_packet.Rewind(static_cast<unsigned>(n));
    // Bounded by the caller's buffer, however large the packet buffer has grown.
    int count = n - kRtpHeaderSize;
    if (count > length) count = length;
    if (payload != nullptr && count > 0)
        memcpy(payload, h + kRtpHeaderSize, static_cast<size_t>(count));
    if (payloadType != nullptr) *payloadType = static_cast<signed char>(h[1]);
    if (sequence != nullptr) *sequence = static_cast<unsigned short>((h[2] << 8) | h[3]);
    if (timestamp != nullptr) *timestamp = static_cast<int>(GetBig32(h + 4));
    if (ssrc != nullptr) *ssrc = GetBig32(h + 8);
    return count;
}
