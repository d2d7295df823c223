#include "config/LivecameraResolution.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "config/DumpSwitches.h"
#include "config/livepipmanager.h"
#include "platform/fake/FakePlatform.h"

namespace {

using Calls = std::vector<std::string>;

class ResolutionRulesTest : public ::testing::Test {
protected:
    ResolutionRulesTest() {
        capture_state().flavour.Forget();
        reset_write_file_video();
        reset_write_pcm_file();
        reset_write_aac_file();
    }
    ~ResolutionRulesTest() override {
        closePipManager();
        capture_state().flavour.Forget();
    }
    int Set(unsigned dump_video = 0, unsigned dump_audio = 0, unsigned follow = 0) {
        return set_video_resolution_support_more(1280, 720, 5, 4, 23, dump_video, dump_audio,
                                                 follow, 25);
    }
    platform::fake::FakePlatform fake;
};

TEST_F(ResolutionRulesTest, TableOfAcceptedSizes) {
    struct Case {
        unsigned w, h;
        const char* board;
        int code;
    };
    const Case cases[] = {
        {640, 480, "android", 3},    {720, 576, "android", 0},   {320, 240, "android", 1},
        {480, 320, "android", 5},    {1280, 720, "android", 12}, {720, 480, "android", 2},
        {720, 400, "android", 9},    {320, 176, "android", 11},  {640, 368, "android", 10},
        {1920, 1080, "android", 13}, {1920, 1080, "tarvo", -1},  {1920, 1080, "tarvo2x", -1},
        {1920, 1080, "tarv", 13},    {640, 360, "android", -1},  {480, 640, "android", -1},
        {1280, 720, "tarvo", 12},
    };
    for (const Case& c : cases) {
        EXPECT_EQ(ResolutionCode(c.w, c.h, c.board), c.code) << c.w << "x" << c.h << " " << c.board;
    }
}

TEST_F(ResolutionRulesTest, AcceptedSizesAreListedForTheBoard) {
    EXPECT_EQ(AcceptedSizesText("linux-host"),
              "640x480, 720x576, 320x240, 480x320, 1280x720, 720x480, 720x400, 320x176, "
              "640x368, 1920x1080");
    EXPECT_EQ(AcceptedSizesText("tarvo9"),
              "640x480, 720x576, 320x240, 480x320, 1280x720, 720x480, 720x400, 320x176, "
              "640x368");
}

TEST_F(ResolutionRulesTest, RefusalsAreLoggedWithTheirTexts) {
    fake.properties.Set("ro.board.platform", "tarvo5");
    set_video_resolution_support_more(1920, 1080, 5, 6, 0, 0, 0, 0, 30);
    EXPECT_EQ(CheckCaptureResolution(), -1);
    set_video_resolution_support_more(640, 360, 5, 6, 0, 0, 0, 0, 30);
    EXPECT_EQ(CheckCaptureResolution(), -1);
    set_video_resolution_support_more(720, 576, 5, 6, 0, 0, 0, 0, 30);
    EXPECT_EQ(CheckCaptureResolution(), 0);
    std::vector<std::string> refusals;
    for (const std::string& t : fake.log.Texts("orvex:::livecamera")) {
        if (t.find("not support") != std::string::npos) refusals.push_back(t);
    }
    EXPECT_EQ(refusals,
              (Calls{"\n orvex not support resolution width=1920,height=1080 on chip of tarvo5,\n",
                     "\n orvex not support resolution width=640,height=360,\n"}));
}

TEST_F(ResolutionRulesTest, StoresTheRequestAndReadsTheSwitches) {
    fake.properties.Set("kv.orvex.log", "2");
    fake.properties.Set("kv.orvex.dumptosd", "abc");
    EXPECT_EQ(Set(1, 0, 1), 0);
    CaptureState& s = capture_state();
    unsigned w = 0, h = 0;
    get_video_resolution(&w, &h);
    EXPECT_EQ(w, 1280u);
    EXPECT_EQ(h, 720u);
    EXPECT_EQ(s.camera_id, 5u);
    EXPECT_EQ(s.traveling_mode, 4u);
    EXPECT_EQ(s.sub_input_type, 23u);
    EXPECT_EQ(s.frame_rate, 25u);
    EXPECT_EQ(g_follow_main_flag.load(), 1u);
    EXPECT_TRUE(s.log_switch);
    EXPECT_FALSE(s.dump_to_sd);
    EXPECT_STREQ(s.board, "android");
    EXPECT_EQ(get_write_file_video(), 1);
    EXPECT_EQ(get_write_pcm_file(), 0);
    EXPECT_EQ(Set(2, 1), 0);  // dumpvideo other than 1 leaves the switch as it was
    EXPECT_EQ(get_write_file_video(), 1);
    EXPECT_EQ(get_write_pcm_file(), 1);
    EXPECT_EQ(get_write_aac_file(), 1);
    auto logs = fake.log.Texts("orvex:::livecamera");
    ASSERT_GE(logs.size(), 2u);
    EXPECT_EQ(logs[0], "**********Orvex version::1.6.1.android.**********");
    EXPECT_EQ(logs[1], "******the platform is android******");
}

TEST_F(ResolutionRulesTest, PipListenerOnlyOnTheSaFlavour) {
    struct Case {
        const char* flavour;
        bool connectable;
        int listener_result;
        int result;
        Calls calls;
    };
    const Case cases[] = {
        {"sa", true, 0, 0, {"PipManager::connect", "PipManager::setListener"}},
        {"sa", true, -38, -38, {"PipManager::connect", "PipManager::setListener"}},
        {"sa", false, 0, 0, {"PipManager::connect"}},
        {"px", true, 0, 0, {}},
        {"SA", true, 0, 0, {}},
        {"", true, 0, 0, {}},
    };
    for (const Case& c : cases) {
        capture_state().flavour.Forget();
        fake.journal.Clear();
        fake.log.Clear();
        fake.properties.Set("kelvo.build.kelvotv", c.flavour);
        fake.pip_manager.set_connectable(c.connectable);
        fake.pip_manager.set_listener_result(c.listener_result);
        g_pip_stop_flag = 1;
        EXPECT_EQ(Set(), c.result) << c.flavour;
        EXPECT_EQ(fake.journal.Calls(), c.calls) << c.flavour;
        bool registered = c.calls.size() == 2;
        EXPECT_EQ(g_pip_stop_flag.load(), registered ? 0u : 1u) << c.flavour;
        auto logs = fake.log.Texts("orvex:::livecamera");
        bool failed_logged =
            std::find(logs.begin(), logs.end(),
                      "[PipListener]mPipManager_client->setListener failed") != logs.end();
        EXPECT_EQ(failed_logged, c.result != 0) << c.flavour;
        closePipManager();
    }
    // The registered listener is the service's: an event raises the stop flag.
    fake.properties.Set("kelvo.build.kelvotv", "sa");
    capture_state().flavour.Forget();
    fake.pip_manager.set_connectable(true);
    fake.pip_manager.set_listener_result(0);
    ASSERT_EQ(Set(), 0);
    fake.pip_manager.DeliverEvent(1);
    EXPECT_EQ(g_pip_stop_flag.load(), 1u);
}

}  // namespace
