#include "webrtc/Rtcp.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <string>
#include <vector>

#include "Hex.h"  // beside this file

namespace {

using webrtc::RtcpFeedback;

// Receiver report from 0x00000001 about 0x11223344: 1/16 lost, 5 in all, highest 0x00010203,
// jitter 32.
const std::string kRr = "81c90007 00000001 11223344 10000005 00010203 00000020 00000000 00000000";
// Generic NACK about 0x11223344: PID 100, BLP 0b101 (101 and 103).
const std::string kNack = "81cd0003 00000001 11223344 00640005";
const std::string kPli = "81ce0002 00000001 11223344";
// FIR: the header's media SSRC is 0; the FCI names 0x11223344, command sequence 7.
const std::string kFir = "84ce0004 00000001 00000000 11223344 07000000";
const std::string kSdes = "81ca0003 00000001 01046162 63640000";
const std::string kRemb = "8fce0005 00000001 00000000 52454d42 0101e240 11223344";
const std::string kTransportCc = "8fcd0004 00000001 11223344 00010002 00000000";

// One NACK packet of `fcis` FCIs, FCI i asking for PID i * 100 and the 16 after it.
std::string ManyNacks(int fcis) {
    char word[16];
    snprintf(word, sizeof word, "81cd%04x", 2 + fcis);
    std::string s = word;
    s += " 00000001 11223344";
    for (int i = 0; i < fcis; ++i) {
        snprintf(word, sizeof word, " %04xffff", i * 100);
        s += word;
    }
    return s;
}

TEST(WebRtcRtcpTest, ReadCompoundPackets) {
    struct Case {
        const char* name;
        std::string bytes;
        bool ok;
        // Checked when ok.
        std::vector<uint16_t> nacked = {};
        uint32_t nack_media_ssrc = 0;
        bool pli = false, fir = false;
        uint32_t keyframe_media_ssrc = 0;
        uint8_t fir_sequence = 0;
        bool has_report = false;
        uint32_t report_ssrc = 0;
        uint8_t fraction_lost = 0;
        int32_t cumulative_lost = 0;
        uint32_t highest_sequence = 0, jitter = 0;
    };
    const Case cases[] = {
        {"receiver report and NACK, as in a compound",
         kRr + kNack,
         true,
         {100, 101, 103},
         0x11223344,
         false,
         false,
         0,
         0,
         true,
         0x11223344,
         0x10,
         5,
         0x00010203,
         32},
        {"reduced-size PLI alone", kPli, true, {}, 0, true, false, 0x11223344, 0, false},
        {"FIR names its SSRC in the FCI", kFir, true, {}, 0, false, true, 0x11223344, 7, false},
        {"PLI then FIR: both, the first one's SSRC",
         kPli + kFir,
         true,
         {},
         0,
         true,
         true,
         0x11223344,
         7,
         false},
        {"sender report's block",
         "81c8000c 00000001 e8a1b2c3 d4e5f607 00000000 00000001 00000002 55667788 ff000001 "
         "0000ffff 00000000 00000000 00000000",
         true,
         {},
         0,
         false,
         false,
         0,
         0,
         true,
         0x55667788,
         0xff,
         1,
         0xffff,
         0},
        {"cumulative loss is signed (duplicates)",
         "81c90007 00000001 11223344 00fffffe 00010203 00000000 00000000 00000000",
         true,
         {},
         0,
         false,
         false,
         0,
         0,
         true,
         0x11223344,
         0,
         -2,
         0x00010203,
         0},
        {"empty receiver report", "80c90001 00000001", true, {}, 0, false, false, 0, 0, false},
        {"NACK across the sequence wrap",
         "81cd0003 00000001 11223344 ffff8001",
         true,
         {65535, 0, 15},
         0x11223344,
         false,
         false,
         0,
         0,
         false},
        {"a second media SSRC's NACK is left out",
         kNack + "81cd0003 00000001 55667788 00c80000",
         true,
         {100, 101, 103},
         0x11223344,
         false,
         false,
         0,
         0,
         false},
        {"SDES, REMB and transport-cc skipped",
         kSdes + kRemb + kTransportCc + kPli,
         true,
         {},
         0,
         true,
         false,
         0x11223344,
         0,
         false},
        {"padded last packet",
         "a1ce0003 00000001 11223344 00000004",
         true,
         {},
         0,
         true,
         false,
         0x11223344,
         0,
         false},
        {"version 1", "41ce0002 00000001 11223344", false},
        {"length beyond the datagram", "81ce0003 00000001 11223344", false},
        {"two bytes after the last packet", kPli + "0000", false},
        {"report count larger than the packet",
         "82c90007 00000001 11223344 10000005 00010203 "
         "00000020 00000000 00000000",
         false},
        {"feedback without media SSRC", "81ce0001 00000001", false},
        {"FIR without FCI", "84ce0002 00000001 00000000", false},
        {"padding longer than the packet", "a1ce0002 00000001 11223310", false},
        {"padding count of zero", "a1ce0002 00000001 11223300", false},
        {"empty datagram", "", false},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        const std::vector<uint8_t> m = Hex(c.bytes);
        RtcpFeedback f;
        ASSERT_EQ(webrtc::ReadRtcp(m.data(), m.size(), &f), c.ok);
        if (!c.ok) continue;
        EXPECT_EQ(std::vector<uint16_t>(f.nacked, f.nacked + f.nacked_count), c.nacked);
        EXPECT_EQ(f.nack_media_ssrc, c.nack_media_ssrc);
        EXPECT_EQ(f.pli, c.pli);
        EXPECT_EQ(f.fir, c.fir);
        EXPECT_EQ(f.keyframe_media_ssrc, c.keyframe_media_ssrc);
        EXPECT_EQ(f.fir_sequence, c.fir_sequence);
        EXPECT_EQ(f.has_report, c.has_report);
        if (!c.has_report) continue;
        EXPECT_EQ(f.report_ssrc, c.report_ssrc);
        EXPECT_EQ(f.fraction_lost, c.fraction_lost);
        EXPECT_EQ(f.cumulative_lost, c.cumulative_lost);
        EXPECT_EQ(f.highest_sequence, c.highest_sequence);
        EXPECT_EQ(f.jitter, c.jitter);
    }
}

// What Chromium 156 sent (encryption off, a test flag) while it received H.264 slices it could
// not decode, two packets of every ten left out, from SSRC 0x11223344: reduced-size compounds of
// a receiver report with PLI, NACK and REMB.
TEST(WebRtcRtcpTest, ReadChromiumFeedback) {
    struct Case {
        const char* name;
        std::string bytes;
        std::vector<uint16_t> nacked;
        bool pli;
        bool has_report;
        uint8_t fraction_lost = 0;
        int32_t cumulative_lost = 0;
        uint32_t highest_sequence = 0, jitter = 0;
    };
    const Case cases[] = {
        {"empty report, PLI", "80c90001 00000001 81ce0002 00000001 11223344", {}, true, false},
        {"report, PLI",
         "81c90007 00000001 11223344 00000000 000003ec 0000003c 00000000 00000000 "
         "81ce0002 00000001 11223344",
         {},
         true,
         true,
         0,
         0,
         1004,
         60},
        {"report, NACK of 1010 and 1011",
         "81c90007 00000001 11223344 00000000 000003f1 00000074 00000000 00000000 "
         "81cd0003 00000001 11223344 03f20001",
         {1010, 1011},
         false,
         true,
         0,
         0,
         1009,
         116},
        {"report, PLI, REMB",
         "81c90007 00000001 11223344 00000006 0000040e 000000f8 00000000 00000000 "
         "81ce0002 00000001 11223344 8fce0005 00000001 00000000 52454d42 010036d8 11223344",
         {},
         true,
         true,
         0,
         6,
         1038,
         248},
        {"report, NACK of 1034 and 1035, REMB",
         "81c90007 00000001 11223344 00000006 0000040e 000000f8 00000000 00000000 "
         "81cd0003 00000001 11223344 040a0001 8fce0005 00000001 00000000 52454d42 010036d8 "
         "11223344",
         {1034, 1035},
         false,
         true,
         0,
         6,
         1038,
         248},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        const std::vector<uint8_t> m = Hex(c.bytes);
        RtcpFeedback f;
        ASSERT_TRUE(webrtc::ReadRtcp(m.data(), m.size(), &f));
        EXPECT_EQ(std::vector<uint16_t>(f.nacked, f.nacked + f.nacked_count), c.nacked);
        if (!c.nacked.empty()) {
            EXPECT_EQ(f.nack_media_ssrc, 0x11223344u);
        }
        EXPECT_EQ(f.pli, c.pli);
        EXPECT_FALSE(f.fir);
        if (c.pli) {
            EXPECT_EQ(f.keyframe_media_ssrc, 0x11223344u);
        }
        EXPECT_EQ(f.has_report, c.has_report);
        if (!c.has_report) continue;
        EXPECT_EQ(f.report_ssrc, 0x11223344u);
        EXPECT_EQ(f.fraction_lost, c.fraction_lost);
        EXPECT_EQ(f.cumulative_lost, c.cumulative_lost);
        EXPECT_EQ(f.highest_sequence, c.highest_sequence);
        EXPECT_EQ(f.jitter, c.jitter);
    }
}

TEST(WebRtcRtcpTest, NackListStopsAtItsCapacity) {
    // 16 FCIs with all 16 BLP bits: 272 numbers asked, the first 256 kept in order.
    const std::vector<uint8_t> m = Hex(ManyNacks(16));
    RtcpFeedback f;
    ASSERT_TRUE(webrtc::ReadRtcp(m.data(), m.size(), &f));
    ASSERT_EQ(f.nacked_count, webrtc::kMaxNacked);
    EXPECT_EQ(f.nacked[0], 0);
    EXPECT_EQ(f.nacked[16], 16);
    EXPECT_EQ(f.nacked[17], 100);
    EXPECT_EQ(f.nacked[255], 1500);  // 255 = 15 * 17: FCI 15's PID, the last one kept
}

TEST(WebRtcRtcpTest, WriteSenderReport) {
    uint8_t out[64];
    const size_t n = webrtc::WriteSenderReport(0x11223344, 0xe8a1b2c3d4e5f607, 0x01020304, 1000,
                                               1200000, out, sizeof out);
    EXPECT_EQ(std::vector<uint8_t>(out, out + n),
              Hex("80c80006 11223344 e8a1b2c3 d4e5f607 01020304 000003e8 00124f80"));
    EXPECT_EQ(webrtc::WriteSenderReport(1, 2, 3, 4, 5, out, 27), 0u);
}

TEST(WebRtcRtcpTest, Demultiplex) {
    struct Case {
        const char* name;
        std::string bytes;
        bool rtcp;
    };
    const Case cases[] = {
        {"sender report (200)", "80c80006 11223344", true},
        {"PSFB (206)", kPli, true},
        {"lowest of the range, 192", "80c00001 11223344", true},
        {"highest of the range, 223", "80df0001 11223344", true},
        {"RTP H.264, type 102 with the marker (230)", "80e60001 00000000 11223344", false},
        {"RTP Opus, type 111 without the marker", "806f0001 00000000 11223344", false},
        {"STUN", "00010000 2112a442 00010203 04050607 08090a0b", false},
        {"version 1", "40c80006 11223344", false},
        {"shorter than header and SSRC", "80c80006 112233", false},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        const std::vector<uint8_t> m = Hex(c.bytes);
        EXPECT_EQ(webrtc::LooksLikeRtcp(m.data(), m.size()), c.rtcp);
    }
}

}  // namespace
