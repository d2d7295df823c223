#include "rtp/FrameLatency.h"

#include <gtest/gtest.h>

#include <string>

namespace {

// Frame i of a window waits wait(i) ms and takes send(i) us; the line comes with the 300th
// frame and covers only that window.
TEST(FrameLatency, OneLinePerWindowWithMedianAndMaximum) {
    struct Case {
        uint32_t (*wait)(size_t);
        uint32_t (*send)(size_t);
        const char* line;
    } cases[] = {
        {[](size_t) { return 4u; }, [](size_t) { return 900u; },
         "latency of the last 300 frames: ring wait p50 4 ms, max 4 ms; sending p50 900 us, "
         "max 900 us"},
        // 0..299 in reverse: the upper of the two middle values, and the largest.
        {[](size_t i) { return static_cast<uint32_t>(299 - i); },
         [](size_t i) { return static_cast<uint32_t>(1000 + i); },
         "latency of the last 300 frames: ring wait p50 150 ms, max 299 ms; sending p50 1150 "
         "us, max 1299 us"},
        // One slow frame moves the maximum, not the median.
        {[](size_t i) { return i == 7 ? 4000u : 2u; },
         [](size_t i) { return i == 299 ? 70000u : 50u; },
         "latency of the last 300 frames: ring wait p50 2 ms, max 4000 ms; sending p50 50 us, "
         "max 70000 us"},
    };
    FrameLatency latency;
    for (const Case& c : cases) {
        char line[160] = "untouched";
        for (size_t i = 0; i + 1 < FrameLatency::kFrames; ++i) {
            ASSERT_FALSE(latency.Add(c.wait(i), c.send(i), line, sizeof line)) << i;
        }
        EXPECT_STREQ(line, "untouched");
        size_t last = FrameLatency::kFrames - 1;
        ASSERT_TRUE(latency.Add(c.wait(last), c.send(last), line, sizeof line));
        EXPECT_EQ(std::string(line), c.line);
    }
}

TEST(FrameLatency, ShortBufferGetsACutLine) {
    FrameLatency latency;
    char line[12];
    for (size_t i = 0; i + 1 < FrameLatency::kFrames; ++i) latency.Add(1, 1, line, sizeof line);
    ASSERT_TRUE(latency.Add(1, 1, line, sizeof line));
    EXPECT_EQ(std::string(line), "latency of ");
}

}  // namespace
