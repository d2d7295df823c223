#include "rtp/RtpPackets.h"

#include <cstring>

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
