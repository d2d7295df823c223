#include "rtp/RtpPackets.h"

#include <sys/socket.h>

#include <cstring>

#include "base/OrvexLog.h"

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

namespace {

// The send sessions' packets: 1400 bytes of a unit at most, F cleared, marker at every unit's
// end, SSRC 10.
constexpr H264Packing kSessionPacking = {kH264FragmentPayload, kH264FragmentPayload, true, true};

class SessionPackets final : public H264PayloadSink {
public:
    SessionPackets(uint32_t timestamp, unsigned payload_type, uint16_t* sequence, PacketSink& sink)
        : timestamp_(timestamp), payload_type_(payload_type), sequence_(sequence), sink_(sink) {}
    void Payload(unsigned char* packet, unsigned length, bool end) override {
        WriteRtpHeader(packet, end, payload_type_ & 0x7F, (*sequence_)++, timestamp_, kRtpSsrc);
        sink_.Send(packet, 12 + length);
    }

private:
    uint32_t timestamp_;
    unsigned payload_type_;
    uint16_t* sequence_;
    PacketSink& sink_;
};

}  // namespace

void PacketiseH264Item(const unsigned char* item, unsigned length, uint32_t timestamp,
                       unsigned payload_type, uint16_t* sequence, PacketSink& sink) {
    if (item == nullptr || length < 5) return;  // no NAL header byte: nothing to send
    unsigned char packet[kRtpPacketMax];
    SessionPackets packets(timestamp, payload_type, sequence, sink);
    PacketiseH264Nal(item + 4, length - 4, kSessionPacking, packet, packets);
}

void WriteAuHeaderSection(unsigned char* p, unsigned au_size) {
    p[0] = 0x00;
    p[1] = 0x10;
    p[2] = static_cast<unsigned char>(au_size >> 5);
    p[3] = static_cast<unsigned char>((au_size << 3) & 0xF8);
}

unsigned BuildAacPacket(const unsigned char* frame, unsigned length, uint32_t timestamp,
                        uint16_t sequence, unsigned char* packet, unsigned payload_type) {
    if (frame == nullptr || length < kAdtsHeaderBytes) return 0;
    unsigned raw = length - kAdtsHeaderBytes;
    if (raw > kAacRawFrameMax) return 0;
    WriteRtpHeader(packet, true, payload_type, sequence, timestamp, kRtpSsrc);
    WriteAuHeaderSection(packet + 12, raw);
    memcpy(packet + 16, frame + kAdtsHeaderBytes, raw);
    return 16 + raw;
}

ClientFanout::ClientFanout(int sockfd, bool stop_at_first_failure, const char* error_text)
    : sockfd_(sockfd), stop_at_first_failure_(stop_at_first_failure), error_text_(error_text) {}

void ClientFanout::Send(const unsigned char* packet, unsigned length) {
    if (targets_ == nullptr) return;
    for (const sockaddr_in& to : *targets_) {
        ssize_t sent =
            sendto(sockfd_, packet, length, 0, reinterpret_cast<const sockaddr*>(&to), sizeof to);
        if (sent < 0) {
            OrvexPrint("%s", error_text_);
            if (stop_at_first_failure_) return;
        }
    }
}
