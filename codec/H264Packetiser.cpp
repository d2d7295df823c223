#include "codec/H264Packetiser.h"

#include <cstring>

void WriteRtpHeader(unsigned char* p, bool marker, unsigned payload_type, uint16_t sequence,
                    uint32_t timestamp, uint32_t ssrc) {
    p[0] = 0x80;
    p[1] = static_cast<unsigned char>((marker ? 0x80 : 0) | (payload_type & 0xFF));
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

void PacketiseH264Nal(const unsigned char* nal, unsigned size, const H264Packing& packing,
                      unsigned char* packet, H264PayloadSink& sink) {
    if (nal == nullptr || size == 0 || packing.fragment_max == 0) return;
    unsigned char* payload = packet + 12;
    const unsigned char h = nal[0];
    const unsigned char f_mask = packing.clear_forbidden ? 0x7F : 0xFF;
    if (size <= packing.single_max) {
        payload[0] = h & f_mask;
        memcpy(payload + 1, nal + 1, size - 1);
        sink.Payload(packet, size, true);
        return;
    }
    const unsigned body = size - 1;
    const unsigned counted = packing.count_header ? size : body;
    const unsigned fragments = (counted + packing.fragment_max - 1) / packing.fragment_max;
    const unsigned char* piece = nal + 1;
    for (unsigned i = 0; i < fragments; ++i) {
        bool first = i == 0;
        bool last = i + 1 == fragments;
        // Full pieces, then what is left (nothing when the header byte was counted in).
        unsigned n = last ? body - i * packing.fragment_max : packing.fragment_max;
        payload[0] = static_cast<unsigned char>((h & 0xE0 & f_mask) | 28);  // FU indicator: type 28
        payload[1] =  // FU header: S, E and the unit's type
            static_cast<unsigned char>((h & 0x1F) | (first ? 0x80 : 0) | (last ? 0x40 : 0));
        memcpy(payload + 2, piece, n);
        piece += n;
        sink.Payload(packet, n + 2, last);
    }
}
