#include <dirent.h>
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <map>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "auth/Digest.h"
#include "base/Clocks.h"
#include "base/OrvexLog.h"
#include "config/LivecameraResolution.h"
#include "config/livepipmanager.h"
#include "platform/fake/FakePlatform.h"
#include "rtp/SendH264Rtp.h"
#include "rtp/SendMP3Rtp.h"
#include "rtsp/RtspResponse.h"
#include "rtsp/RtspTransport.h"
#include "server/RtspService_t.h"
#include "server/skyvo_rtsp.h"
#include "server/skyvo_service.h"
#include "stream/FrameTap.h"
#include "tests/rtp/UdpReceiver.h"
#include "tests/server/RtspClient.h"

namespace {

using Calls = std::vector<std::string>;

std::mutex g_mutex;
Calls g_calls;

void Record(const std::string& call) {
    std::lock_guard<std::mutex> hold(g_mutex);
    g_calls.push_back(call);
}

Calls RecordedCalls() {
    std::lock_guard<std::mutex> hold(g_mutex);
    return g_calls;
}

// The open callbacks also note whether the rings were empty and both send threads running.
int VideoOpen() {
    RtspService_t* service = skyvo_rtsp_service();
    if (service == nullptr) return 0;  // a test that ended early is closing the server
    RtspTransport* l = service->listener();
    bool ready = l->video_ring().used_space() == 0 && l->audio_ring().used_space() == 0 &&
                 H264RtpTransportSession::instance()->sending() &&
                 MP3RtpTransportSession::instance()->sending();
    Record(ready ? "video open" : "video open before rings and senders were ready");
    return 0;
}
int AudioOpen() {
    Record("audio open");
    return 0;
}
int VideoClose() {
    Record("video close");
    return 0;
}
int AudioClose() {
    Record("audio close");
    return 0;
}

template <typename Pred>
bool WaitFor(Pred done, int ms = 3000) {
    for (int i = 0; i < ms / 5; ++i) {
        if (done()) return true;
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    return done();
}

int FreePort() {
    int fd = socket(AF_INET, SOCK_STREAM, 0);
    sockaddr_in a{};
    a.sin_family = AF_INET;
    bind(fd, reinterpret_cast<sockaddr*>(&a), sizeof a);
    socklen_t len = sizeof a;
    getsockname(fd, reinterpret_cast<sockaddr*>(&a), &len);
    close(fd);
    return ntohs(a.sin_port);
}

const std::string kQuery =
    "?width=640&height=480&cameraid=hd0&win=main&sub=0&dumpvideo=0&dumpaudio=0&specialcase=none"
    "&framerate=30";

class ServerTest : public ::testing::Test {
protected:
    void SetUp() override {
        RtspResponse::SetSessionCounter(1880);
        Socket::SetReadinessWaitMs(500);  // a silent client goes after half a second here
        RtspTransport::SetSelectWaitMs(20);
        {
            std::lock_guard<std::mutex> hold(g_mutex);
            g_calls.clear();
        }
        g_pip_stop_flag = 0;
        g_follow_main_flag = 0;
        port = FreePort();
        url = "rtsp://127.0.0.1:" + std::to_string(port) + "/skyvo.0" + kQuery;
        OpenServer();
    }
    void OpenServer() {
        skyvo_rtsp_sever_init();
        register_audio_open_thread_func(AudioOpen);
        register_video_open_thread_func(VideoOpen);
        register_audio_close_thread_func(AudioClose);
        register_video_close_thread_func(VideoClose);
        skyvo_set_mp3_rtp_config(48000);
        skyvo_set_h264_rtp_config(90000);
        ASSERT_EQ(skyvo_rtsp_sever_open(static_cast<unsigned>(port)), 0);
    }
    void TearDown() override {
        skyvo_rtsp_sever_close();
        Socket::SetReadinessWaitMs(10000);
        RtspTransport::SetSelectWaitMs(2000);
    }
    int Clients() { return skyvo_rtsp_service()->listener()->client_count(); }
    // DESCRIBE, SETUP of both tracks and PLAY, as ffmpeg sends them.
    void Play(RtspClient& c, int video_port, int audio_port, std::string* describe = nullptr) {
        std::string answer = c.Exchange("DESCRIBE " + url +
                                        " RTSP/1.0\r\nAccept: application/sdp\r\nCSeq: 2\r\n\r\n");
        if (describe != nullptr) *describe = answer;
        ASSERT_NE(answer.find("200 OK"), std::string::npos);
        c.Exchange("SETUP " + url +
                   "/trackID=1 RTSP/1.0\r\nTransport: RTP/AVP/UDP;unicast;client_port=" +
                   std::to_string(video_port) + "-" + std::to_string(video_port + 1) +
                   "\r\nCSeq: 3\r\n\r\n");
        c.Exchange("SETUP " + url +
                   "/trackID=2 RTSP/1.0\r\nTransport: RTP/AVP/UDP;unicast;client_port=" +
                   std::to_string(audio_port) + "-" + std::to_string(audio_port + 1) +
                   "\r\nCSeq: 4\r\n\r\n");
        ASSERT_NE(c.Exchange("PLAY " + url + " RTSP/1.0\r\nRange: npt=0.000-\r\nCSeq: 5\r\n\r\n")
                      .find("200 OK"),
                  std::string::npos);
    }

    platform::fake::FakePlatform fake;
    int port = 0;
    std::string url;
};

class LoopbackReceiver : public UdpReceiver {};

TEST_F(ServerTest, FullExchangeIsByteExactAndRtpFollowsTheFrames) {
    UdpReceiver video, audio;
    RtspClient c("127.0.0.1", port);
    ASSERT_TRUE(c.connected());
    EXPECT_EQ(
        c.Exchange("OPTIONS " + url + " RTSP/1.0\r\nCSeq: 1\r\nUser-Agent: Lavf59.27.100\r\n\r\n"),
        "RTSP/1.0 200 OK\r\nCSeq: 1\r\n"
        "Public: OPTIONS, DESCRIBE, SETUP, TEARDOWN, PLAY, PAUSE,GET_PARAMETER\r\n\r\n");
    const std::string sdp =
        "v=0\r\ns=skyvo\r\nc=IN IP4 127.0.0.1\r\nt=0 0\r\na=control:*\r\n"
        "m=video 0 RTP/AVP 96\r\na=rtpmap:96 H264/90000\r\n"
        "a=fmtp:96 profile-level-id=42401E; sprop-parameter-sets=Z0JAHqbAoD2hAAADAAEAAAMAKA8QIuA=,"
        "aMpDiA==; packetization-mode=1;\r\na=control:trackID=1\r\n"
        "m=audio 0 RTP/AVP 97\r\na=rtpmap:97 MPEG4-GENERIC/48000/2\r\n"
        "a=fmtp:97 streamtype=5; profile-level-id=1; mode=AAC-hbr; config=1190; SizeLength=13; "
        "IndexLength=3; IndexDeltaLength=3;\r\na=control:trackID=2\r\n";
    EXPECT_EQ(c.Exchange("DESCRIBE " + url +
                         " RTSP/1.0\r\nAccept: application/sdp\r\nCSeq: 2\r\n"
                         "User-Agent: Lavf59.27.100\r\n\r\n"),
              "RTSP/1.0 200 OK\r\nCSeq: 2\r\nServer: RTSP Service\r\nContent-Base: " + url +
                  "\r\nContent-Type: application/sdp\r\nContent-Length: " +
                  std::to_string(sdp.size()) + "\r\n\r\n" + sdp);
    const std::string v = std::to_string(video.port()), a = std::to_string(audio.port());
    const std::string v1 = std::to_string(video.port() + 1), a1 = std::to_string(audio.port() + 1);
    EXPECT_EQ(
        c.Exchange("SETUP " + url +
                   "/trackID=1 RTSP/1.0\r\nTransport: RTP/AVP/UDP;unicast;"
                   "client_port=" +
                   v + "-" + v1 + "\r\nCSeq: 3\r\n\r\n"),
        "RTSP/1.0 200 OK\r\nCSeq: 3\r\nSession: 1881;timeout=10\r\nTransport: RTP/AVP;unicast;"
        "server_port=8000-8001;client_port=" +
            v + "-" + v1 + ";ssrc=1\r\n\r\n");
    EXPECT_EQ(
        c.Exchange("SETUP " + url +
                   "/trackID=2 RTSP/1.0\r\nTransport: RTP/AVP/UDP;unicast;"
                   "client_port=" +
                   a + "-" + a1 + "\r\nCSeq: 4\r\nSession: 1881\r\n\r\n"),
        "RTSP/1.0 200 OK\r\nCSeq: 4\r\nSession: 1881;timeout=10\r\nTransport: RTP/AVP;unicast;"
        "server_port=8002-8003;client_port=" +
            a + "-" + a1 + ";ssrc=1\r\n\r\n");
    EXPECT_TRUE(RecordedCalls().empty());
    // Answer lines are cut at 255 characters: with URLs this long the second url= is cut.
    const std::string rtp_info =
        ("RTP-Info: url=" + url + "/trackID=1,url=" + url + "/trackID=2").substr(0, 255);
    EXPECT_EQ(c.Exchange("PLAY " + url +
                         " RTSP/1.0\r\nRange: npt=0.000-\r\nCSeq: 5\r\nSession: 1881\r\n\r\n"),
              "RTSP/1.0 200 OK\r\nCSeq: 5\r\nSession: 1881;timeout=10\r\n" + rtp_info + "\r\n\r\n");
    ASSERT_TRUE(WaitFor([] { return RecordedCalls().size() == 2; }));  // just after the answer
    EXPECT_EQ(RecordedCalls(), (Calls{"video open", "audio open"}));

    unsigned char idr[] = {0, 0, 0, 1, 0x65, 1, 2, 3, 4, 5};
    EXPECT_EQ(skyvo_add_h264_data(idr, sizeof idr), 1);
    std::vector<unsigned char> p = video.Receive();
    ASSERT_EQ(p.size(), 12u + 6);
    EXPECT_EQ(p[1], 0x80 | 96);
    EXPECT_EQ(p[12], 0x65);
    unsigned char adts[30] = {0xFF, 0xF1};
    EXPECT_EQ(skyvo_add_mp3_data(adts, sizeof adts, 0), 1);
    p = audio.Receive();
    ASSERT_EQ(p.size(), 30u + 9);
    EXPECT_EQ(p[1], 0xE2);

    EXPECT_EQ(c.Exchange("GET_PARAMETER " + url + " RTSP/1.0\r\nCSeq: 6\r\nSession: 1881\r\n\r\n"),
              "RTSP/1.0 200 OK\r\nCSeq: 6\r\nSession: 1881;timeout=10\r\n\r\n");
    c.Send("TEARDOWN " + url + " RTSP/1.0\r\nCSeq: 7\r\nSession: 1881\r\n\r\n");
    EXPECT_TRUE(c.ClosedWithoutAnswer());  // TEARDOWN is never answered
    ASSERT_TRUE(WaitFor([] { return RecordedCalls().size() == 4; }));
    EXPECT_EQ(RecordedCalls(), (Calls{"video open", "audio open", "video close", "audio close"}));
    EXPECT_EQ(H264RtpTransportSession::instance()->dest_count(), 0u);
    EXPECT_TRUE(WaitFor([&] { return Clients() == 0; }));
}

// kv.orvex.audiopt changes what the audio packets carry and nothing that the client is told.
TEST_F(ServerTest, AudioPayloadTypeSwitchChangesOnlyTheAudioPackets) {
    std::string unset_describe;
    for (int pt : {98, 97, 120}) {
        skyvo_rtsp_sever_close();
        fake.properties.Clear();
        if (pt != 98) fake.properties.Set("kv.orvex.audiopt", std::to_string(pt));
        {
            std::lock_guard<std::mutex> hold(g_mutex);
            g_calls.clear();
        }
        OpenServer();
        UdpReceiver video, audio;
        RtspClient c("127.0.0.1", port);
        std::string describe;
        Play(c, video.port(), audio.port(), &describe);
        ASSERT_TRUE(
            WaitFor([] { return RecordedCalls().size() == 2; }));  // rings reset, capture on
        if (pt == 98) unset_describe = describe;
        EXPECT_EQ(describe, unset_describe) << pt;
        unsigned char adts[30] = {0xFF, 0xF1};
        EXPECT_EQ(skyvo_add_mp3_data(adts, sizeof adts, 0), 1);
        std::vector<unsigned char> p = audio.Receive();
        ASSERT_EQ(p.size(), 30u + 9) << pt;
        EXPECT_EQ(p[1], 0x80 | pt);
        c.Send("TEARDOWN " + url + " RTSP/1.0\r\nCSeq: 6\r\n\r\n");
        EXPECT_TRUE(c.ClosedWithoutAnswer());
        ASSERT_TRUE(WaitFor([&] { return Clients() == 0; }));
    }
    EXPECT_NE(unset_describe.find("m=audio 0 RTP/AVP 97\r\n"), std::string::npos);
}

TEST_F(ServerTest, PlayWithTwoClientsConnectedDoesNotStartCapture) {
    RtspClient idle("127.0.0.2", port);
    ASSERT_TRUE(WaitFor([&] { return Clients() == 1; }));
    RtspClient player("127.0.0.3", port);
    ASSERT_TRUE(WaitFor([&] { return Clients() == 2; }));
    UdpReceiver v, a;
    Play(player, v.port(), a.port());
    // The listener starts capture after a PLAY's answer, before it reads the next request: this
    // answer proves it had its chance.
    player.Exchange("GET_PARAMETER " + url + " RTSP/1.0\r\nCSeq: 6\r\n\r\n");
    EXPECT_TRUE(RecordedCalls().empty());
    player.Close();
    // Any client leaving stops capture for all: the close callbacks and the TV defaults.
    ASSERT_TRUE(WaitFor([] { return RecordedCalls().size() == 2; }));
    EXPECT_EQ(RecordedCalls(), (Calls{"video close", "audio close"}));
    auto cfg_logs = fake.log.Texts("orvex:::orvexPIPCfg");
    EXPECT_EQ(std::count(cfg_logs.begin(), cfg_logs.end(), "orvexPIPCfg::SetTVParameterDefault"),
              2);
    EXPECT_TRUE(WaitFor([&] { return Clients() == 1; }));
}

TEST_F(ServerTest, SixthClientIsResetAtOnce) {
    std::vector<std::unique_ptr<RtspClient>> clients;
    for (int i = 2; i <= 6; ++i) {
        clients.push_back(
            std::make_unique<RtspClient>(("127.0.0." + std::to_string(i)).c_str(), port));
        ASSERT_TRUE(WaitFor([&] { return Clients() == i - 1; }));
    }
    RtspClient sixth("127.0.0.7", port);
    EXPECT_TRUE(sixth.ClosedWithoutAnswer());
    EXPECT_EQ(Clients(), 5);
    std::vector<std::string> warnings;
    for (const auto& e : fake.log.Entries()) {
        if (e.priority >= platform::kLogWarn) warnings.push_back(e.text);
    }
    EXPECT_EQ(warnings, (std::vector<std::string>{"rtsp client 127.0.0.7 refused: 5 clients "
                                                  "already watch, the most served"}));
    // The five are still served.
    EXPECT_NE(
        clients[0]->Exchange("OPTIONS " + url + " RTSP/1.0\r\nCSeq: 1\r\n\r\n").find("200 OK"),
        std::string::npos);
}

TEST_F(ServerTest, ReconnectFromTheSameAddressReplacesTheOldSession) {
    RtspClient first("127.0.0.2", port);
    ASSERT_TRUE(WaitFor([&] { return Clients() == 1; }));
    RtspClient again("127.0.0.2", port);
    EXPECT_TRUE(first.ClosedWithoutAnswer());  // reset
    ASSERT_TRUE(WaitFor([] { return RecordedCalls().size() == 2; }));
    EXPECT_EQ(RecordedCalls(), (Calls{"video close", "audio close"}));  // it was the only client
    EXPECT_TRUE(WaitFor([&] { return Clients() == 1; }));  // the new one is counted just after
    UdpReceiver v, a;
    Play(again, v.port(), a.port());
    ASSERT_TRUE(WaitFor([] { return RecordedCalls().size() == 4; }));
    EXPECT_EQ(RecordedCalls(), (Calls{"video close", "audio close", "video open", "audio open"}));
}

// The connection is reset without an answer, as ever; the log names the key and the client.
TEST_F(ServerTest, AMissingCaptureKeyIsOneWarningNamingIt) {
    RtspClient c("127.0.0.2", port);
    c.Send(
        "DESCRIBE rtsp://127.0.0.1/skyvo.0?width=640&height=480&win=main&sub=0&dumpvideo=0"
        "&dumpaudio=0&specialcase=none&framerate=30 RTSP/1.0\r\nCSeq: 2\r\n\r\n");
    EXPECT_TRUE(c.ClosedWithoutAnswer());
    std::vector<std::string> warnings;
    for (const auto& e : fake.log.Entries()) {
        if (e.priority >= platform::kLogWarn) warnings.push_back(e.text);
    }
    EXPECT_EQ(warnings, (std::vector<std::string>{
                            "rtsp client 127.0.0.2: the URL has no 'cameraid=' key; every key of "
                            "width, height, cameraid, win, sub, dumpvideo, dumpaudio, "
                            "specialcase, framerate is needed"}));
}

TEST_F(ServerTest, BadOrSilentClientsAreClosedWithoutAnswer) {
    const std::string without_framerate =
        "DESCRIBE rtsp://127.0.0.1/skyvo.0?width=640&height=480&cameraid=hd0&win=main&sub=0"
        "&dumpvideo=0&dumpaudio=0&specialcase=none RTSP/1.0\r\nCSeq: 2\r\n\r\n";
    const std::string cases[] = {
        without_framerate,
        "DESCRIBE rtsp://127.0.0.1/skyvo" + kQuery +
            " RTSP/1.0\r\nCSeq: 2\r\n\r\n",  // no '.' and time
        "RECORD " + url + " RTSP/1.0\r\nCSeq: 2\r\n\r\n",
    };
    for (const std::string& request : cases) {
        RtspClient c("127.0.0.2", port);
        c.Send(request);
        EXPECT_TRUE(c.ClosedWithoutAnswer()) << request;
    }
    // A client that goes quiet is dropped when the socket wait ends its next request empty.
    RtspClient quiet("127.0.0.2", port);
    EXPECT_NE(quiet.Exchange("OPTIONS " + url + " RTSP/1.0\r\nCSeq: 1\r\n\r\n").find("200 OK"),
              std::string::npos);
    EXPECT_TRUE(quiet.ClosedWithoutAnswer());
}

TEST_F(ServerTest, ErrorAnswersKeepTheConnection) {
    RtspClient c("127.0.0.2", port);
    const std::string track = "SETUP " + url + "/trackID=";
    struct Case {
        std::string request, answer;
    };
    const Case cases[] = {
        {"PLAY rtsp://127.0.0.1/other.0 RTSP/1.0\r\nCSeq: 1\r\n\r\n",
         "RTSP/1.0 404 Session Not Found\r\nCSeq: 1\r\n\r\n"},
        {"PAUSE rtsp://127.0.0.1 RTSP/1.0\r\nCSeq: 2\r\n\r\n",
         "RTSP/1.0 400 Bad Request\r\nCSeq: 2\r\n\r\n"},
        // No name in a SETUP URL and none stored by a DESCRIBE yet.
        {track +
             "1 RTSP/1.0\r\nCSeq: 3\r\nTransport: RTP/AVP;unicast;client_port=5000-5001\r\n\r\n",
         "RTSP/1.0 404 Session Not Found\r\nCSeq: 3\r\n\r\n"},
        {"DESCRIBE " + url + " RTSP/1.0\r\nCSeq: 4\r\n\r\n", ""},
        {track +
             "3 RTSP/1.0\r\nCSeq: 5\r\nTransport: RTP/AVP;unicast;client_port=5000-5001\r\n\r\n",
         "RTSP/1.0 404 Stream Not Found\r\nCSeq: 5\r\n\r\n"},
        {track + "1 RTSP/1.0\r\nCSeq: 6\r\nTransport: RTP/AVP/TCP;interleaved=0-1\r\n\r\n",
         "RTSP/1.0 400 Bad Request\r\nCSeq: 6\r\n\r\n"},
        {track + "2 RTSP/1.0\r\nCSeq: 7\r\nTransport: RTP/AVP;unicast;client_port=5002\r\n\r\n",
         "RTSP/1.0 200 OK\r\nCSeq: 7\r\nSession: 1881;timeout=10\r\nTransport: RTP/AVP;unicast;"
         "server_port=8002-8003;client_port=5002-5003;ssrc=1\r\n\r\n"},
        {"PLAY rtsp://127.0.0.1/other.0 RTSP/1.0\r\nCSeq: 8\r\n\r\n",
         "RTSP/1.0 404 Session Not Found\r\nCSeq: 8\r\nSession: 1881;timeout=10\r\n\r\n"},
    };
    for (const Case& k : cases) {
        std::string answer = c.Exchange(k.request);
        if (k.answer.empty()) {
            EXPECT_EQ(answer.compare(0, 15, "RTSP/1.0 200 OK"), 0) << k.request;
        } else {
            EXPECT_EQ(answer, k.answer) << k.request;
        }
    }
    std::string unknown = url;
    unknown.replace(unknown.find("skyvo"), 5, "other");
    EXPECT_EQ(c.Exchange("DESCRIBE " + unknown + " RTSP/1.0\r\nCSeq: 9\r\n\r\n"),
              "RTSP/1.0 404 File Url Not Found, Or In Incorrect Format\r\nCSeq: 9\r\n"
              "Session: 1881;timeout=10\r\n\r\n");
    EXPECT_TRUE(c.ClosedWithoutAnswer());  // a failed DESCRIBE ends the connection
}

TEST_F(ServerTest, RefusedPipRegistrationAnswers405) {
    fake.properties.Set("kelvo.build.kelvotv", "sa");
    fake.pip_manager.set_listener_result(-1);
    RtspClient c("127.0.0.2", port);
    EXPECT_EQ(c.Exchange("DESCRIBE " + url + " RTSP/1.0\r\nCSeq: 2\r\n\r\n"),
              "RTSP/1.0 405  resolvration error !\r\nCSeq: 2\r\n\r\n");
    EXPECT_TRUE(c.ClosedWithoutAnswer());
}

TEST_F(ServerTest, PipStopClosesCaptureAndReopensThreeRoundsLaterOnlyWhenFollowingMain) {
    g_follow_main_flag = 1;
    PipListener listener;
    listener.eventCallback(1);
    ASSERT_TRUE(WaitFor([] { return RecordedCalls().size() == 4; }));
    EXPECT_EQ(RecordedCalls(),
              (Calls{"video close", "audio close", "video open before rings and senders were ready",
                     "audio open"}));
    {
        std::lock_guard<std::mutex> hold(g_mutex);
        g_calls.clear();
    }
    g_follow_main_flag = 0;
    listener.eventCallback(1);
    ASSERT_TRUE(WaitFor([] { return RecordedCalls().size() == 2; }));
    RtspTransport* rtsp = skyvo_rtsp_service()->listener();
    unsigned round = rtsp->rounds();
    ASSERT_TRUE(WaitFor([&] { return rtsp->rounds() >= round + 4; }));  // past the countdown
    EXPECT_EQ(RecordedCalls(), (Calls{"video close", "audio close"}));
}

TEST_F(ServerTest, FrameLargerThanTheRingIsDroppedAndTheRingKept) {
    RtspTransport* l = skyvo_rtsp_service()->listener();
    unsigned char small[100] = {0, 0, 0, 1, 0x41};
    ASSERT_EQ(skyvo_add_h264_data(small, sizeof small), 1);
    unsigned used = l->video_ring().used_space();
    std::vector<unsigned char> big(8000000);
    ::testing::internal::CaptureStdout();
    EXPECT_EQ(skyvo_add_h264_data(big.data(), static_cast<unsigned>(big.size())), 0);
    ::testing::internal::GetCapturedStdout();
    EXPECT_EQ(l->video_ring().used_space(), used);
    EXPECT_EQ(skyvo_add_h264_data(nullptr, 5), 0);
    EXPECT_EQ(skyvo_add_mp3_data(small, 0, 0), 0);
}

TEST(ServerLifecycleTest, PortInUseLeavesNoServerAndCloseTwiceIsHarmless) {
    platform::fake::FakePlatform fake;
    int taken = socket(AF_INET, SOCK_STREAM, 0);
    sockaddr_in a{};
    a.sin_family = AF_INET;
    ASSERT_EQ(bind(taken, reinterpret_cast<sockaddr*>(&a), sizeof a), 0);
    listen(taken, 1);
    socklen_t len = sizeof a;
    getsockname(taken, reinterpret_cast<sockaddr*>(&a), &len);
    skyvo_rtsp_sever_init();
    ::testing::internal::CaptureStdout();
    EXPECT_EQ(skyvo_rtsp_sever_open(ntohs(a.sin_port)), 1);
    EXPECT_EQ(skyvo_rtsp_service(), nullptr);
    skyvo_set_h264_rtp_config(90000);
    unsigned char b[8] = {0, 0, 0, 1, 0x65};
    EXPECT_EQ(skyvo_add_h264_data(b, sizeof b), 0);
    skyvo_rtsp_sever_close();
    g_orvex_debug_printf = 1;
    skyvo_rtsp_sever_close();
    g_orvex_debug_printf = 0;
    std::string out = ::testing::internal::GetCapturedStdout();
    EXPECT_NE(out.find("\n rtstptransport bind error. "), std::string::npos);
    EXPECT_EQ(out.substr(out.size() - std::string("\n g_pRtspService is NULL ! \n").size()),
              "\n g_pRtspService is NULL ! \n");
    close(taken);
}

// Producers keep feeding both rings while the server closes under them: no call may reach a
// server that is being destroyed (under AddressSanitizer a use after free fails the round).
TEST(ServerLifecycleTest, CloseWhileProducersFeedTouchesNoFreedServer) {
    platform::fake::FakePlatform fake;
    RtspTransport::SetSelectWaitMs(5);
    constexpr int kRounds = 40;
    for (int round = 0; round < kRounds; ++round) {
        skyvo_rtsp_sever_init();
        ASSERT_EQ(skyvo_rtsp_sever_open(static_cast<unsigned>(FreePort())), 0);
        std::atomic<int> calls{0};
        std::atomic<bool> stop{false};
        auto feed = [&](bool video) {
            unsigned char frame[4000] = {0, 0, 0, 1, 0x41};
            while (!stop.load()) {
                if (video) {
                    skyvo_add_h264_data(frame, sizeof frame);
                } else {
                    skyvo_add_mp3_data(frame, 400, 1);
                }
                calls.fetch_add(1);
            }
        };
        std::thread video(feed, true), audio(feed, false);
        while (calls.load() < 2 + round % 16) std::this_thread::yield();
        skyvo_rtsp_sever_close();
        stop.store(true);
        video.join();
        audio.join();
        EXPECT_EQ(skyvo_rtsp_service(), nullptr);
    }
    RtspTransport::SetSelectWaitMs(2000);
}

}  // namespace

namespace {

class RecordingSink : public EncodedFrameSink {
public:
    void OnVideoFrame(const uint8_t* data, size_t len, uint32_t time_ms) override {
        std::lock_guard<std::mutex> hold(lock);
        frames.emplace_back("video " + std::to_string(len) + " " + std::to_string(data[4]));
        last_time = time_ms;
    }
    void OnAudioFrame(const uint8_t* data, size_t len, uint32_t time_ms) override {
        std::lock_guard<std::mutex> hold(lock);
        frames.emplace_back("audio " + std::to_string(len) + " " + std::to_string(data[0]));
        last_time = time_ms;
    }
    std::mutex lock;
    Calls frames;
    uint32_t last_time = 0;
};

}  // namespace

// The tap sees frames whether or not anyone plays, with the rings' time stamps.
TEST_F(ServerTest, FrameSinksSeeEveryFrameUntilRemoved) {
    RecordingSink sink, others[kMaxFrameSinks];
    ASSERT_TRUE(AddFrameSink(&sink));
    EXPECT_FALSE(AddFrameSink(&sink));
    int added = 0;
    for (RecordingSink& other : others) added += AddFrameSink(&other) ? 1 : 0;
    EXPECT_EQ(added, kMaxFrameSinks - 1);
    for (RecordingSink& other : others) RemoveFrameSink(&other);

    unsigned char idr[] = {0, 0, 0, 1, 0x65, 1, 2, 3};
    unsigned char aac[] = {0x21, 0x10, 0x04};
    unsigned before = GetTimeStampMillsec();
    EXPECT_EQ(skyvo_add_h264_data(idr, sizeof idr), 1);
    EXPECT_GE(sink.last_time, before);
    EXPECT_EQ(skyvo_add_mp3_data(aac, sizeof aac, 1234), 1);
    EXPECT_EQ(sink.last_time, 1234u);
    EXPECT_EQ(skyvo_add_mp3_data(aac, sizeof aac, 0), 1);
    EXPECT_GE(sink.last_time, before);  // no producer clock: the ring's
    EXPECT_EQ(skyvo_add_h264_data(nullptr, 4), 0);
    RemoveFrameSink(&sink);
    EXPECT_EQ(skyvo_add_h264_data(idr, sizeof idr), 1);
    EXPECT_EQ(sink.frames, (Calls{"video 8 101", "audio 3 33", "audio 3 33"}));
}

// A hold starts capture with no RTSP client, brings it back after a departing client stopped
// it for all, and its release stops it.
TEST_F(ServerTest, CaptureHoldStartsCaptureAndOutlivesDepartingClients) {
    RtspTransport* listener = skyvo_rtsp_service()->listener();
    listener->HoldCapture(kQuery);
    ASSERT_TRUE(WaitFor([] { return RecordedCalls().size() == 2; }));
    EXPECT_EQ(RecordedCalls(), (Calls{"video open", "audio open"}));
    unsigned width = 0, height = 0;
    get_video_resolution(&width, &height);
    EXPECT_EQ(width, 640u);
    EXPECT_EQ(height, 480u);

    {
        UdpReceiver v, a;
        RtspClient c("127.0.0.1", port);
        Play(c, v.port(), a.port());  // capture already runs: no second open
        c.Send("TEARDOWN " + url + " RTSP/1.0\r\nCSeq: 7\r\n\r\n");
        EXPECT_TRUE(c.ClosedWithoutAnswer());
    }
    ASSERT_TRUE(WaitFor([] { return RecordedCalls().size() == 6; }));
    EXPECT_EQ(RecordedCalls(), (Calls{"video open", "audio open", "video close", "audio close",
                                      "video open", "audio open"}));
    listener->ReleaseCapture();
    listener->ReleaseCapture();  // one release too many changes nothing
    ASSERT_TRUE(WaitFor([] { return RecordedCalls().size() == 8; }));
    EXPECT_EQ(RecordedCalls().back(), "audio close");
    EXPECT_EQ(listener->capture_holders(), 0);
}

// A client that connects and never plays (a player that gave up, a probe) does not keep a
// hold's capture from starting: it waits a moment for the client's choice, then starts.
TEST_F(ServerTest, CaptureHoldStartsCaptureBesideAClientThatNeverPlays) {
    Socket::SetReadinessWaitMs(10000);  // as in service: the idle client stays for the test
    RtspClient idle("127.0.0.2", port);
    ASSERT_TRUE(WaitFor([this] { return Clients() == 1; }));
    RtspTransport* listener = skyvo_rtsp_service()->listener();
    listener->HoldCapture(kQuery);
    EXPECT_TRUE(WaitFor([] { return RecordedCalls().size() == 2; }));
    EXPECT_EQ(RecordedCalls(), (Calls{"video open", "audio open"}));
    EXPECT_EQ(Clients(), 1);
    listener->ReleaseCapture();
}

// A viewer asking for a size the capture refuses would leave every consumer without a picture:
// the last accepted size stays, and one warning says so.
TEST_F(ServerTest, CaptureHoldWithARefusedSizeKeepsTheLastAcceptedOne) {
    RtspTransport* listener = skyvo_rtsp_service()->listener();
    listener->HoldCapture(kQuery);
    ASSERT_TRUE(WaitFor([] { return RecordedCalls().size() == 2; }));
    listener->ReleaseCapture();
    ASSERT_TRUE(WaitFor([] { return RecordedCalls().size() == 4; }));
    fake.log.Clear();
    listener->HoldCapture("?width=1000&height=700");
    ASSERT_TRUE(WaitFor([] { return RecordedCalls().size() == 6; }));
    EXPECT_EQ(RecordedCalls().back(), "audio open");
    unsigned width = 0, height = 0;
    get_video_resolution(&width, &height);
    EXPECT_EQ(width, 640u);
    EXPECT_EQ(height, 480u);
    std::vector<std::string> warnings;
    for (const auto& e : fake.log.Entries()) {
        if (e.priority >= platform::kLogWarn) warnings.push_back(e.text);
    }
    EXPECT_EQ(warnings, (std::vector<std::string>{
                            "capture keys ?width=1000&height=700 ask for 1000x700, a size the "
                            "capture refuses; keeping 640x480 (accepted on android: 640x480, "
                            "720x576, 320x240, 480x320, 1280x720, 720x480, 720x400, 320x176, "
                            "640x368, 1920x1080)"}));
    listener->ReleaseCapture();
}

// Track numbers beyond int's range are unknown tracks, not arithmetic on them.
TEST_F(ServerTest, OutOfRangeTrackNumbersAnswerStreamNotFound) {
    RtspClient c("127.0.0.2", port);
    ASSERT_EQ(c.Exchange("DESCRIBE " + url + " RTSP/1.0\r\nCSeq: 1\r\n\r\n")
                  .compare(0, 15, "RTSP/1.0 200 OK"),
              0);
    int cseq = 2;
    for (const char* track : {"-2147483648", "2147483648", "0", "99999999999999999999"}) {
        const std::string n = std::to_string(cseq++);
        EXPECT_EQ(c.Exchange("SETUP " + url + "/trackID=" + track + " RTSP/1.0\r\nCSeq: " + n +
                             "\r\nTransport: RTP/AVP;unicast;client_port=5000-5001\r\n\r\n"),
                  "RTSP/1.0 404 Stream Not Found\r\nCSeq: " + n + "\r\n\r\n")
            << track;
    }
}

namespace {

// Who may watch: a credentials file (orvex:orvex:pw) and an allow-list of 127.0.0.0/30.
class AccessTest : public ServerTest {
protected:
    void SetUp() override {
        users = ::testing::TempDir() + "orvex-users-" + std::to_string(getpid());
        FILE* f = fopen(users.c_str(), "w");
        ASSERT_NE(f, nullptr);
        fputs("orvex:orvex:2f5dc0319c3279451ae1c1d7fd646060\n", f);
        fclose(f);
        fake.properties.Set("kv.orvex.auth", users);
        fake.properties.Set("kv.orvex.allow", "127.0.0.0/30");
        ServerTest::SetUp();
    }
    void TearDown() override {
        ServerTest::TearDown();
        unlink(users.c_str());
        unlink((users + ".nonce-key").c_str());
    }
    // The nonce of a 401 answer, checking the answer's shape on the way (a Session line comes
    // between CSeq and the challenge once the client has one).
    static std::string NonceOf(const std::string& answer, const std::string& cseq) {
        const std::string status = "RTSP/1.0 401 Unauthorized\r\nCSeq: " + cseq + "\r\n";
        const std::string challenge = "WWW-Authenticate: Digest realm=\"orvex\", nonce=\"";
        EXPECT_EQ(answer.compare(0, status.size(), status), 0) << answer;
        size_t at = answer.find(challenge);
        if (at == std::string::npos) {
            ADD_FAILURE() << answer;
            return "";
        }
        at += challenge.size();
        EXPECT_EQ(answer.substr(at + 48), "\", qop=\"auth\"\r\n\r\n") << answer;
        return answer.substr(at, 48);
    }
    static std::string Authorization(const std::string& method, const std::string& uri,
                                     const std::string& nonce, const char* password = "pw") {
        auth::DigestFields f;
        f.username = "orvex";
        f.realm = "orvex";
        f.nonce = nonce;
        f.uri = uri;
        std::string response =
            auth::DigestExpectedResponse(auth::DigestHa1("orvex", "orvex", password), method, f);
        return "Authorization: Digest username=\"orvex\", realm=\"orvex\", nonce=\"" + nonce +
               "\", uri=\"" + uri + "\", response=\"" + response + "\"\r\n";
    }

    std::string users;
};

TEST_F(AccessTest, EveryRequestButOptionsNeedsADigestAnswer) {
    RtspClient c("127.0.0.1", port);
    EXPECT_EQ(c.Exchange("OPTIONS " + url + " RTSP/1.0\r\nCSeq: 1\r\n\r\n"),
              "RTSP/1.0 200 OK\r\nCSeq: 1\r\n"
              "Public: OPTIONS, DESCRIBE, SETUP, TEARDOWN, PLAY, PAUSE,GET_PARAMETER\r\n\r\n");
    // A PLAY without credentials is refused and starts nothing.
    NonceOf(c.Exchange("PLAY " + url + " RTSP/1.0\r\nCSeq: 2\r\n\r\n"), "2");
    const std::string nonce =
        NonceOf(c.Exchange("DESCRIBE " + url + " RTSP/1.0\r\nCSeq: 3\r\n\r\n"), "3");
    EXPECT_TRUE(RecordedCalls().empty());
    EXPECT_EQ(c.Exchange("DESCRIBE " + url + " RTSP/1.0\r\nCSeq: 4\r\n" +
                         "Authorization: Basic b3J2ZXg6cHc=\r\n\r\n")
                  .compare(0, 25, "RTSP/1.0 401 Unauthorized"),
              0);
    EXPECT_EQ(c.Exchange("DESCRIBE " + url + " RTSP/1.0\r\nCSeq: 5\r\n" +
                         "Authorization: Digest username=\"orvex\r\n\r\n"),
              "RTSP/1.0 400 Bad Request\r\nCSeq: 5\r\n\r\n");
    const std::string answer = c.Exchange("DESCRIBE " + url + " RTSP/1.0\r\nCSeq: 6\r\n" +
                                          Authorization("DESCRIBE", url, nonce) + "\r\n");
    EXPECT_EQ(answer.compare(0, 29, "RTSP/1.0 200 OK\r\nCSeq: 6\r\nSer"), 0) << answer;
    EXPECT_NE(answer.find("m=video 0 RTP/AVP 96"), std::string::npos);
    const std::string track = url + "/trackID=1";
    EXPECT_EQ(c.Exchange("SETUP " + track + " RTSP/1.0\r\nCSeq: 7\r\n" +
                         Authorization("SETUP", track, nonce) +
                         "Transport: RTP/AVP;unicast;client_port=5000-5001\r\n\r\n")
                  .compare(0, 26, "RTSP/1.0 200 OK\r\nCSeq: 7\r\n"),
              0);
    // The answer for one method does not serve another.
    NonceOf(c.Exchange("PLAY " + url + " RTSP/1.0\r\nCSeq: 8\r\n" +
                       Authorization("DESCRIBE", url, nonce) + "\r\n"),
            "8");
    EXPECT_TRUE(RecordedCalls().empty());
    EXPECT_EQ(c.Exchange("PLAY " + url + " RTSP/1.0\r\nCSeq: 9\r\n" +
                         Authorization("PLAY", url, nonce) + "\r\n")
                  .compare(0, 26, "RTSP/1.0 200 OK\r\nCSeq: 9\r\n"),
              0);
    EXPECT_TRUE(WaitFor([] { return RecordedCalls().size() == 2; }));
}

TEST_F(AccessTest, TenWrongAnswersLockOneAddressAndTheListKeepsOthersOut) {
    {
        RtspClient guesser("127.0.0.2", port);
        const std::string nonce =
            NonceOf(guesser.Exchange("DESCRIBE " + url + " RTSP/1.0\r\nCSeq: 1\r\n\r\n"), "1");
        for (int i = 2; i <= 10; ++i) {
            const std::string n = std::to_string(i);
            NonceOf(guesser.Exchange("DESCRIBE " + url + " RTSP/1.0\r\nCSeq: " + n + "\r\n" +
                                     Authorization("DESCRIBE", url, nonce, n.c_str()) + "\r\n"),
                    n);
        }
        // The tenth failure is told it is locked out, not challenged again, and the
        // connection ends.
        EXPECT_EQ(guesser.Exchange("DESCRIBE " + url + " RTSP/1.0\r\nCSeq: 11\r\n" +
                                   Authorization("DESCRIBE", url, nonce, "11") + "\r\n"),
                  "RTSP/1.0 403 Forbidden\r\nCSeq: 11\r\nRetry-After: 60\r\n\r\n");
        EXPECT_TRUE(guesser.ClosedWithoutAnswer());
    }
    // Locked out, even with the right password; another address is not.
    RtspClient locked("127.0.0.2", port);
    const std::string answer = locked.Exchange("OPTIONS " + url + " RTSP/1.0\r\nCSeq: 1\r\n\r\n");
    const std::string told = "RTSP/1.0 403 Forbidden\r\nCSeq: 1\r\nRetry-After: ";
    EXPECT_EQ(answer.compare(0, told.size(), told), 0) << answer;
    RtspClient neighbour("127.0.0.3", port);
    const std::string nonce =
        NonceOf(neighbour.Exchange("DESCRIBE " + url + " RTSP/1.0\r\nCSeq: 1\r\n\r\n"), "1");
    EXPECT_EQ(neighbour
                  .Exchange("DESCRIBE " + url + " RTSP/1.0\r\nCSeq: 2\r\n" +
                            Authorization("DESCRIBE", url, nonce) + "\r\n")
                  .compare(0, 15, "RTSP/1.0 200 OK"),
              0);
    RtspClient outsider("127.0.0.4", port);
    EXPECT_TRUE(outsider.ClosedWithoutAnswer());
}

// kv.orvex.bind: one address, or nothing at all when the value is not an address.
TEST(ListenAddressTest, TheListenerBindsTheNamedAddressOnly) {
    platform::fake::FakePlatform fake;
    for (const char* bad : {"localhost", "127.0.0.256", "127.0.0.1 "}) {
        fake.properties.Set("kv.orvex.bind", bad);
        skyvo_rtsp_sever_init();
        EXPECT_EQ(skyvo_rtsp_sever_open(static_cast<unsigned>(FreePort())), 1) << bad;
    }
    fake.properties.Set("kv.orvex.bind", "127.0.0.2");
    const int port = FreePort();
    skyvo_rtsp_sever_init();
    ASSERT_EQ(skyvo_rtsp_sever_open(static_cast<unsigned>(port)), 0);
    EXPECT_FALSE(RtspClient("127.0.0.1", port).connected());  // it connects to 127.0.0.1
    skyvo_rtsp_sever_close();
}

// A size the capture refuses is still answered 200 (the sound plays); the reason is one warning
// naming the client and the sizes that would work.
TEST_F(ServerTest, ARefusedCaptureSizeIsOneWarningNamingTheClient) {
    RtspClient c("127.0.0.2", port);
    std::string refused = url;
    refused.replace(refused.find("width=640&height=480"), 20, "width=800&height=600");
    ASSERT_EQ(c.Exchange("DESCRIBE " + refused + " RTSP/1.0\r\nCSeq: 1\r\n\r\n")
                  .compare(0, 15, "RTSP/1.0 200 OK"),
              0);
    std::vector<std::string> warnings;
    for (const auto& e : fake.log.Entries()) {
        if (e.priority >= platform::kLogWarn) warnings.push_back(e.text);
    }
    ASSERT_EQ(warnings.size(), 1u);
    EXPECT_EQ(warnings[0].rfind("127.0.0.2 asks for 800x600, a size the capture refuses: no "
                                "picture, sound only (accepted on android: 640x480, ",
                                0),
              0u)
        << warnings[0];
    EXPECT_TRUE(c.Exchange("DESCRIBE " + url + " RTSP/1.0\r\nCSeq: 2\r\n\r\n").size() > 0);
    size_t after = 0;
    for (const auto& e : fake.log.Entries()) after += e.priority >= platform::kLogWarn ? 1 : 0;
    EXPECT_EQ(after, 1u);  // an accepted size adds none
}

size_t EntriesIn(const char* folder) {
    size_t n = 0;
    if (DIR* d = opendir(folder)) {
        while (readdir(d) != nullptr) ++n;
        closedir(d);
    }
    return n;
}

// This process's threads by id, each with its name.
std::map<std::string, std::string> Threads() {
    std::map<std::string, std::string> threads;
    if (DIR* d = opendir("/proc/self/task")) {
        while (dirent* e = readdir(d)) {
            if (e->d_name[0] == '.') continue;
            char comm[64] = {};
            std::string path = std::string("/proc/self/task/") + e->d_name + "/comm";
            if (FILE* f = fopen(path.c_str(), "r")) {
                if (fgets(comm, sizeof comm, f) == nullptr) comm[0] = '\0';
                fclose(f);
            }
            if (char* end = strchr(comm, '\n')) *end = '\0';
            threads[e->d_name] = comm;
        }
        closedir(d);
    }
    return threads;
}

// The threads in `now` that `before` did not have, as "id:name ...".
std::string NewThreads(const std::map<std::string, std::string>& before,
                       const std::map<std::string, std::string>& now) {
    std::string names;
    for (const auto& [id, name] : now) {
        if (before.count(id) == 0) names += id + ":" + name + " ";
    }
    return names;
}

// Waiting for writes, a stop does not wait for the client being served to send its next
// request: its connection is cut off from reading and every thread and descriptor goes.
class EventStopTest : public ServerTest {
protected:
    void SetUp() override {
        // A sanitizer starts its own thread beside the first one made: have it counted.
        std::thread([] {}).join();
        threads_before = Threads();
        fds_before = EntriesIn("/proc/self/fd");
        fake.properties.Set("kv.orvex.wake", "event");
        ServerTest::SetUp();
    }
    std::map<std::string, std::string> threads_before;
    size_t fds_before = 0;
};

TEST_F(EventStopTest, AStopWhileAClientPlaysLeavesNoThreadOrDescriptor) {
    Socket::SetReadinessWaitMs(60000);  // only the stop can end the wait for the next request
    {
        UdpReceiver video, audio;
        RtspClient c("127.0.0.1", port);
        Play(c, video.port(), audio.port());
        ASSERT_TRUE(WaitFor([] { return RecordedCalls().size() == 2; }));
        EXPECT_NE(NewThreads(threads_before, Threads()), "");
        skyvo_rtsp_sever_close();
        EXPECT_TRUE(c.ClosedWithoutAnswer());
        // The departing client closes capture, and the stop once more, as it always has.
        Calls calls = RecordedCalls();
        calls.resize(4);
        EXPECT_EQ(calls, (Calls{"video open", "audio open", "video close", "audio close"}));
    }
    // A joined thread can stay listed for a moment after pthread_join returns: the kernel
    // wakes the joiner before it reaps the task (under qemu, for longer). Compared by id, a
    // thread still leaving from before the test hides nothing.
    EXPECT_TRUE(WaitFor([&] { return NewThreads(threads_before, Threads()).empty(); }))
        << "left: " << NewThreads(threads_before, Threads());
    EXPECT_EQ(EntriesIn("/proc/self/fd"), fds_before);
}

}  // namespace
