// AAC frames stamped by their samples: 1024 samples at 48 kHz are 21.33 ms, so the stamps step
// by 21 or 22 ms (1008 or 1056 RTP ticks) however unevenly the frames are handed over.
#include <gtest/gtest.h>

#include <vector>

#include "capture/AudioSampleClock.h"

namespace {

struct Case {
    const char* what;
    std::vector<uint32_t> now;     // when each frame is handed over
    std::vector<uint32_t> stamps;  // what it is stamped with
};

TEST(AudioSampleClockTest, StampsFollowTheSamplesAndReanchorOnDrift) {
    const Case cases[] = {
        {"blocks of 20 ms: frames come 0, 1 or 2 at a time",
         {1000, 1020, 1040, 1040, 1080, 1100, 1100, 1140},
         {1000, 1021, 1042, 1064, 1085, 1106, 1128, 1149}},
        {"a late hand-over moves nothing", {5000, 5150, 5150, 5150}, {5000, 5021, 5042, 5064}},
        {"more than 200 ms apart: the system's clock is taken again",
         {7000, 7021, 7300, 7321},
         {7000, 7021, 7300, 7321}},
        {"the millisecond clock wraps",
         {0xFFFFFFF0u, 0xFFFFFFF0u + 21, 0xFFFFFFF0u + 43},
         {0xFFFFFFF0u, 5, 26}},
        {"a stamp of 0 would mean write time: it is 1", {0, 21}, {1, 21}},
    };
    for (const Case& c : cases) {
        AudioSampleClock clock(48000, 1024);
        std::vector<uint32_t> stamps;
        for (uint32_t now : c.now) stamps.push_back(clock.Next(now));
        EXPECT_EQ(stamps, c.stamps) << c.what;
    }
}

}  // namespace
