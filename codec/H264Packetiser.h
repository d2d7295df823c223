#pragma once

#include <cstdint>

// RTP for H.264 as pure functions over bytes (RFC 3550, RFC 6184): what every sender of the
// picture shares, so that none of them needs the send sessions or sockets to build packets.

// RFC 3550 §5.1 header, V=2 and no CSRC. The low 8 bits of `payload_type` are ORed under the
// marker bit unmasked (a type above 127 sets it); callers that want 7 bits mask.
void WriteRtpHeader(unsigned char* p, bool marker, unsigned payload_type, uint16_t sequence,
                    uint32_t timestamp, uint32_t ssrc);

// How NAL units are cut into RTP payloads (RFC 6184).
struct H264Packing {
    unsigned single_max;    // the largest unit sent whole, as a single NAL unit packet
    unsigned fragment_max;  // bytes of the unit carried by one FU-A fragment
    bool clear_forbidden;   // F bit cleared in the single packet and in the FU indicator
    // Fragments counted over the whole unit, header byte included, as the send sessions do: a
    // unit of k * fragment_max + 1 bytes then ends with a fragment without payload.
    bool count_header;
};

// Receives each RTP payload of a unit, built at packet + 12 so that the caller can write the
// header in front. `end` marks the unit's last payload.
class H264PayloadSink {
public:
    virtual ~H264PayloadSink() = default;
    virtual void Payload(unsigned char* packet, unsigned length, bool end) = 0;
};

// Cuts one NAL unit (header byte first, `size` >= 1) into RTP payloads built one after another
// in `packet`, which holds 12 + max(single_max, fragment_max + 2) bytes.
void PacketiseH264Nal(const unsigned char* nal, unsigned size, const H264Packing& packing,
                      unsigned char* packet, H264PayloadSink& sink);
