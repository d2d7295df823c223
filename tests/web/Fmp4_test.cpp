#include "web/Fmp4.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <fstream>
#include <functional>
#include <iterator>
#include <map>
#include <sstream>
#include <string>
#include <vector>

#include "tests/web/HexBytes.h"
#include "tools/AccessUnitSplitter.h"

namespace {

using hexbytes::Bytes;
using hexbytes::Hex;
using hexbytes::Unhex;

uint32_t U32(const uint8_t* p) {
    return uint32_t(p[0]) << 24 | uint32_t(p[1]) << 16 | uint32_t(p[2]) << 8 | p[3];
}

// The first parameter sets of testsrc2_640x480_30fps_4s.h264 and of its 1280x720 sibling.
const Bytes kSps480 = Unhex("6742c01e d900a03d b0110000 03000100 0003003c 0f162e48");
const Bytes kSps720 = Unhex("6742c01f d9005005 bb011000 00030010 000003 03c0f183 2480");
const Bytes kPps = Unhex("68cb8cb2");

fmp4::VideoConfig Video(const Bytes& sps = kSps480, const Bytes& pps = kPps) {
    return {sps.data(), sps.size(), pps.data(), pps.size(), 640, 480};
}
const fmp4::AudioConfig kAudio{{0x11, 0x90}, 48000, 2};

Bytes Init(const fmp4::VideoConfig* v, const fmp4::AudioConfig* a) {
    Bytes out(4096);
    out.resize(fmp4::WriteInitSegment(v, a, out.data(), out.size()));
    return out;
}

// The box called `type` (size and header included), wherever it is nested.
Bytes FindBox(const Bytes& data, const char* type) {
    for (size_t i = 4; i + 4 <= data.size(); ++i) {
        if (memcmp(&data[i], type, 4) == 0) {
            return Bytes(data.begin() + i - 4, data.begin() + i - 4 + U32(&data[i - 4]));
        }
    }
    return {};
}

// "path size" for each box, descending into the containers, in file order.
void Walk(const uint8_t* p, size_t len, const std::string& parent, std::vector<std::string>* out) {
    static const std::string kContainers = "moov trak mdia minf dinf stbl mvex";
    for (size_t at = 0; at + 8 <= len;) {
        uint32_t size = U32(p + at);
        std::string type(reinterpret_cast<const char*>(p + at + 4), 4);
        out->push_back(parent + type + " " + std::to_string(size));
        if (size < 8 || size > len - at) return;
        if (kContainers.find(type) != std::string::npos) {
            Walk(p + at + 8, size - 8, parent + type + "/", out);
        }
        at += size;
    }
}

TEST(Fmp4InitTest, BoxTreeOfVideoAndAudio) {
    fmp4::VideoConfig v = Video();
    Bytes init = Init(&v, &kAudio);
    std::vector<std::string> boxes;
    Walk(init.data(), init.size(), "", &boxes);
    const std::vector<std::string> expected = {"ftyp 32",
                                               "moov 1074",
                                               "moov/mvhd 108",
                                               "moov/trak 474",
                                               "moov/trak/tkhd 92",
                                               "moov/trak/mdia 374",
                                               "moov/trak/mdia/mdhd 32",
                                               "moov/trak/mdia/hdlr 45",
                                               "moov/trak/mdia/minf 289",
                                               "moov/trak/mdia/minf/vmhd 20",
                                               "moov/trak/mdia/minf/dinf 36",
                                               "moov/trak/mdia/minf/dinf/dref 28",
                                               "moov/trak/mdia/minf/stbl 225",
                                               "moov/trak/mdia/minf/stbl/stsd 149",
                                               "moov/trak/mdia/minf/stbl/stts 16",
                                               "moov/trak/mdia/minf/stbl/stsc 16",
                                               "moov/trak/mdia/minf/stbl/stco 16",
                                               "moov/trak/mdia/minf/stbl/stsz 20",
                                               "moov/trak 412",
                                               "moov/trak/tkhd 92",
                                               "moov/trak/mdia 312",
                                               "moov/trak/mdia/mdhd 32",
                                               "moov/trak/mdia/hdlr 45",
                                               "moov/trak/mdia/minf 227",
                                               "moov/trak/mdia/minf/smhd 16",
                                               "moov/trak/mdia/minf/dinf 36",
                                               "moov/trak/mdia/minf/dinf/dref 28",
                                               "moov/trak/mdia/minf/stbl 167",
                                               "moov/trak/mdia/minf/stbl/stsd 91",
                                               "moov/trak/mdia/minf/stbl/stts 16",
                                               "moov/trak/mdia/minf/stbl/stsc 16",
                                               "moov/trak/mdia/minf/stbl/stco 16",
                                               "moov/trak/mdia/minf/stbl/stsz 20",
                                               "moov/mvex 72",
                                               "moov/mvex/trex 32",
                                               "moov/mvex/trex 32"};
    EXPECT_EQ(boxes, expected);
    EXPECT_EQ(init.size(), 32u + 1074u);
}

TEST(Fmp4InitTest, DecoderConfigurationBytes) {
    fmp4::VideoConfig v = Video();
    Bytes init = Init(&v, &kAudio);
    EXPECT_EQ(Hex(FindBox(init, "avcC")), Hex(Unhex("0000002f 61766343 01 42c01e ff e1 0018" +
                                                    Hex(kSps480) + "01 0004 " + Hex(kPps))));
    EXPECT_EQ(Hex(FindBox(init, "esds")),
              Hex(Unhex("00000027 65736473 00000000 03 19 0000 00"
                        " 04 11 40 15 000000 00000000 00000000 05 02 1190 06 01 02")));
    // The track's sizes and timescales, where players look for them.
    Bytes tkhd = FindBox(init, "tkhd");
    EXPECT_EQ(Hex(Bytes(tkhd.end() - 8, tkhd.end())), "0280000001e00000");
    Bytes mdhd = FindBox(init, "mdhd");
    EXPECT_EQ(U32(&mdhd[20]), fmp4::kVideoTimescale);
    fmp4::AudioConfig a = kAudio;
    a.sample_rate = 44100;
    a.channels = 1;
    Bytes audio_only = Init(nullptr, &a);
    EXPECT_EQ(Hex(FindBox(audio_only, "mdhd")).substr(40, 8), "0000ac44");
    // channels, sample size, two reserved, rate as 16.16
    EXPECT_EQ(Hex(FindBox(audio_only, "mp4a")).substr(48, 24), "0001001000000000ac440000");
    EXPECT_TRUE(FindBox(audio_only, "avc1").empty());
}

TEST(Fmp4FragmentTest, HeaderBytes) {
    struct Case {
        uint32_t sequence, track;
        uint64_t decode_time;
        uint32_t duration, size;
        bool key;
        const char* hex;
    } cases[] = {
        {1, fmp4::kVideoTrack, 0x123456789, 3000, 0x1234, true,
         "00000064 6d6f6f66 00000010 6d666864 00000000 00000001"
         " 0000004c 74726166 00000010 74666864 00020000 00000001"
         " 00000014 74666474 01000000 00000001 23456789"
         " 00000020 7472756e 00000701 00000001 0000006c 00000bb8 00001234 02000000"
         " 0000123c 6d646174"},
        {7, fmp4::kAudioTrack, 1024, 1024, 0, false,
         "00000064 6d6f6f66 00000010 6d666864 00000000 00000007"
         " 0000004c 74726166 00000010 74666864 00020000 00000002"
         " 00000014 74666474 01000000 00000000 00000400"
         " 00000020 7472756e 00000701 00000001 0000006c 00000400 00000000 01010000"
         " 00000008 6d646174"},
    };
    for (const Case& c : cases) {
        Bytes out(fmp4::kFragmentHeaderSize);
        ASSERT_EQ(fmp4::WriteFragmentHeader(c.sequence, c.track, c.decode_time, c.duration, c.size,
                                            c.key, out.data(), out.size()),
                  fmp4::kFragmentHeaderSize);
        EXPECT_EQ(Hex(out), Hex(Unhex(c.hex))) << "sequence " << c.sequence;
    }
    uint8_t out[fmp4::kFragmentHeaderSize];
    EXPECT_EQ(fmp4::WriteFragmentHeader(1, 0, 0, 1, 1, true, out, sizeof out), 0u) << "track 0";
    EXPECT_EQ(fmp4::WriteFragmentHeader(1, 1, 0, 1, 0xfffffff8, true, out, sizeof out), 0u);
    EXPECT_EQ(fmp4::WriteFragmentHeader(1, 1, 0, 1, 0xfffffff7, true, out, sizeof out),
              fmp4::kFragmentHeaderSize);
}

// Every cap short of the full size: 0 back and not a byte touched at or past the cap.
TEST(Fmp4RefusalTest, EveryShortCap) {
    fmp4::VideoConfig v = Video();
    struct Case {
        const char* name;
        std::function<size_t(uint8_t*, size_t)> write;
    } cases[] = {
        {"video+audio", [&](uint8_t* o, size_t c) { return WriteInitSegment(&v, &kAudio, o, c); }},
        {"video", [&](uint8_t* o, size_t c) { return WriteInitSegment(&v, nullptr, o, c); }},
        {"audio", [&](uint8_t* o, size_t c) { return WriteInitSegment(nullptr, &kAudio, o, c); }},
        {"fragment",
         [](uint8_t* o, size_t c) { return fmp4::WriteFragmentHeader(3, 1, 9, 9, 9, 1, o, c); }},
        {"avcc", [](uint8_t* o, size_t c) {
             Bytes in = Unhex("000001 6588 00000001 41");
             return fmp4::AnnexBToAvcc(in.data(), in.size(), o, c);
         }}};
    for (const Case& c : cases) {
        Bytes full(4096);
        size_t size = c.write(full.data(), full.size());
        ASSERT_GT(size, 0u) << c.name;
        for (size_t cap = 0; cap < size; ++cap) {
            Bytes out(size + 16, 0xa5);
            ASSERT_EQ(c.write(out.data(), cap), 0u) << c.name << " cap " << cap;
            for (size_t i = cap; i < out.size(); ++i) {
                ASSERT_EQ(out[i], 0xa5) << c.name << " cap " << cap << " wrote at " << i;
            }
        }
        Bytes exact(size);
        EXPECT_EQ(c.write(exact.data(), size), size) << c.name;
    }
}

TEST(Fmp4RefusalTest, BadConfigs) {
    Bytes big_sps(65536, 0), big_pps(65536, 0);
    big_sps[0] = 0x67;
    big_pps[0] = 0x68;
    struct Case {
        const char* name;
        fmp4::VideoConfig video;
        fmp4::AudioConfig audio;
        bool ok;
    } cases[] = {
        {"both good", Video(), kAudio, true},
        {"SPS of 3 bytes", {kSps480.data(), 3, kPps.data(), 4, 640, 480}, kAudio, false},
        {"SPS null", {nullptr, 24, kPps.data(), 4, 640, 480}, kAudio, false},
        {"SPS not type 7", Video(kPps, kPps), kAudio, false},
        {"SPS of 65535", {big_sps.data(), 65535, kPps.data(), 4, 640, 480}, kAudio, true},
        {"SPS of 65536", {big_sps.data(), 65536, kPps.data(), 4, 640, 480}, kAudio, false},
        {"PPS empty", {kSps480.data(), 24, kPps.data(), 0, 640, 480}, kAudio, false},
        {"PPS not type 8", Video(kSps480, kSps480), kAudio, false},
        {"PPS of 65535", {kSps480.data(), 24, big_pps.data(), 65535, 640, 480}, kAudio, true},
        {"PPS of 65536", {kSps480.data(), 24, big_pps.data(), 65536, 640, 480}, kAudio, false},
        {"width 0", {kSps480.data(), 24, kPps.data(), 4, 0, 480}, kAudio, false},
        {"height 0", {kSps480.data(), 24, kPps.data(), 4, 640, 0}, kAudio, false},
        {"channels 0", Video(), {{0x11, 0x90}, 48000, 0}, false},
        {"rate 0", Video(), {{0x11, 0x90}, 0, 2}, false},
        {"rate 65535", Video(), {{0x11, 0x90}, 65535, 2}, true},
        {"rate 65536", Video(), {{0x11, 0x90}, 65536, 2}, false},
        {"object type 0", Video(), {{0x01, 0x90}, 48000, 2}, false},
    };
    for (const Case& c : cases) {
        Bytes out(140000);
        size_t n = fmp4::WriteInitSegment(&c.video, &c.audio, out.data(), out.size());
        EXPECT_EQ(n > 0, c.ok) << c.name;
    }
    Bytes out(4096);
    EXPECT_EQ(fmp4::WriteInitSegment(nullptr, nullptr, out.data(), out.size()), 0u);
}

TEST(Fmp4CodecStringTest, FromSpsAndAsc) {
    const struct {
        Bytes sps;
        const char* codec;
    } video[] = {
        {kSps480, "avc1.42c01e"},
        {kSps720, "avc1.42c01f"},
        {Unhex("67640028"), "avc1.640028"},     // High 4.0
        {Unhex("27 4d 40 1f"), "avc1.4d401f"},  // nal_ref_idc 1
        {Unhex("67 ab cd ef"), "avc1.abcdef"},
        {Unhex("6742c0"), ""},
        {kPps, ""},
    };
    for (const auto& c : video) {
        fmp4::VideoConfig v = Video(c.sps);
        EXPECT_EQ(fmp4::AvcCodecString(v), c.codec) << Hex(c.sps);
    }
    const struct {
        uint8_t asc[2];
        const char* codec;
    } audio[] = {
        {{0x11, 0x90}, "mp4a.40.2"},   // LC 48 kHz stereo
        {{0x12, 0x10}, "mp4a.40.2"},   // LC 44.1 kHz stereo
        {{0x2b, 0x92}, "mp4a.40.5"},   // HE
        {{0xeb, 0x10}, "mp4a.40.29"},  // HE with parametric stereo
        {{0xf9, 0x40}, "mp4a.40.42"},  // escaped: 32 + 10
        {{0x07, 0x90}, ""},
    };
    for (const auto& c : audio) {
        fmp4::AudioConfig a{{c.asc[0], c.asc[1]}, 48000, 2};
        EXPECT_EQ(fmp4::AacCodecString(a), c.codec) << int(c.asc[0]);
    }
}

TEST(Fmp4AvccTest, AnnexBToLengthPrefixed) {
    const struct {
        const char* in;
        const char* out;
    } cases[] = {
        {"00000001 6588 00000001 4101", "00000002 6588 00000002 4101"},
        {"000001 67aa 000001 68bb", "00000002 67aa 00000002 68bb"},
        {"ff 000001 0980 0000 000001 6501", "00000002 0980 00000002 6501"},  // junk, zeros
        {"00000001 00000001 000001 6501 00", "00000002 6501"},               // empty units
        {"6501", ""},
        {"", ""},
    };
    for (const auto& c : cases) {
        Bytes in = Unhex(c.in), out(64);
        out.resize(fmp4::AnnexBToAvcc(in.data(), in.size(), out.data(), out.size()));
        EXPECT_EQ(Hex(out), Hex(Unhex(c.out))) << c.in;
    }
}

Bytes ReadFile(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    return Bytes(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
}

std::string Output(const std::string& cmd) {
    std::string out;
    if (FILE* p = popen(cmd.c_str(), "r")) {
        char buf[512];
        while (fgets(buf, sizeof buf, p) != nullptr) out += buf;
        pclose(p);
    }
    return out;
}

// The sample streams as a browser would get them, one fragment per frame, read back by FFmpeg.
TEST(Fmp4FfprobeTest, SampleStreamsPlayBack) {
    if (system("command -v ffprobe >/dev/null 2>&1") != 0) GTEST_SKIP() << "no ffprobe";
    const std::string media = ORVEX_SHARED_MEDIA;
    Bytes h264 = ReadFile(media + "/testsrc2_640x480_30fps_4s.h264");
    Bytes adts = ReadFile(media + "/sine1k_48k_stereo_4s.aac");
    if (h264.empty() || adts.empty()) GTEST_SKIP() << "no sample media in " << media;

    std::vector<Bytes> video;
    for (const Bytes& unit : tools::SplitAccessUnits(h264.data(), h264.size())) {
        Bytes avcc(unit.size() + 64);
        avcc.resize(fmp4::AnnexBToAvcc(unit.data(), unit.size(), avcc.data(), avcc.size()));
        ASSERT_FALSE(avcc.empty());
        video.push_back(avcc);
    }
    std::vector<Bytes> audio;
    fmp4::AudioConfig a{};
    for (size_t at = 0; at + 7 <= adts.size();) {
        const uint8_t* h = &adts[at];
        ASSERT_EQ(h[0] << 4 | h[1] >> 4, 0xfff) << "ADTS sync at " << at;
        size_t length = (h[3] & 3) << 11 | h[4] << 3 | h[5] >> 5;
        ASSERT_TRUE(length > 7 && at + length <= adts.size());
        unsigned type = (h[2] >> 6) + 1, rate_index = (h[2] >> 2) & 15;
        unsigned channels = (h[2] & 1) << 2 | h[3] >> 6;
        a = {{uint8_t(type << 3 | rate_index >> 1), uint8_t((rate_index & 1) << 7 | channels << 3)},
             48000,
             uint8_t(channels)};
        audio.emplace_back(adts.begin() + at + 7, adts.begin() + at + length);
        at += length;
    }
    ASSERT_EQ(video.size(), 120u);
    ASSERT_EQ(a.asc[0], 0x11);
    ASSERT_EQ(a.asc[1], 0x90);

    fmp4::VideoConfig v = Video();
    std::string path = ::testing::TempDir() + "orvex_fmp4_" + std::to_string(getpid()) + ".mp4";
    {
        std::ofstream out(path, std::ios::binary | std::ios::trunc);
        Bytes init = Init(&v, &a);
        out.write(reinterpret_cast<const char*>(init.data()), init.size());
        uint32_t sequence = 1;
        size_t n = 0, m = 0;
        while (n < video.size() || m < audio.size()) {
            // Video frame n is at n/30 s, audio frame m at m*1024/48000 s.
            bool pick_video =
                m == audio.size() ||
                (n < video.size() && uint64_t(n) * 3000 * 48000 <= uint64_t(m) * 1024 * 90000);
            const Bytes& sample = pick_video ? video[n] : audio[m];
            bool key = !pick_video || (sample.size() > 4 && (sample[4] & 0x1f) == 7);
            uint8_t header[fmp4::kFragmentHeaderSize];
            ASSERT_EQ(fmp4::WriteFragmentHeader(
                          sequence++, pick_video ? fmp4::kVideoTrack : fmp4::kAudioTrack,
                          pick_video ? n * 3000 : m * 1024, pick_video ? 3000 : 1024,
                          uint32_t(sample.size()), key, header, sizeof header),
                      sizeof header);
            out.write(reinterpret_cast<const char*>(header), sizeof header);
            out.write(reinterpret_cast<const char*>(sample.data()), sample.size());
            ++(pick_video ? n : m);
        }
    }
    std::string streams = Output(
        "ffprobe -v error -count_frames -show_entries "
        "stream=codec_name,width,height,nb_read_frames,avg_frame_rate,sample_rate,channels "
        "-of csv '" +
        path + "' 2>&1");
    std::string decode = Output("ffmpeg -v error -i '" + path + "' -f null - 2>&1");
    std::string packets = Output(
        "ffprobe -v error -show_entries packet=stream_index,pts_time -of csv '" + path + "' 2>&1");
    unlink(path.c_str());

    EXPECT_EQ(streams, "stream,h264,640,480,30/1,120\nstream,aac,48000,2,0/0," +
                           std::to_string(audio.size()) + "\n");
    EXPECT_TRUE(decode.empty()) << "ffmpeg reports errors: " << decode.substr(0, 1000);
    std::map<int, double> last{{0, -1}, {1, -1}};
    std::map<int, size_t> count;
    std::istringstream lines(packets);
    for (std::string line; std::getline(lines, line);) {
        int stream = -1;
        double pts = 0;
        ASSERT_EQ(sscanf(line.c_str(), "packet,%d,%lf", &stream, &pts), 2) << line;
        ASSERT_TRUE(stream == 0 || stream == 1) << line;
        EXPECT_GT(pts, last[stream]) << line;
        last[stream] = pts;
        ++count[stream];
    }
    EXPECT_EQ(count[0], video.size());
    EXPECT_EQ(count[1], audio.size());
}

}  // namespace
