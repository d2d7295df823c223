#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <sys/socket.h>

#include <memory>
#include <string>
#include <vector>

#include "config/GlobalConfig.h"
#include "config/LivecameraResolution.h"
#include "media/MediaSession.h"
#include "media/MediaSessionList.h"
#include "media/MediaStreamH264.h"
#include "media/MediaStreamMP4A.h"
#include "platform/fake/FakePlatform.h"

namespace {

class MediaModelTest : public ::testing::Test {
protected:
    MediaModelTest() {
        Global_Config::CloseInstance();
        Global_Config::instance()->m_video_rtp_frequency = 90000;
    }
    ~MediaModelTest() override { Global_Config::CloseInstance(); }

    // The presentation the server builds: video first, then audio.
    static std::unique_ptr<MediaSession> Skyvo() {
        auto s = std::make_unique<MediaSession>("skyvo");
        s->AddMediaStream(std::make_unique<MediaStreamH264>("h264"));
        s->AddMediaStream(std::make_unique<MediaStreamMP4A>("aac", -1));
        return s;
    }

    platform::fake::FakePlatform fake;
};

TEST_F(MediaModelTest, NamesAreUniqueAndLookupsExact) {
    MediaSessionList list;
    ASSERT_TRUE(list.AddMediaSession(Skyvo()));
    EXPECT_FALSE(list.AddMediaSession(Skyvo()));
    EXPECT_FALSE(list.AddMediaSession(nullptr));
    MediaSession* s = list.FindMediaSession("skyvo");
    ASSERT_NE(s, nullptr);
    EXPECT_EQ(list.FindMediaSession("sky"), nullptr);
    EXPECT_EQ(list.FindMediaSession("skyvo2"), nullptr);
    EXPECT_EQ(list.FindMediaSession(nullptr), nullptr);

    EXPECT_FALSE(s->AddMediaStream(std::make_unique<MediaStreamH264>("h264")));
    EXPECT_EQ(s->GetMediaStreamCount(), 2);
    EXPECT_EQ(s->GetMediaStream(0)->GetType(), 201);
    EXPECT_EQ(s->GetMediaStream(1)->GetType(), 101);
    EXPECT_EQ(s->GetMediaStream(2), nullptr);
    EXPECT_EQ(s->FindMediaStream("aac"), s->GetMediaStream(1));
    EXPECT_EQ(s->FindMediaStream("aa"), nullptr);

    EXPECT_FALSE(list.RemoveMediaSession("sky"));
    EXPECT_TRUE(list.RemoveMediaSession("skyvo"));
    EXPECT_EQ(list.FindMediaSession("skyvo"), nullptr);
}

TEST_F(MediaModelTest, TransportNeedsInitAndSetupBeforeStart) {
    MediaStreamH264 video("h264");
    EXPECT_FALSE(video.TransportStart());
    EXPECT_FALSE(video.TransportSetup("127.0.0.1", 0, "127.0.0.1", 9));
    video.Init(1000000, 1412);
    ASSERT_TRUE(video.TransportSetup("127.0.0.1", 0, "127.0.0.1", 9));
    EXPECT_EQ(video.remote_port(), 9u);
    EXPECT_TRUE(video.TransportStart());
    EXPECT_TRUE(video.playing());
    EXPECT_TRUE(video.TransportTeardown());
    EXPECT_FALSE(video.playing());
    EXPECT_EQ(video.transport(), nullptr);
    EXPECT_GT(video.GetBandWidth(), 1200.0f);  // 1.2 x the bitrate plus header overhead
}

std::string H264Section(const std::string& sps, bool control) {
    return "m=video 0 RTP/AVP 96\r\n"
           "a=rtpmap:96 H264/90000\r\n"
           "a=fmtp:96 profile-level-id=42401E; sprop-parameter-sets=" +
           sps + ",aMpDiA==; packetization-mode=1;\r\n" +
           (control ? "a=control:trackID=1\r\n" : "");
}

TEST_F(MediaModelTest, SdpGoldenTextPerCaptureWidth) {
    const std::string audio =
        "m=audio 0 RTP/AVP 97\r\n"
        "a=rtpmap:97 MPEG4-GENERIC/48000/2\r\n"
        "a=fmtp:97 streamtype=5; profile-level-id=1; mode=AAC-hbr; config=1190; SizeLength=13; "
        "IndexLength=3; IndexDeltaLength=3;\r\n";
    struct Case {
        unsigned width, height;
        const char* sps;
    };
    const Case cases[] = {
        {640, 480, "Z0JAHqbAoD2hAAADAAEAAAMAKA8QIuA="},
        {480, 320, "Z0JAHqbB4KaEAAADAAQAAAMAoDxAi4A="},
        {1280, 720, "Z0JAHqbBQfoQAAADABAAAAMCgPECLg=="},
        {720, 576, "Z0JAHqbBQfoQAAADABAAAAMCgPECLg=="},
        {1920, 1080, "Z0JAHqbBQfoQAAADABAAAAMCgPECLg=="},
    };
    std::unique_ptr<MediaSession> skyvo(Skyvo());
    for (const Case& c : cases) {
        set_video_resolution_support_more(c.width, c.height, 5, 6, 0, 0, 0, 0, 30);
        for (int control : {1, 0}) {
            std::string expected = "v=0\r\ns=skyvo\r\nc=IN IP4 192.168.1.7\r\nt=0 0\r\n";
            if (control) expected += "a=control:*\r\n";
            expected += H264Section(c.sps, control) + audio;
            if (control) expected += "a=control:trackID=2\r\n";
            EXPECT_EQ(skyvo->GenerateMediaSdp("origin", "192.168.1.7", control), expected)
                << c.width << " control " << control;
        }
    }
    EXPECT_EQ(skyvo->GetMediaStream(0)->GetRtpPayloadType(), 96);
    EXPECT_EQ(skyvo->GetMediaStream(1)->GetRtpPayloadType(), 97);
}

TEST_F(MediaModelTest, AacConfigAndFrequencyIndexThresholds) {
    EXPECT_EQ(MediaStreamMP4A::ConfigString(48000, 2), "1190");
    EXPECT_EQ(MediaStreamMP4A::ConfigString(44100, 2), "1210");
    EXPECT_EQ(MediaStreamMP4A::ConfigString(48000, 1), "1188");
    EXPECT_EQ(MediaStreamMP4A::ConfigString(8000, 2), "1590");
    const std::pair<int, int> cases[] = {
        {96000, 0},  {95000, 0},  {94999, 1}, {87200, 1}, {87199, 2},  {63000, 2}, {62999, 3},
        {47000, 3},  {46999, 4},  {43100, 4}, {43099, 5}, {31000, 5},  {30999, 6}, {23000, 6},
        {22999, 7},  {21050, 7},  {21049, 8}, {15000, 8}, {14999, 9},  {11000, 9}, {10999, 10},
        {10025, 10}, {10024, 11}, {7000, 11}, {6999, 12}, {-1000, 12}, {-1001, 15}};
    for (const auto& c : cases)
        EXPECT_EQ(MediaStreamMP4A::FrequencyIndex(c.first), c.second) << c.first;
}

// The track's own packetisers, into a loopback receiver.
using Bytes = std::vector<unsigned char>;

// "80 e0 00 01" -> bytes.
Bytes Hex(const char* text) {
    Bytes out;
    for (const char* p = text; *p != '\0';) {
        if (*p == ' ') {
            ++p;
            continue;
        }
        out.push_back(static_cast<unsigned char>(std::stoul(std::string(p, 2), nullptr, 16)));
        p += 2;
    }
    return out;
}

class TrackPacketiserTest : public MediaModelTest {
protected:
    void SetUp() override {
        receiver = socket(AF_INET, SOCK_DGRAM, 0);
        sockaddr_in a{};
        a.sin_family = AF_INET;
        a.sin_addr.s_addr = inet_addr("127.0.0.1");
        ASSERT_EQ(bind(receiver, reinterpret_cast<sockaddr*>(&a), sizeof a), 0);
        socklen_t len = sizeof a;
        getsockname(receiver, reinterpret_cast<sockaddr*>(&a), &len);
        port = ntohs(a.sin_port);
        timeval tv{1, 0};
        setsockopt(receiver, SOL_SOCKET, SO_RCVTIMEO, &tv, sizeof tv);
    }
    void TearDown() override { close(receiver); }
    // Everything queued: loopback delivers within the sendto call.
    std::vector<Bytes> Drain() {
        std::vector<Bytes> out;
        for (;;) {
            Bytes b(2000);
            ssize_t got = recv(receiver, b.data(), b.size(), MSG_DONTWAIT);
            if (got < 0) break;
            b.resize(static_cast<size_t>(got));
            out.push_back(b);
        }
        return out;
    }
    // Sets the track up on a fresh transport (sequence 0) and plays it.
    void Play(MediaStream& track, unsigned packet_size, unsigned payload_type) {
        track.Init(1000000, packet_size);
        track.GenerateMediaSdp(payload_type, 0);
        ASSERT_TRUE(track.TransportSetup("127.0.0.1", 0, "127.0.0.1", port));
        ASSERT_TRUE(track.TransportStart());
    }
    struct Case {
        const char* what;
        const char* in;
        std::vector<const char*> out;  // whole packets
        int sent;                      // payload bytes reported
    };
    void Check(MediaStream& track, const Case& c) {
        Bytes in = Hex(c.in);
        EXPECT_EQ(track.TransportData(in.data(), static_cast<unsigned>(in.size()), 0x01020304),
                  c.sent)
            << c.what;
        std::vector<Bytes> expected;
        for (const char* p : c.out) expected.push_back(Hex(p));
        EXPECT_EQ(Drain(), expected) << c.what;
    }
    int receiver = -1;
    unsigned port = 0;
};

// Packets of 20 bytes: NAL units up to 8 bytes go whole, larger ones in FU-A pieces of 6.
TEST_F(TrackPacketiserTest, H264BytesOnTheWire) {
    const Case cases[] = {
        {"one unit, forbidden bit kept, marker on the last unit",
         "00 00 01 e5 01 02 03",
         {"80 e0 0000 01020304 00000000 e5 01 02 03"},
         4},
        {"SPS and PPS skipped; 4-byte codes end the unit before the extra zero",
         "00 00 00 01 67 aa bb 00 00 00 01 68 cc dd 00 00 00 01 41 01 02",
         {"80 e0 0000 01020304 00000000 41 01 02"},
         3},
        {"two units: marker on the second only",
         "00 00 01 41 0a 0b 00 00 01 41 0c 0d",
         {"80 60 0000 01020304 00000000 41 0a 0b", "80 e0 0001 01020304 00000000 41 0c 0d"},
         6},
        {"a unit under 5 bytes with its code is skipped; leading bytes ignored",
         "aa bb 00 00 01 41 00 00 01 41 0c",
         {"80 e0 0000 01020304 00000000 41 0c"},
         2},
        {"the largest single unit",
         "00 00 01 41 01 02 03 04 05 06 07",
         {"80 e0 0000 01020304 00000000 41 01 02 03 04 05 06 07"},
         8},
        {"one byte over: two fragments, the F bit kept in the indicator",
         "00 00 01 e5 01 02 03 04 05 06 07 08",
         {"80 60 0000 01020304 00000000 fc 85 01 02 03 04 05 06",
          "80 e0 0001 01020304 00000000 fc 45 07 08"},
         12},
        {"three fragments, the last short",
         "00 00 01 65 01 02 03 04 05 06 07 08 09 0a 0b 0c 0d",
         {"80 60 0000 01020304 00000000 7c 85 01 02 03 04 05 06",
          "80 60 0001 01020304 00000000 7c 05 07 08 09 0a 0b 0c",
          "80 e0 0002 01020304 00000000 7c 45 0d"},
         19},
        {"fragments of a unit that is not the last carry no marker",
         "00 00 01 41 01 02 03 04 05 06 07 08 00 00 01 41 0f",
         {"80 60 0000 01020304 00000000 5c 81 01 02 03 04 05 06",
          "80 60 0001 01020304 00000000 5c 41 07 08", "80 e0 0002 01020304 00000000 41 0f"},
         14},
        {"no start code", "01 02 03 04 05 06", {}, 0},
        {"too short", "00 00 01 41", {}, 0},
    };
    for (const Case& c : cases) {
        MediaStreamH264 video("h264");
        Play(video, 20, 96);
        Check(video, c);
    }
}

TEST_F(TrackPacketiserTest, H264PayloadTypeAndSequenceComeFromTheTrackAndTransport) {
    MediaStreamH264 video("h264");
    Bytes in = Hex("00 00 01 41 0a");
    // Not set up yet: nothing is sent.
    EXPECT_EQ(video.TransportData(in.data(), static_cast<unsigned>(in.size()), 7), 0);
    Play(video, 20, 200);  // not masked: its top bit lands on the marker bit
    ASSERT_EQ(video.TransportData(in.data(), static_cast<unsigned>(in.size()), 7), 2);
    ASSERT_EQ(video.TransportData(in.data(), static_cast<unsigned>(in.size()), -2), 2);
    EXPECT_EQ(Drain(), (std::vector<Bytes>{Hex("80 c8 0000 00000007 00000000 41 0a"),
                                           Hex("80 c8 0001 fffffffe 00000000 41 0a")}));
    video.TransportStop();
    EXPECT_EQ(video.TransportData(in.data(), static_cast<unsigned>(in.size()), 7), 0);
    EXPECT_TRUE(Drain().empty());
}

// Packets of 20 bytes: pieces of at most 4 bytes of the access unit after the AU headers.
TEST_F(TrackPacketiserTest, AacBytesOnTheWire) {
    const Case cases[] = {
        {"no CRC: 6 bytes in two pieces, the AU size whole in each",
         "ff f1 4c 80 01 bf fc 01 02 03 04 05 06",
         {"80 61 0000 01020304 00000000 0010 0030 01 02 03 04",
          "80 e1 0001 01020304 00000000 0010 0030 05 06"},
         14},
        {"CRC: two more header bytes skipped",
         "ff f0 4c 80 01 bf fc c1 c2 01 02 03 04",
         {"80 e1 0000 01020304 00000000 0010 0020 01 02 03 04"},
         8},
        {"the ADTS length beyond the data is cut to it",
         "ff f1 4c 80 02 1f fc 01 02 03",
         {"80 e1 0000 01020304 00000000 0010 0018 01 02 03"},
         7},
        {"bytes after the ADTS length are not sent",
         "ff f1 4c 80 01 1f fc 01 02 03",
         {"80 e1 0000 01020304 00000000 0010 0008 01"},
         5},
        {"header only", "ff f1 4c 80 00 ff fc", {}, 0},
        {"shorter than a header", "ff f1 4c 80 00 ff", {}, 0},
    };
    for (const Case& c : cases) {
        MediaStreamMP4A audio("aac", -1);
        Play(audio, 20, 97);
        Check(audio, c);
    }
}

}  // namespace
