#pragma once

#include <cstdint>

#include "codec/H264Packetiser.h"

// The RTP packets of the send sessions as pure functions over bytes (the H.264 cutting itself is
// codec/H264Packetiser's, shared with every other sender); rtp/ClientFanout sends them to every
// client.

constexpr unsigned kRtpPacketMax = 1500;
constexpr uint32_t kRtpSsrc = 10;  // every packet of every client
// 1400 + 12 (RTP) + 2 (FU indicator and header) stays inside a 1500-byte MTU with the IP
// and UDP headers (20 + 8) and room to spare.
constexpr unsigned kH264FragmentPayload = 1400;
constexpr unsigned kAdtsHeaderBytes = 7;
// What the audio packets carry unless kv.orvex.audiopt says otherwise; the SDP announces 97.
constexpr unsigned kAacPayloadType = 98;
// 1500 - 12 (RTP) - 4 (AU headers): the largest raw AAC frame one packet carries.
constexpr unsigned kAacRawFrameMax = kRtpPacketMax - 16;

// Receives each packet as it is built. Thread contract: the caller's thread.
class PacketSink {
public:
    virtual ~PacketSink() = default;
    virtual void Send(const unsigned char* packet, unsigned length) = 0;
};

// One ring item (4-byte start code, then one NAL unit) as RTP (RFC 6184): a single NAL unit
// packet up to 1400 bytes, else FU-A fragments of 1400 (§5.8). Each packet takes *sequence
// and increments it.
void PacketiseH264Item(const unsigned char* item, unsigned length, uint32_t timestamp,
                       unsigned payload_type, uint16_t* sequence, PacketSink& sink);

// RFC 3640 §3.2.1 AU header section with one AU header: AU-headers-length 16 bits, then
// AU-size (13 bits) and AU-Index 0 (3 bits). Four bytes.
constexpr unsigned kAuHeaderSectionBytes = 4;
void WriteAuHeaderSection(unsigned char* p, unsigned au_size);

// One ADTS frame (no CRC) as one RFC 3640 AAC-hbr packet with one AU header, marker set.
// Returns the packet length, 0 when the frame is shorter than its header or its raw data does
// not fit one packet.
unsigned BuildAacPacket(const unsigned char* frame, unsigned length, uint32_t timestamp,
                        uint16_t sequence, unsigned char* packet,
                        unsigned payload_type = kAacPayloadType);
