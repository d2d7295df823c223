#include "rtp/RtpPackets.h"

#include <gtest/gtest.h>

#include <vector>

namespace {

using Bytes = std::vector<unsigned char>;

struct Recorder : PacketSink {
    void Send(const unsigned char* p, unsigned n) override { packets.emplace_back(p, p + n); }
    std::vector<Bytes> packets;
};

// A ring item: start code, NAL header `h`, then n - 1 bytes counting up.
Bytes Item(unsigned n, unsigned char h) {
    Bytes b = {0, 0, 0, 1, h};
    for (unsigned i = 1; i < n; ++i) b.push_back(static_cast<unsigned char>(i));
    return b;
}

TEST(H264PacketiserTest, SizesFlagsAndPayloadOfSingleAndFragmentedUnits) {
    struct Case {
        unsigned nal_size;
        std::vector<unsigned> sizes;  // packet sizes
    };
    const Case cases[] = {
        {2, {14}},           // header + one byte
        {1400, {1412}},      // the largest single NAL unit packet
        {1401, {1414, 14}},  // last fragment: indicator and header, no payload
        {2800, {1414, 1413}},
        {2801, {1414, 1414, 14}},
        {4000, {1414, 1414, 1213}},
    };
    for (const Case& c : cases) {
        Recorder r;
        Bytes item = Item(c.nal_size, 0xE5);  // forbidden bit set, NRI 3, IDR
        uint16_t seq = 65534;
        PacketiseH264Item(item.data(), static_cast<unsigned>(item.size()), 0x11223344, 96, &seq, r);
        ASSERT_EQ(r.packets.size(), c.sizes.size()) << c.nal_size;
        Bytes payload;  // what a receiver reassembles after the NAL header
        for (size_t i = 0; i < r.packets.size(); ++i) {
            const Bytes& p = r.packets[i];
            bool last = i + 1 == r.packets.size();
            EXPECT_EQ(p.size(), c.sizes[i]) << c.nal_size << " packet " << i;
            EXPECT_EQ(p[0], 0x80);
            EXPECT_EQ(p[1], (last ? 0x80 : 0) | 96) << c.nal_size << " packet " << i;
            EXPECT_EQ((p[2] << 8) | p[3], (65534 + i) & 0xFFFF);
            EXPECT_EQ(Bytes(p.begin() + 4, p.begin() + 12),
                      (Bytes{0x11, 0x22, 0x33, 0x44, 0, 0, 0, 10}));
            if (c.sizes.size() == 1) {
                EXPECT_EQ(p[12], 0x65);  // forbidden bit cleared
                payload.insert(payload.end(), p.begin() + 13, p.end());
            } else {
                EXPECT_EQ(p[12], 0x60 | 28);
                EXPECT_EQ(p[13], (i == 0 ? 0x80 : 0) | (last ? 0x40 : 0) | 5);
                payload.insert(payload.end(), p.begin() + 14, p.end());
            }
        }
        EXPECT_EQ(payload, Bytes(item.begin() + 5, item.end())) << c.nal_size;
        EXPECT_EQ(seq, static_cast<uint16_t>(65534 + c.sizes.size()));
    }
}

TEST(H264PacketiserTest, ItemWithoutNalHeaderSendsNothing) {
    Recorder r;
    uint16_t seq = 0;
    Bytes item = {0, 0, 0, 1};
    PacketiseH264Item(item.data(), 4, 0, 96, &seq, r);
    PacketiseH264Item(nullptr, 100, 0, 96, &seq, r);
    EXPECT_TRUE(r.packets.empty());
    EXPECT_EQ(seq, 0);
}

TEST(AacPacketTest, OneAuHeaderAfterTheRtpHeader) {
    Bytes frame(200, 0x5A);
    for (int i = 0; i < 7; ++i) frame[i] = 0xF0 + i;  // the ADTS header is not sent
    unsigned char packet[kRtpPacketMax];
    ASSERT_EQ(BuildAacPacket(frame.data(), 200, 48000, 65533, packet), 209u);
    EXPECT_EQ(Bytes(packet, packet + 16), (Bytes{0x80, 0xE2, 0xFF, 0xFD, 0, 0, 0xBB, 0x80, 0, 0, 0,
                                                 10, 0x00, 0x10, 0x06, 0x08}));
    EXPECT_EQ(packet[16], 0x5A);
    EXPECT_EQ(packet[208], 0x5A);

    Bytes largest(7 + 1484, 1), too_large(7 + 1485, 1);
    EXPECT_EQ(BuildAacPacket(largest.data(), static_cast<unsigned>(largest.size()), 0, 0, packet),
              1500u);
    EXPECT_EQ(
        BuildAacPacket(too_large.data(), static_cast<unsigned>(too_large.size()), 0, 0, packet),
        0u);
    EXPECT_EQ(BuildAacPacket(frame.data(), 6, 0, 0, packet), 0u);
    EXPECT_EQ(BuildAacPacket(frame.data(), 7, 0, 0, packet), 16u);  // empty access unit
}

}  // namespace
