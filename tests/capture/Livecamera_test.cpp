#include "capture/Livecamera.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <vector>

#include "config/GlobalConfig.h"
#include "config/LivecameraResolution.h"
#include "platform/fake/FakePlatform.h"

namespace {

using Calls = std::vector<std::string>;

class LivecameraTest : public ::testing::Test {
protected:
    ~LivecameraTest() override {
        Close_Video_Capture();
        capture_state().flavour.Forget();
        Global_Config::CloseInstance();
    }
    // Stores a request as DESCRIBE would, then starts with a clean journal.
    int Start(const char* flavour, unsigned camera, unsigned mode, unsigned w = 1280,
              unsigned h = 720) {
        fake.results.Set("PX_AOUT_handle", -1);  // no open output path: the start opens one
        fake.properties.Set("kelvo.build.kelvotv", flavour);
        capture_state().flavour.Forget();
        set_video_resolution_support_more(w, h, camera, mode, 23, 0, 0, 0, 25);
        fake.journal.Clear();
        fake.log.Clear();
        return Start_Video_Capture();
    }
    bool Logged(const std::string& text) {
        auto logs = fake.log.Texts("orvex:::livecamera");
        return std::find(logs.begin(), logs.end(), text) != logs.end();
    }
    platform::fake::FakePlatform fake;
};

const Calls kRecorder = {"MediaRecorder(orvex)", "MediaRecorder::setCamera",
                         "MediaRecorder::setVideoSource(1)", "MediaRecorder::setOutputFormat(101)",
                         "MediaRecorder::setVideoEncoder(2)"};

Calls Join(std::initializer_list<Calls> parts) {
    Calls out;
    for (const Calls& p : parts) out.insert(out.end(), p.begin(), p.end());
    return out;
}

TEST_F(LivecameraTest, StartSequencePerCameraAndFlavour) {
    fake.results.Set("TvManager::mainInputSource", 23);
    struct Case {
        const char* name;
        const char* flavour;
        unsigned camera, mode;
        Calls before_recorder;  // camera and audio routing
        std::string camera_param, bitrate;
    };
    const std::string base = "preview-size=1920x1080;traveling-res=12;";
    const Case cases[] = {
        {"hd0 main on sa",
         "sa",
         5,
         6,
         {"Camera::connect(5, \"\", -1, -1)", "Camera::getParameters", "TvManager::connect",
          "TvManager::getCurrentMainInputSource", "TvManager::disconnect", "AudioManager::connect",
          "AudioManager::setAudioCaptureSource(0, 0)", "AudioManager::disconnect",
          "Camera::setParameters(" + base +
              "traveling-mode=6;traveling-framerate=25;traveling-magic-key=qtkvr27c04)",
          "Camera::unlock"},
         "video-param-camera-id=5",
         "2048000"},
        {"hd2 sub window on sa",
         "sa",
         7,
         4,
         {"Camera::connect(7, \"\", -1, -1)", "Camera::getParameters", "TvManager::connect",
          "TvManager::getCurrentMainInputSource", "TvManager::disconnect", "AudioManager::connect",
          "AudioManager::setAudioCaptureSource(0, 1)", "AudioManager::disconnect",
          "Camera::setParameters(" + base +
              "traveling-mode=4;traveling-framerate=25;traveling-magic-key=qtkvr27c04;"
              "main-input-source=23;sub-input-source=23)",
          "Camera::unlock"},
         "video-param-camera-id=7",
         "2048000"},
        {"hd1 on px: audio output, no TV manager",
         "px",
         6,
         6,
         {"Camera::connect(6, \"\", -1, -1)", "PX_AOUT_Init(8)", "PX_AOUT_GetHandle(4)",
          "PX_AOUT_Open(4, 0)", "Camera::getParameters", "PX_AOUT_SetAttr(44, 5, 0)",
          "Camera::setParameters(" + base +
              "traveling-mode=6;traveling-framerate=25;traveling-magic-key=qtkvr27c04)",
          "Camera::unlock"},
         "video-param-camera-id=6",
         "2048000"},
        {"sd input: only the mode",
         "",
         3,
         4,
         {"Camera::connect(3, \"\", -1, -1)", "Camera::getParameters", "AudioManager::connect",
          "AudioManager::setAudioCaptureSource(0, 0)", "AudioManager::disconnect",
          "Camera::setParameters(" + base + "traveling-mode=4)", "Camera::unlock"},
         "video-param-camera-id=3",
         "1024000"},
        {"camera 4: no keys, empty id text, low bitrate",
         "sa",
         4,
         6,
         {"Camera::connect(4, \"\", -1, -1)", "Camera::getParameters",
          "Camera::setParameters(" + base.substr(0, base.size() - 1) + ")", "Camera::unlock"},
         "",
         "1024000"},
    };
    for (const Case& c : cases) {
        Close_Video_Capture();
        Global_Config::instance()->set_sub_stat(false);
        ASSERT_EQ(Start(c.flavour, c.camera, c.mode), 0) << c.name;
        Calls expected =
            Join({c.before_recorder,
                  kRecorder,
                  {"MediaRecorder::setVideoSize(1280, 720)", "MediaRecorder::setVideoFrameRate(25)",
                   "MediaRecorder::setParameters(" + c.camera_param + ")",
                   "MediaRecorder::setParameters(video-param-encoding-bitrate=" + c.bitrate + ")",
                   "MediaRecorder::prepare", "MediaRecorder::start"}});
        EXPECT_EQ(fake.journal.Calls(), expected) << c.name;
        EXPECT_TRUE(Logged("******videobitrate is " + c.bitrate + "******")) << c.name;
        EXPECT_EQ(Global_Config::instance()->isSub(), c.mode == 4 && c.camera >= 5) << c.name;
    }
}

// Each failure logs its text, ends the start with 1 and undoes nothing.
TEST_F(LivecameraTest, EveryFailureLogsItsTextAndUndoesNothing) {
    struct Case {
        const char* flavour;
        unsigned camera, width;
        std::vector<std::pair<std::string, int>> inject;
        std::string text;
    };
    const Case cases[] = {
        {"sa", 5, 1280, {{"Camera::connect", 1}}, "orvex Camera::connect() fail \n"},
        {"px", 5, 1280, {{"PX_AOUT_Init", -1}}, "[ERROR]Aout init fail in orvex."},
        {"px",
         5,
         1280,
         {{"PX_AOUT_GetHandle", -1}, {"PX_AOUT_Open", -1}},
         "[ERROR] failed to PX_AOUT_Open(...) in orvex"},
        {"sa", 5, 640, {}, "\n orvex not support resolution width=640,height=720,\n"},
        {"sa", 5, 1280, {{"TvManager::connect", 1}}, "can't connect tv manager"},
        {"dqx", 5, 1280, {}, "get property kelvo.build.kelvotv failed[3].\n"},
        {"sa", 5, 1280, {{"MediaRecorder", 1}}, "Create mediacorder object error"},
        {"sa", 5, 1280, {{"MediaRecorder::setCamera", -1}}, "orvex mediacorder setCamera error"},
        {"sa",
         5,
         1280,
         {{"MediaRecorder::setVideoSource", -1}},
         "orvex mediacorder setVideoSource error"},
        {"sa",
         5,
         1280,
         {{"MediaRecorder::setOutputFormat", -1}},
         "orvex mediacorder setOutputFormat error"},
        {"sa",
         5,
         1280,
         {{"MediaRecorder::setVideoEncoder", -1}},
         "orvex mediacorder setVideoEncoder error"},
        {"sa",
         5,
         1280,
         {{"MediaRecorder::prepare", -19}},
         "orvex mediacorder prepare error ret = -19 "},
        {"sa", 5, 1280, {{"MediaRecorder::start", -1}}, "orvex mediacorder  start error"},
    };
    for (const Case& c : cases) {
        Close_Video_Capture();
        fake.results.Clear();
        fake.results.Set("PX_AOUT_handle", -1);
        for (const auto& f : c.inject) fake.results.Set(f.first, f.second);
        EXPECT_EQ(Start(c.flavour, c.camera, 6, c.width), 1) << c.text;
        EXPECT_TRUE(Logged(c.text)) << c.text;
        for (const std::string& call : fake.journal.Calls()) {
            EXPECT_TRUE(call != "MediaRecorder::stop" && call != "MediaRecorder::release" &&
                        call != "Camera::lock" && call != "PX_AOUT_Close(44)")
                << c.text << ": " << call;
        }
    }
}

TEST_F(LivecameraTest, CloseUndoesWhatWasBuiltAndIsSafeTwice) {
    ASSERT_EQ(Start("px", 5, 6), 0);
    fake.journal.Clear();
    fake.log.Clear();
    Close_Video_Capture();
    EXPECT_EQ(fake.journal.Calls(), (Calls{"MediaRecorder::stop", "MediaRecorder::release",
                                           "Camera::lock", "PX_AOUT_Close(44)", "PX_AOUT_DeInit"}));
    EXPECT_EQ(fake.log.Texts("orvex:::livecamera"),
              (Calls{"Close_Video_Capture begin", "Close_Video_Capture begin--1",
                     "Close_Video_Capture begin--2", "Close_Video_Capture begin--3",
                     "Close_Video_Capture begin--4", "Close_Video_Capture begin--5",
                     "Close_Video_Capture begin--6", "Close_Video_Capture begin--7",
                     "Close_Video_Capture begin--8", "Close_Video_Capture begin--9",
                     "Close_Video_Capture begin--10", "reset_video_parameter"}));
    fake.journal.Clear();
    Close_Video_Capture();
    EXPECT_EQ(fake.journal.Calls(), (Calls{"PX_AOUT_Close(-1)", "PX_AOUT_DeInit"}));

    fake.results.Set("Camera::connect", 1);
    EXPECT_EQ(Start("sa", 5, 6), 1);
    fake.journal.Clear();
    Close_Video_Capture();  // after a failed connect: no recorder, no camera; the PIP client goes
    EXPECT_EQ(fake.journal.Calls(), Calls{"PipManager::disconnect"});
}

}  // namespace
