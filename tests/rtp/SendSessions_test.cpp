#include <gtest/gtest.h>

#include <chrono>
#include <string>
#include <thread>
#include <vector>

#include "config/GlobalConfig.h"
#include "platform/fake/FakePlatform.h"
#include "rtp/SendH264Rtp.h"
#include "rtp/SendMP3Rtp.h"
#include "tests/rtp/UdpReceiver.h"

namespace {

using Bytes = std::vector<unsigned char>;

void* Key(int n) { return reinterpret_cast<void*>(static_cast<uintptr_t>(n)); }
int Seq(const Bytes& p) { return (p[2] << 8) | p[3]; }
uint32_t Ts(const Bytes& p) {
    return (uint32_t{p[4]} << 24) | (uint32_t{p[5]} << 16) | (uint32_t{p[6]} << 8) | p[7];
}

Bytes NalItem(unsigned nal_size, unsigned char header) {
    Bytes b = {0, 0, 0, 1, header};
    b.resize(4 + nal_size, 0x42);
    return b;
}

// ADTS frame (no CRC) of `size` bytes.
Bytes AdtsFrame(unsigned size) {
    Bytes b(size, 0x21);
    b[0] = 0xFF;
    b[1] = 0xF1;
    return b;
}

// Every case runs with both ways of waiting for items, and with the audio sender driven by its
// producer instead of a thread of its own: the packets must not differ.
class SendSessionTest : public ::testing::TestWithParam<const char*> {
protected:
    SendSessionTest() {
        Global_Config::CloseInstance();
        config = Global_Config::instance();
        driven = std::string(GetParam()) == "inline";
        fake.properties.Set("kv.orvex.wake", driven ? "event" : GetParam());
        if (driven) fake.properties.Set("kv.orvex.aacenc", "inline");
        config->Apply(config::ReadSettings(fake.properties));
        config->m_video_rtp_frequency = 90000;
        config->m_audio_rtp_frequency = 48000;
        config->m_audio_rtp_port = 0;  // any port: tests may run side by side
        config->mp3_config_ok();
        config->h264_config_frequency_ok();
        video = H264RtpTransportSession::instance();
        audio = MP3RtpTransportSession::instance();
        video->SetInputRing(&video_ring);
        audio->SetInputRing(&audio_ring);
    }
    ~SendSessionTest() override {
        H264RtpTransportSession::CloseInstance();
        MP3RtpTransportSession::CloseInstance();
        Global_Config::CloseInstance();
    }
    // As the producer writes: driven, it sends what it wrote itself.
    void Feed(cycle_buffer& ring, const Bytes& item, unsigned ms) {
        ASSERT_TRUE(ring.newwrite(item.data(), static_cast<int>(item.size()), ms, false));
        if (driven && &ring == &audio_ring) audio->Pump();
    }
    static void WaitEmpty(cycle_buffer& ring) {
        for (int i = 0; i < 2000 && ring.used_space() > 0; ++i) {
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
        }
    }

    platform::fake::FakePlatform fake;
    bool driven = false;
    Global_Config* config;
    cycle_buffer video_ring{8000000};
    cycle_buffer audio_ring{500000};
    H264RtpTransportSession* video;
    MP3RtpTransportSession* audio;
};

TEST_P(SendSessionTest, VideoPacketsReachEveryDestinationWithItemTimestamps) {
    UdpReceiver a, b;
    config->set_timestamp(1000000, false);  // audio far ahead: no pacing here
    video->add_dest_socket_info(Key(1), a.port(), "127.0.0.1");
    video->add_dest_socket_info(Key(2), b.port(), "127.0.0.1");
    ASSERT_EQ(video->StartSendThread(), 0);
    Feed(video_ring, NalItem(1400, 0x65), 1000);
    Feed(video_ring, NalItem(1401, 0x41), 1000);
    Feed(video_ring, NalItem(2800, 0x41), 1033);
    const std::vector<unsigned> sizes = {1412, 1414, 14, 1414, 1413};
    const std::vector<uint32_t> stamps = {90000, 90000, 90000, 92970, 92970};
    for (UdpReceiver* r : {&a, &b}) {
        for (size_t i = 0; i < sizes.size(); ++i) {
            Bytes p = r->Receive();
            ASSERT_EQ(p.size(), sizes[i]) << "packet " << i;
            EXPECT_EQ(p[1] & 0x7F, 96);
            EXPECT_EQ(Seq(p), static_cast<int>(i));
            EXPECT_EQ(Ts(p), stamps[i]);
            EXPECT_EQ(Bytes(p.begin() + 8, p.begin() + 12), (Bytes{0, 0, 0, 10}));
        }
    }
    EXPECT_EQ(config->get_timestamp(true), 1033u);
    EXPECT_EQ(config->current_signal_status(), 1);
}

// kv.orvex.join: a client starts at the next key picture ("key") or at once ("now", the
// default). With "key" that holds for a client that set up before the run began too: the items
// after a ring reset may start inside a picture.
TEST_P(SendSessionTest, ANewClientStartsAtTheNextKeyPictureWhenAsked) {
    const struct {
        const char* join;
        std::vector<unsigned> early;       // NAL unit sizes the client there at the start gets
        std::vector<unsigned> late_first;  // the first ones of a client that came after
    } cases[] = {
        // a picture's second slice, a P picture, then SPS, PPS, IDR and a P
        {"", {90, 100, 20, 10, 500, 200}, {100, 20, 10, 500}},
        {"now", {90, 100, 20, 10, 500, 200}, {100, 20, 10, 500}},
        {"key", {20, 10, 500, 200}, {20, 10, 500, 200}},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(std::string("kv.orvex.join=") + c.join);
        fake.properties.Set("kv.orvex.join", c.join);
        UdpReceiver early, late;
        config->set_timestamp(1000000, false);
        video->add_dest_socket_info(Key(1), early.port(), "127.0.0.1");
        ASSERT_EQ(video->StartSendThread(), 0);
        Feed(video_ring, NalItem(90, 0x41), 10);
        WaitEmpty(video_ring);  // taken before the late client comes
        video->add_dest_socket_info(Key(2), late.port(), "127.0.0.1");
        Feed(video_ring, NalItem(100, 0x41), 20);
        Feed(video_ring, NalItem(20, 0x67), 30);
        Feed(video_ring, NalItem(10, 0x68), 30);
        Feed(video_ring, NalItem(500, 0x65), 30);
        Feed(video_ring, NalItem(200, 0x41), 40);
        for (unsigned size : c.early) EXPECT_EQ(early.Receive().size(), size + 12);
        for (unsigned size : c.late_first) EXPECT_EQ(late.Receive().size(), size + 12);
        video->CloseSendThread();
        video->del_dest_socket_info(Key(1));
        video->del_dest_socket_info(Key(2));
    }
}

// A broadcast address without SO_BROADCAST fails every time, deterministically.
TEST_P(SendSessionTest, VideoStopsAPacketAtTheFirstFailingDestinationAudioGoesOn) {
    UdpReceiver ok;
    config->set_timestamp(1000000, false);
    video->add_dest_socket_info(Key(1), 9, "255.255.255.255");
    video->add_dest_socket_info(Key(2), ok.port(), "127.0.0.1");
    audio->add_dest_socket_info(Key(1), 9, "255.255.255.255");
    audio->add_dest_socket_info(Key(2), ok.port(), "127.0.0.1");
    ::testing::internal::CaptureStdout();
    ASSERT_EQ(video->StartSendThread(), 0);
    Feed(video_ring, NalItem(100, 0x41), 10);  // sequence 0: reaches nobody
    WaitEmpty(video_ring);
    video->del_dest_socket_info(Key(1));
    Feed(video_ring, NalItem(100, 0x41), 20);
    Bytes p = ok.Receive();
    ASSERT_EQ(p.size(), 112u);
    EXPECT_EQ(Seq(p), 1);

    ASSERT_EQ(audio->StartSendThread(), 0);
    Feed(audio_ring, AdtsFrame(200), 10);
    p = ok.Receive();
    ASSERT_EQ(p.size(), 209u);
    EXPECT_EQ(Bytes(p.begin(), p.begin() + 2), (Bytes{0x80, 0xE2}));
    EXPECT_EQ(Bytes(p.begin() + 12, p.begin() + 16), (Bytes{0x00, 0x10, 0x06, 0x08}));
    video->CloseSendThread();
    audio->CloseSendThread();
    std::string out = ::testing::internal::GetCapturedStdout();
    EXPECT_NE(out.find("\n\n  h264 frame send error ! \n \n"), std::string::npos);
    EXPECT_NE(out.find("\n\n  mp3 frame send error ! \n \n"), std::string::npos);
}

TEST_P(SendSessionTest, VideoHoldsWhile251MsAheadOfAudio) {
    UdpReceiver r;
    video->add_dest_socket_info(Key(1), r.port(), "127.0.0.1");
    ASSERT_EQ(video->StartSendThread(), 0);
    Feed(video_ring, NalItem(10, 0x41), 1000);
    Feed(video_ring, NalItem(10, 0x41), 2000);
    Feed(video_ring, NalItem(10, 0x41), 3000);
    EXPECT_EQ(Ts(r.Receive()), 90000u);
    EXPECT_EQ(Ts(r.Receive()), 180000u);
    EXPECT_TRUE(r.Receive(150).empty());  // 2000 ms ahead of audio at 0: the item waits
    EXPECT_GT(video_ring.used_space(), 0u);
    config->set_timestamp(1750, false);  // 250 ms behind: close enough
    EXPECT_EQ(Ts(r.Receive()), 270000u);
}

TEST_P(SendSessionTest, WithoutDestinationsItemsAreDiscardedAndTheGapCounts) {
    config->set_timestamp(1000000, false);
    ASSERT_EQ(video->StartSendThread(), 0);
    Feed(video_ring, NalItem(10, 0x41), 500);
    Feed(video_ring, NalItem(10, 0x41), 600);
    WaitEmpty(video_ring);
    UdpReceiver r;
    video->add_dest_socket_info(Key(1), r.port(), "127.0.0.1");
    Feed(video_ring, NalItem(10, 0x41), 700);
    Bytes p = r.Receive();
    EXPECT_EQ(Seq(p), 0);
    // The discarded items did not move the item time: 700 ms from 0, 90000 x 0.7 truncated.
    EXPECT_EQ(Ts(p), 62999u);
}

TEST_P(SendSessionTest, AudioDropsFramesWhilePausedOrNotReady) {
    UdpReceiver r;
    audio->add_dest_socket_info(Key(1), r.port(), "127.0.0.1");
    ASSERT_EQ(audio->StartSendThread(), 0);
    config->set_pause_stat(true);
    Feed(audio_ring, AdtsFrame(50), 100);
    WaitEmpty(audio_ring);
    config->set_pause_stat(false);
    Feed(audio_ring, AdtsFrame(60), 200);
    Bytes p = r.Receive();
    ASSERT_EQ(p.size(), 69u);  // the paused frame never went out
    EXPECT_EQ(Ts(p), 9600u);   // 200 ms at 48 kHz: the dropped frame did not count
    EXPECT_EQ(config->get_timestamp(false), 200u);
    EXPECT_EQ(Seq(p), 0);
}

TEST_P(SendSessionTest, AudioWaitsForBothClockRates) {
    Global_Config::CloseInstance();
    config = Global_Config::instance();
    config->Apply(config::ReadSettings(fake.properties));
    config->m_audio_rtp_frequency = 48000;
    config->mp3_config_ok();  // the video rate is still missing
    UdpReceiver r;
    audio->add_dest_socket_info(Key(1), r.port(), "127.0.0.1");
    ASSERT_EQ(audio->StartSendThread(), 0);
    Feed(audio_ring, AdtsFrame(70), 300);
    WaitEmpty(audio_ring);
    EXPECT_TRUE(r.Receive(100).empty());
}

// A broken item stream leaves bytes in the ring that no read takes: the loop must keep its
// pace (a line per 2 ms sleep) rather than look again at once.
TEST_P(SendSessionTest, BrokenItemStreamDoesNotSpinTheSender) {
    config->set_timestamp(1000000, false);
    unsigned char broken[18] = {0x80, 0x84, 0x1E, 0x00};  // a length of 2 000 000, then 10 bytes
    ASSERT_EQ(video_ring.write(broken, sizeof broken), 18);
    ::testing::internal::CaptureStdout();
    ASSERT_EQ(video->StartSendThread(), 0);
    std::this_thread::sleep_for(std::chrono::milliseconds(200));
    video->CloseSendThread();
    ::testing::internal::GetCapturedStdout();
    size_t lines = 0;
    for (const std::string& l : fake.log.Texts("orvex:::cycle_buffer")) {
        if (l == "\n video FRAME_SIZE is not enough !--1 \n") ++lines;
    }
    EXPECT_GT(lines, 0u);
    EXPECT_LT(lines, 200u);  // at most one per 2 ms, with room for a slow machine
    EXPECT_FALSE(video_ring.item_stream_valid());
}

// kv.orvex.latency=1: one line per 300 frames sent, none before; off, none at all.
TEST_P(SendSessionTest, LatencyReportComesWithEvery300thFrame) {
    for (const char* value : {"0", "1"}) {
        fake.properties.Set("kv.orvex.latency", value);
        config->Apply(config::ReadSettings(fake.properties));
        fake.log.Clear();
        UdpReceiver r;
        config->set_timestamp(1000000, false);
        video->add_dest_socket_info(Key(1), r.port(), "127.0.0.1");
        ASSERT_EQ(video->StartSendThread(), 0);
        for (unsigned i = 0; i < 300; ++i) Feed(video_ring, NalItem(10, 0x41), 1000 + i);
        WaitEmpty(video_ring);
        video->CloseSendThread();  // the item taken last is sent before the loop ends
        EXPECT_EQ(r.Receive().size(), 12u + 10);
        std::vector<std::string> lines = fake.log.Texts("orvex:::SendH264Rtp");
        std::vector<std::string> reports;
        for (const std::string& l : lines) {
            if (l.rfind("latency of the last 300 frames: ring wait p50 ", 0) == 0) {
                reports.push_back(l);
            }
        }
        EXPECT_EQ(reports.size(), value[0] == '1' ? 1u : 0u) << value;
    }
}

INSTANTIATE_TEST_SUITE_P(SenderModes, SendSessionTest,
                         ::testing::Values("poll", "event", "inline"));

}  // namespace
