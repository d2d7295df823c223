#include "rtp/RtpPackets.h"

#include <sys/socket.h>

#include <cstring>

#include "service/OrvexLog.h"

void WriteRtpHeader(unsigned char* p, bool marker, unsigned payload_type, uint16_t sequence,
                    uint32_t timestamp, uint32_t ssrc) {
    p[0] = 0x80;
    p[1] = static_cast<unsigned char>((marker ? 0x80 : 0) | (payload_type & 0x7F));
    p[2] = static_cast<unsigned char>(sequence >> 8);
    p[3] = static_cast<unsigned char>(sequence);
    p[4] = static_cast<unsigned char>(timestamp >> 24);
    p[5] = static_cast<unsigned char>(timestamp >> 16);
    p[6] = static_cast<unsigned char>(timestamp >> 8);
    p[7] = static_cast<unsigned char>(timestamp);
    p[8] = static_cast<unsigned char>(ssrc >> 24);
    p[9] = static_cast<unsigned char>(ssrc >> 16);
    p[10] = static_cast<unsigned char>(ssrc >> 8);
    p[11] = static_cast<unsigned char>(ssrc);
}

void PacketiseH264Item(const unsigned char* item, unsigned length, uint32_t timestamp,
                       unsigned payload_type, uint16_t* sequence, PacketSink& sink) {
    if (item == nullptr || length < 5) return;  // no NAL header byte: nothing to send
    unsigned char packet[kRtpPacketMax];
    const unsigned n = length - 4;
    const unsigned char h = item[4];
    if (n <= kH264FragmentPayload) {
        // The marker is set on every single NAL unit packet, whatever its type.
        WriteRtpHeader(packet, true, payload_type, (*sequence)++, timestamp, kRtpSsrc);
        packet[12] = h & 0x7F;
        memcpy(packet + 13, item + 5, n - 1);
        sink.Send(packet, 12 + n);
        return;
    }
    const unsigned r = n % kH264FragmentPayload;
    const unsigned fragments = n / kH264FragmentPayload + (r == 0 ? 0 : 1);
    const unsigned last_share = r == 0 ? kH264FragmentPayload : r;
    const unsigned char* piece = item + 5;
    for (unsigned i = 0; i < fragments; ++i) {
        bool first = i == 0;
        bool last = i + 1 == fragments;
        // The last piece is one byte short of its share (the NAL header went first), so a
        // unit of 1400k + 1 bytes ends with a fragment that carries no payload; kept.
        unsigned size = last ? last_share - 1 : kH264FragmentPayload;
        WriteRtpHeader(packet, last, payload_type, (*sequence)++, timestamp, kRtpSsrc);
        packet[12] = static_cast<unsigned char>((h & 0x60) | 28);  // FU indicator: NRI, type 28
        packet[13] = static_cast<unsigned char>((h & 0x1F) | (first ? 0x80 : 0) | (last ? 0x40 : 0));
        memcpy(packet + 14, piece, size);
        piece += size;
        sink.Send(packet, 14 + size);
    }
}

unsigned BuildAacPacket(const unsigned char* frame, unsigned length, uint32_t timestamp,
                        uint16_t sequence, unsigned char* packet, unsigned payload_type) {
    if (frame == nullptr || length < kAdtsHeaderBytes) return 0;
    unsigned raw = length - kAdtsHeaderBytes;
    if (raw > kAacRawFrameMax) return 0;
    WriteRtpHeader(packet, true, payload_type, sequence, timestamp, kRtpSsrc);
    // RFC 3640 §3.2.1: AU-headers-length 16 bits; AU-size 13 bits, AU-Index 3 bits (0).
    packet[12] = 0x00;
    packet[13] = 0x10;
    packet[14] = static_cast<unsigned char>(raw >> 5);
    packet[15] = static_cast<unsigned char>((raw << 3) & 0xF8);
    memcpy(packet + 16, frame + kAdtsHeaderBytes, raw);
    return 16 + raw;
}

ClientFanout::ClientFanout(int sockfd, bool stop_at_first_failure, const char* error_text)
    : sockfd_(sockfd), stop_at_first_failure_(stop_at_first_failure), error_text_(error_text) {}

void ClientFanout::Send(const unsigned char* packet, unsigned length) {
    if (targets_ == nullptr) return;
    for (const sockaddr_in& to : *targets_) {
        ssize_t sent = sendto(sockfd_, packet, length, 0, reinterpret_cast<const sockaddr*>(&to),
                              sizeof to);
        if (sent < 0) {
            OrvexPrint("%s", error_text_);
            if (stop_at_first_failure_) return;
        }
    }
}
