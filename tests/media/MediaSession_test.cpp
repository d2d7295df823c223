#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <sys/socket.h>

#include <string>
#include <vector>

#include "capture/LivecameraResolution.h"
#include "media/MediaSession.h"
#include "media/MediaSessionList.h"
#include "media/MediaStreamH264.h"
#include "media/MediaStreamMP4A.h"
#include "platform/fake/FakePlatform.h"
#include "service/GlobalConfig.h"

namespace {

class MediaModelTest : public ::testing::Test {
protected:
    MediaModelTest() {
        Global_Config::CloseInstance();
        Global_Config::instance()->m_video_rtp_frequency = 90000;
    }
    ~MediaModelTest() override { Global_Config::CloseInstance(); }

    // The presentation the server builds: video first, then audio.
    static MediaSession* Skyvo() {
        auto* s = new MediaSession("skyvo");
        s->AddMediaStream(new MediaStreamH264("h264"));
        s->AddMediaStream(new MediaStreamMP4A("aac", -1));
        return s;
    }

    platform::fake::FakePlatform fake;
};

TEST_F(MediaModelTest, NamesAreUniqueAndLookupsExact) {
    MediaSessionList list;
    ASSERT_TRUE(list.AddMediaSession(Skyvo()));
    MediaSession* again = Skyvo();
    EXPECT_FALSE(list.AddMediaSession(again));
    delete again;
    EXPECT_FALSE(list.AddMediaSession(nullptr));
    MediaSession* s = list.FindMediaSession("skyvo");
    ASSERT_NE(s, nullptr);
    EXPECT_EQ(list.FindMediaSession("sky"), nullptr);
    EXPECT_EQ(list.FindMediaSession("skyvo2"), nullptr);
    EXPECT_EQ(list.FindMediaSession(nullptr), nullptr);

    auto* dup = new MediaStreamH264("h264");
    EXPECT_FALSE(s->AddMediaStream(dup));
    delete dup;
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
           "a=fmtp:96 profile-level-id=42401E; sprop-parameter-sets=" + sps +
           ",aMpDiA==; packetization-mode=1;\r\n" + (control ? "a=control:trackID=1\r\n" : "");
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
        {96000, 0}, {95000, 0}, {94999, 1}, {87200, 1}, {87199, 2}, {63000, 2}, {62999, 3},
        {47000, 3}, {46999, 4}, {43100, 4}, {43099, 5}, {31000, 5}, {30999, 6}, {23000, 6},
        {22999, 7}, {21050, 7}, {21049, 8}, {15000, 8}, {14999, 9}, {11000, 9}, {10999, 10},
        {10025, 10}, {10024, 11}, {7000, 11}, {6999, 12}, {-1000, 12}, {-1001, 15}};
    for (const auto& c : cases) EXPECT_EQ(MediaStreamMP4A::FrequencyIndex(c.first), c.second) << c.first;
}

// The track's own packetisers, into a loopback receiver.
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
    std::vector<std::vector<unsigned char>> Packets(size_t n) {
        std::vector<std::vector<unsigned char>> out;
        for (size_t i = 0; i < n; ++i) {
            std::vector<unsigned char> b(2000);
            ssize_t got = recv(receiver, b.data(), b.size(), 0);
            if (got < 0) break;
            b.resize(static_cast<size_t>(got));
            out.push_back(b);
        }
        return out;
    }
    int receiver = -1;
    unsigned port = 0;
};

TEST_F(TrackPacketiserTest, H264SingleUnitsAndFuAFragments) {
    MediaStreamH264 video("h264");
    video.Init(1000000, 100);
    ASSERT_TRUE(video.TransportSetup("127.0.0.1", 0, "127.0.0.1", port));
    std::vector<unsigned char> frame = {0, 0, 0, 1, 0x67, 1, 2, 3, 4};   // SPS: skipped
    std::vector<unsigned char> small = {0, 0, 1, 0x41, 9, 9, 9, 9};       // 5 bytes after the code
    std::vector<unsigned char> big(3 + 1 + 170, 0x33);                    // 171-byte unit
    big[0] = 0; big[1] = 0; big[2] = 1; big[3] = 0x65;
    frame.insert(frame.end(), small.begin(), small.end());
    frame.push_back(0);  // 0 0 0 1: the unit ends before this zero
    frame.insert(frame.end(), big.begin(), big.end());
    EXPECT_EQ(video.TransportData(frame.data(), static_cast<unsigned>(frame.size()), 7), 0);  // not playing
    ASSERT_TRUE(video.TransportStart());
    int sent = video.TransportData(frame.data(), static_cast<unsigned>(frame.size()), 7);
    auto packets = Packets(4);
    ASSERT_EQ(packets.size(), 3u);
    EXPECT_EQ(packets[0].size(), 12u + 5);
    EXPECT_EQ(packets[0][1] & 0x80, 0);       // not the last unit: no marker
    EXPECT_EQ(packets[0][12], 0x41);
    EXPECT_EQ(packets[1].size(), 100u);       // 12 + 2 + 86
    EXPECT_EQ(packets[1][12], 0x60 | 28);     // NRI kept, FU-A
    EXPECT_EQ(packets[1][13], 0x80 | 5);      // start bit
    EXPECT_EQ(packets[2].size(), 12u + 2 + 84);
    EXPECT_EQ(packets[2][13], 0x40 | 5);      // end bit
    EXPECT_EQ(packets[2][1] & 0x80, 0x80);    // marker on the last fragment of the last unit
    EXPECT_EQ(sent, 5 + 88 + 86);
}

TEST_F(TrackPacketiserTest, AacFramesGetOneAuHeaderSection) {
    MediaStreamMP4A audio("aac", -1);
    audio.Init(128000, 100);
    ASSERT_TRUE(audio.TransportSetup("127.0.0.1", 0, "127.0.0.1", port));
    ASSERT_TRUE(audio.TransportStart());
    // ADTS, no CRC, frame length 7 + 100.
    std::vector<unsigned char> frame = {0xFF, 0xF1, 0x4C, 0x80, 0x0D, 0x7F, 0xFC};
    frame.resize(107, 0x21);
    audio.TransportData(frame.data(), static_cast<unsigned>(frame.size()), 0);
    auto packets = Packets(3);
    ASSERT_EQ(packets.size(), 2u);
    EXPECT_EQ(packets[0].size(), 100u);  // 12 + 4 + 84
    EXPECT_EQ(std::vector<unsigned char>(packets[0].begin() + 12, packets[0].begin() + 16),
              (std::vector<unsigned char>{0x00, 0x10, 100 >> 5, (100 << 3) & 0xFF}));
    EXPECT_EQ(packets[1].size(), 12u + 4 + 16);
    EXPECT_EQ(packets[1][1] & 0x80, 0x80);
}

}  // namespace
