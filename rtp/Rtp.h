#pragma once

#include <cstdint>

#include "buffers/Buffer.h"
#include "net/Udp.h"

// RTP header size (RFC 3550 §5.1, no CSRC, no extension).
constexpr int kRtpHeaderSize = 12;

// A Udp socket that builds and parses RTP packets. The caller gives SSRC and timestamp; the
// object keeps the sequence number (first 0, then +1 per packet built, wrapping at 65536).
// Thread contract: NOT thread safe; used by one thread.
class Rtp : public Udp {
public:
    explicit Rtp(unsigned mtu);
    ~Rtp() override;

    using Udp::Read;
    using Udp::Write;

    // The packet in the buffer: header (the payload type byte is not masked, so a type above
    // 127 reaches the marker bit) and payload. The payload append's result.
    bool CreateRtpPacket(unsigned char* payload, unsigned short length, unsigned char payloadType,
                         int timestamp, int ssrc, int marker);
    // Builds and sends one packet: payload bytes sent, or -1.
    int Write(unsigned char* payload, unsigned short length, signed char payloadType, int timestamp,
              int ssrc, int marker, unsigned int timeout);
    // Receives one packet; only byte 0 == 0x80 is accepted. Copies at most `length` payload
    // bytes and returns their number, or -1. `payloadType` gets byte 1 whole (marker included).
    int Read(unsigned char* payload, unsigned short length, signed char* payloadType,
             unsigned short* sequence, int* timestamp, unsigned int* ssrc, unsigned int timeout);

    uint16_t sequence() const { return m_sequence; }
    void set_sequence(uint16_t s) { m_sequence = s; }
    const Buffer& packet() const { return m_packet; }

private:
    uint16_t m_sequence = 0;
    Buffer m_packet;
};
