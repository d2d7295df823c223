#include "codec/h264_sps.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "codec/Base64.h"

namespace {

using Bytes = std::vector<uint8_t>;

Bytes FromBase64(const std::string& text) {
    static const std::string kAlphabet =
        "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    Bytes out;
    unsigned v = 0;
    int bits = 0;
    for (char c : text) {
        if (c == '=') break;
        v = (v << 6) | static_cast<unsigned>(kAlphabet.find(c));
        bits += 6;
        if (bits >= 8) {
            bits -= 8;
            out.push_back(static_cast<uint8_t>(v >> bits));
        }
    }
    return out;
}

// Writes SPS fields bit by bit, for SPSs no encoder would produce.
struct BitWriter {
    void Put(uint32_t value, int n) {
        for (int i = n - 1; i >= 0; --i) {
            if (bit == 0) bytes.push_back(0);
            bytes.back() |= static_cast<uint8_t>(((value >> i) & 1) << (7 - bit));
            bit = (bit + 1) % 8;
        }
    }
    void Ue(uint32_t v) {
        uint64_t x = uint64_t{v} + 1;
        int len = 0;
        while ((x >> len) > 1) ++len;
        Put(0, len);
        Put(static_cast<uint32_t>(x), len + 1);
    }
    Bytes bytes;
    int bit = 0;
};

// A Baseline-style SPS up to the VUI flag; `vui` appends a VUI with the given fields.
Bytes MakeSps(uint32_t profile, uint32_t sps_id, bool vui, uint32_t time_scale, uint32_t reorder) {
    BitWriter w;
    w.Put(profile, 8);
    w.Put(0, 8);
    w.Put(30, 8);
    w.Ue(sps_id);
    if (profile >= 100) {
        w.Ue(1);  // chroma_format_idc
        w.Ue(0);  // bit depths
        w.Ue(0);
        w.Put(0, 1);
        w.Put(0, 1);  // no scaling matrix
    }
    w.Ue(0);  // log2_max_frame_num_minus4
    w.Ue(2);  // pic_order_cnt_type
    w.Ue(1);  // max_num_ref_frames
    w.Put(0, 1);
    w.Ue(39);     // 640
    w.Ue(29);     // 480
    w.Put(1, 1);  // frame_mbs_only
    w.Put(1, 1);
    w.Put(0, 1);  // no cropping
    w.Put(vui ? 1 : 0, 1);
    if (vui) {
        w.Put(0, 4);  // aspect, overscan, signal type, chroma loc: absent
        w.Put(1, 1);  // timing
        w.Put(1, 32);
        w.Put(time_scale, 32);
        w.Put(1, 1);
        w.Put(0, 2);  // no HRD
        w.Put(0, 1);  // pic_struct
        w.Put(1, 1);  // bitstream restriction
        w.Put(1, 1);
        w.Ue(2);
        w.Ue(1);
        w.Ue(16);
        w.Ue(16);
        w.Ue(reorder);
        w.Ue(reorder);
    }
    w.Put(1, 1);  // rbsp stop bit
    return w.bytes;
}

TEST(SpsParserTest, ParameterSetsAnnouncedInTheSdpDecode) {
    struct Case {
        const char* sps;
        uint32_t width_mbs, height_mbs;
    };
    const Case cases[] = {
        {"Z0JAHqbAoD2hAAADAAEAAAMAKA8QIuA=", 40, 30},
        {"Z0JAHqbB4KaEAAADAAQAAAMAoDxAi4A=", 30, 20},
        {"Z0JAHqbBQfoQAAADABAAAAMCgPECLg==", 20, 15},  // 320x240: every other width
    };
    for (const Case& c : cases) {
        Bytes nal = FromBase64(c.sps);
        ASSERT_EQ(nal[0] & 0x1F, 7);
        h264_sps_t sps;
        uint32_t ts =
            h264_parse_sps(nal.data() + 1, static_cast<unsigned>(nal.size() - 1), 1, &sps);
        EXPECT_EQ(sps.profile_idc, 66u) << c.sps;
        EXPECT_EQ(sps.level_idc, 30u);
        EXPECT_EQ(sps.pic_width_in_mbs_minus1 + 1, c.width_mbs) << c.sps;
        EXPECT_EQ(sps.pic_height_in_map_units_minus1 + 1, c.height_mbs) << c.sps;
        EXPECT_EQ(sps.timing_info_present_flag, 1u);
        EXPECT_NE(ts, 0u);
        EXPECT_EQ(ts, sps.time_scale);
        std::string again;
        Base64Encode(nal.data(), static_cast<unsigned>(nal.size()), again);
        EXPECT_EQ(again, c.sps);
    }
}

TEST(SpsParserTest, EncoderSpsWithEmulationPreventionAndTiming) {
    // libx264, 640x480 at 30 fps: 00 00 03 twice inside the VUI timing fields.
    const Bytes nal = {0x67, 0x42, 0xC0, 0x1E, 0xD9, 0x00, 0xA0, 0x3D, 0xB0, 0x11, 0x00, 0x00,
                       0x03, 0x00, 0x01, 0x00, 0x00, 0x03, 0x00, 0x3C, 0x0F, 0x16, 0x2E, 0x48};
    h264_sps_t sps;
    uint32_t ts = h264_parse_sps(nal.data() + 1, static_cast<unsigned>(nal.size() - 1), 1, &sps);
    EXPECT_EQ(sps.pic_width_in_mbs_minus1, 39u);
    EXPECT_EQ(sps.pic_height_in_map_units_minus1, 29u);
    EXPECT_EQ(ts, 60u);  // 2 x 30 fps, num_units_in_tick 1
}

TEST(SpsParserTest, ComplaintsAndTimeScaleRules) {
    struct Case {
        const char* name;
        Bytes sps;
        uint32_t previous, result;
        const char* complaint;
    };
    const Case cases[] = {
        {"sps_id 31 parses", MakeSps(66, 31, true, 50, 0), 1, 50, ""},
        {"sps_id 32 is invalid", MakeSps(66, 32, true, 50, 0), 7, 7, "invalid SPS (sps_id=32)"},
        {"17 reorder frames", MakeSps(66, 0, true, 50, 17), 1, 50,
         "illegal num_reorder_frames 17\n"},
        {"no VUI keeps the previous", MakeSps(66, 0, false, 0, 0), 9, 9, ""},
        {"time_scale 0", MakeSps(66, 0, true, 0, 0), 1, 0, ""},
        {"profile 101 reads chroma fields", MakeSps(101, 0, true, 48, 2), 1, 48, ""},
        {"profile 99 does not", MakeSps(99, 0, true, 48, 2), 1, 48, ""},
    };
    for (const Case& c : cases) {
        h264_sps_t sps;
        uint32_t got =
            h264_parse_sps(c.sps.data(), static_cast<unsigned>(c.sps.size()), c.previous, &sps);
        char complaint[64];
        EXPECT_EQ(h264_sps_complaint(sps, complaint, sizeof complaint), *c.complaint != '\0')
            << c.name;
        EXPECT_STREQ(complaint, c.complaint) << c.name;
        EXPECT_EQ(got, c.result) << c.name;
    }
    // The chroma fields really move the bit position: 99 misreads an SPS written as 101.
    Bytes high = MakeSps(101, 0, true, 48, 2);
    high[0] = 99;
    h264_sps_t sps;
    ::testing::internal::CaptureStdout();
    EXPECT_NE(h264_parse_sps(high.data(), static_cast<unsigned>(high.size()), 1, &sps), 48u);
    ::testing::internal::GetCapturedStdout();
}

TEST(SpsParserTest, EmulationPreventionIsRemovedBeforeReading) {
    const Bytes data = {0xAA, 0x00, 0x00, 0x03, 0x01, 0x55, 0x66, 0x77};
    // Reproduce the copy the parser reads: the bytes after profile/flags/level.
    h264_sps_t sps;
    h264_parse_sps(data.data(), static_cast<unsigned>(data.size()), 1, &sps);
    EXPECT_EQ(sps.profile_idc, 0xAAu);
    EXPECT_EQ(sps.constraint_flags, 0x00u);
    EXPECT_EQ(sps.level_idc, 0x00u);
    // 01 follows directly: ue(v) of 0000 0001 0101 0101 ... = 2^7 - 1 + 0b0101010 = 169.
    EXPECT_EQ(sps.seq_parameter_set_id, 169u);
}

TEST(SpsParserTest, TruncatedInputReadsZerosAndStaysInBounds) {
    Bytes full = FromBase64("Z0JAHqbAoD2hAAADAAEAAAMAKA8QIuA=");
    for (size_t n = 0; n <= full.size(); ++n) {
        Bytes prefix(full.begin(), full.begin() + n);  // exact size: ASan sees any overread
        h264_sps_t sps;
        ::testing::internal::CaptureStdout();
        h264_parse_sps(prefix.empty() ? nullptr : prefix.data(), static_cast<unsigned>(n), 1, &sps);
        ::testing::internal::GetCapturedStdout();
    }
    // Counts that would loop for ever on missing data stop at the standard's limits.
    BitWriter w;
    w.Put(66, 8);
    w.Put(0, 16);
    w.Ue(0);
    w.Ue(0);
    w.Ue(1);  // pic_order_cnt_type 1
    w.Put(0, 1);
    w.Ue(0);
    w.Ue(0);
    w.Ue(4000000000u);  // offset cycle
    h264_sps_t sps;
    ::testing::internal::CaptureStdout();
    h264_parse_sps(w.bytes.data(), static_cast<unsigned>(w.bytes.size()), 1, &sps);
    ::testing::internal::GetCapturedStdout();
    EXPECT_EQ(sps.num_ref_frames_in_pic_order_cnt_cycle, 4000000000u);
}

TEST(Base64Test, Rfc4648Vectors) {
    const std::pair<std::string, std::string> cases[] = {{"", ""},
                                                         {"f", "Zg=="},
                                                         {"fo", "Zm8="},
                                                         {"foo", "Zm9v"},
                                                         {"foob", "Zm9vYg=="},
                                                         {"fooba", "Zm9vYmE="},
                                                         {"foobar", "Zm9vYmFy"}};
    for (const auto& c : cases) {
        std::string out = "junk";
        Base64Encode(reinterpret_cast<const unsigned char*>(c.first.data()),
                     static_cast<unsigned>(c.first.size()), out);
        EXPECT_EQ(out, c.second);
    }
}

}  // namespace
