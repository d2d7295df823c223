#include "config/GlobalConfig.h"

#include <gtest/gtest.h>

#include <ctime>
#include <string>
#include <thread>
#include <vector>

#include "platform/fake/FakePlatform.h"

namespace {

class GlobalConfigTest : public ::testing::Test {
protected:
    GlobalConfigTest() { Global_Config::CloseInstance(); }
    ~GlobalConfigTest() override { Global_Config::CloseInstance(); }
    platform::fake::FakePlatform fake;
};

// Input is ready once both clock rates were configured, whichever came first.
TEST_F(GlobalConfigTest, ReadinessInEitherOrder) {
    for (bool audio_first : {true, false}) {
        Global_Config::CloseInstance();
        Global_Config* c = Global_Config::instance();
        if (audio_first)
            c->mp3_config_ok();
        else
            c->h264_config_frequency_ok();
        EXPECT_FALSE(c->InIISOK()) << audio_first;
        if (audio_first)
            c->h264_config_frequency_ok();
        else
            c->mp3_config_ok();
        EXPECT_TRUE(c->InIISOK()) << audio_first;
    }
}

std::vector<std::string> g_calls;
int VideoOpen() {
    g_calls.push_back("video open");
    return 0;
}
int AudioOpen() {
    g_calls.push_back("audio open");
    return 0;
}
int VideoClose() {
    g_calls.push_back("video close");
    return 0;
}
int AudioClose() {
    g_calls.push_back("audio close");
    return 0;
}

TEST_F(GlobalConfigTest, CallbacksRunVideoFirstAndAreLostWithTheInstance) {
    g_calls.clear();
    Global_Config* c = Global_Config::instance();
    c->register_audio_open_thread_func(AudioOpen);
    c->register_video_open_thread_func(VideoOpen);
    c->register_audio_close_thread_func(AudioClose);
    c->register_video_close_thread_func(VideoClose);
    c->m_video_rtp_frequency = 90000;
    c->video_audio_open_cap();
    c->video_audio_close_cap();
    EXPECT_EQ(g_calls,
              (std::vector<std::string>{"video open", "audio open", "video close", "audio close"}));

    Global_Config::CloseInstance();
    g_calls.clear();
    Global_Config* fresh = Global_Config::instance();
    EXPECT_EQ(fresh->m_video_rtp_frequency, 0u);
    fresh->video_audio_open_cap();  // nothing registered: nothing runs, nothing breaks
    fresh->video_audio_close_cap();
    EXPECT_TRUE(g_calls.empty());
}

TEST_F(GlobalConfigTest, SettersLogFixedTexts) {
    Global_Config* c = Global_Config::instance();
    fake.log.Clear();
    c->set_pause_stat(true);
    c->set_sub_stat(true);
    EXPECT_TRUE(c->isPause());
    EXPECT_TRUE(c->isSub());
    EXPECT_EQ(fake.log.Texts("globalconfig"),
              (std::vector<std::string>{"m_flag_run_pause = pausestat", "m_flag_sub = sub"}));
}

// kv.orvex.audiopt: a number from 96 to 127 is taken; anything else is logged once and 98
// stays. An empty value reads as unset, as property_get gives it.
TEST_F(GlobalConfigTest, AudioPayloadTypeProperty) {
    const std::string bad = "\" is not a payload type from 96 to 127; audio RTP keeps 98";
    struct Case {
        const char* value;  // null: the property is missing
        int32_t payload_type;
        std::vector<std::string> log;
    } cases[] = {
        {nullptr, 98, {}},
        {"97", 97, {}},
        {"98", 98, {}},
        {"127", 127, {}},
        {"", 98, {}},
        {"128", 98, {"kv.orvex.audiopt=\"128" + bad}},
        {"95", 98, {"kv.orvex.audiopt=\"95" + bad}},
        {"abc", 98, {"kv.orvex.audiopt=\"abc" + bad}},
        {"97x", 98, {"kv.orvex.audiopt=\"97x" + bad}},
    };
    for (const Case& c : cases) {
        fake.properties.Clear();
        if (c.value != nullptr) fake.properties.Set("kv.orvex.audiopt", c.value);
        fake.log.Clear();
        Global_Config* config = Global_Config::instance();
        config->m_audio_payload_type = 0;
        config->Apply(config::ReadSettings(fake.properties));
        EXPECT_EQ(config->m_audio_payload_type, c.payload_type) << (c.value ? c.value : "missing");
        EXPECT_EQ(fake.log.Texts("globalconfig"), c.log) << (c.value ? c.value : "missing");
    }
}

// The two-way switches: kv.orvex.wake ("event" makes idle loops wait for writes),
// kv.orvex.latency ("1" turns on the video sender's report), kv.orvex.audioclock
// ("samples" stamps audio by its samples) and kv.orvex.aacenc ("inline" encodes in the reader).
// Anything but the two values or unset is logged once and leaves the switch off, as on the
// television.
TEST_F(GlobalConfigTest, SwitchProperties) {
    struct Case {
        const char* key;
        const char* value;  // null: the property is missing
        bool on;
        std::vector<std::string> log;
    } cases[] = {
        {"kv.orvex.wake", nullptr, false, {}},
        {"kv.orvex.wake", "", false, {}},
        {"kv.orvex.wake", "poll", false, {}},
        {"kv.orvex.wake", "event", true, {}},
        {"kv.orvex.wake",
         "Event",
         false,
         {"kv.orvex.wake=\"Event\" is neither poll nor event; idle loops keep polling"}},
        {"kv.orvex.wake",
         "event ",
         false,
         {"kv.orvex.wake=\"event \" is neither poll nor event; idle loops keep polling"}},
        {"kv.orvex.latency", nullptr, false, {}},
        {"kv.orvex.latency", "0", false, {}},
        {"kv.orvex.latency", "1", true, {}},
        {"kv.orvex.latency",
         "yes",
         false,
         {"kv.orvex.latency=\"yes\" is neither 0 nor 1; no latency report"}},
        {"kv.orvex.audioclock", nullptr, false, {}},
        {"kv.orvex.audioclock", "write", false, {}},
        {"kv.orvex.audioclock", "samples", true, {}},
        {"kv.orvex.audioclock",
         "sample",
         false,
         {"kv.orvex.audioclock=\"sample\" is neither write nor samples; audio is stamped at "
          "write time"}},
        {"kv.orvex.aacenc", nullptr, false, {}},
        {"kv.orvex.aacenc", "thread", false, {}},
        {"kv.orvex.aacenc", "inline", true, {}},
        {"kv.orvex.aacenc",
         "in-line",
         false,
         {"kv.orvex.aacenc=\"in-line\" is neither thread nor inline; the encoder keeps its own "
          "thread"}},
    };
    for (const Case& c : cases) {
        const std::string what = std::string(c.key) + "=" + (c.value ? c.value : "(missing)");
        fake.properties.Clear();
        if (c.value != nullptr) fake.properties.Set(c.key, c.value);
        fake.log.Clear();
        Global_Config* config = Global_Config::instance();
        config->Apply(config::ReadSettings(fake.properties));
        const std::string key = c.key;
        EXPECT_EQ(config->wake_on_write(), key == "kv.orvex.wake" && c.on) << what;
        EXPECT_EQ(config->run_flag_poll_us(), key == "kv.orvex.wake" && c.on ? 1000000u : 10000u)
            << what;
        EXPECT_EQ(config->report_latency(), key == "kv.orvex.latency" && c.on) << what;
        EXPECT_EQ(config->audio_clock_samples(), key == "kv.orvex.audioclock" && c.on) << what;
        EXPECT_EQ(config->aac_inline(), key == "kv.orvex.aacenc" && c.on) << what;
        EXPECT_EQ(fake.log.Texts("globalconfig"), c.log) << what;
    }
}

TEST_F(GlobalConfigTest, ConcurrentFirstUseCreatesOneObject) {
    Global_Config::CloseInstance();
    std::vector<Global_Config*> seen(4);
    std::vector<std::thread> threads;
    for (int i = 0; i < 4; ++i)
        threads.emplace_back([&, i] { seen[i] = Global_Config::instance(); });
    for (auto& t : threads) t.join();
    for (Global_Config* p : seen) EXPECT_EQ(p, seen[0]);
}

TEST(Clocks, MillisecondsWrapModulo2To32) {
    EXPECT_EQ(MillisecondsOf(0, 999999), 0u);
    EXPECT_EQ(MillisecondsOf(1, 2500000), 1002u);
    EXPECT_EQ(MillisecondsOf(4294967, 295000000), 4294967295u);
    EXPECT_EQ(MillisecondsOf(4294967, 296000000), 0u);
    EXPECT_EQ(MillisecondsOf(4294968, 0), 704u);
}

// The heartbeat is read from /proc/uptime's text: it must agree with the boot-time clock that
// file reports, to the second.
TEST(Clocks, HeartbeatIsTheBootTimeInWholeSeconds) {
    timespec before{}, after{};
    clock_gettime(CLOCK_BOOTTIME, &before);
    unsigned heartbeat = GetTimeHeartbeatSec();
    clock_gettime(CLOCK_BOOTTIME, &after);
    EXPECT_GE(heartbeat + 1, static_cast<unsigned>(before.tv_sec));
    EXPECT_LE(heartbeat, static_cast<unsigned>(after.tv_sec));
}

}  // namespace
