#include "rtsp/CaptureQuery.h"

#include <gtest/gtest.h>

#include "config/LivecameraResolution.h"
#include "platform/fake/FakePlatform.h"

namespace {

const std::string kAll =
    "?width=1280&height=720&cameraid=hd0&win=main&sub=0&dumpvideo=0&dumpaudio=0&specialcase=none"
    "&framerate=30";

// What a consumer beside RTSP asks for, as the capture applies it: any subset of the keys, in
// any order, or none; the rest as tools/run.sh's URL has them.
TEST(CaptureQueryTest, ConsumerQueriesChooseTheCaptureWithAnySubsetOfKeys) {
    platform::fake::FakePlatform fake;
    struct Case {
        const char* name;
        const char* query;
        unsigned width, height, camera, window, sub, frame_rate;
    };
    const Case cases[] = {
        {"no query", "", 1280, 720, 5, 6, 0, 30},
        {"a bare mark", "?", 1280, 720, 5, 6, 0, 30},
        {"size and rate", "?width=640&height=480&framerate=30", 640, 480, 5, 6, 0, 30},
        {"rate first", "?framerate=15&width=320&height=240", 320, 240, 5, 6, 0, 15},
        {"one key", "?width=720", 720, 720, 5, 6, 0, 30},
        {"the sub window", "?win=sub&cameraid=hd1", 1280, 720, 6, 4, 0, 30},
        {"'sub' as a value before sub=", "?win=sub&sub=2", 1280, 720, 5, 4, 2, 30},
        {"a key inside another name", "?xwidth=1&subx=9&width=640", 640, 720, 5, 6, 0, 30},
        {"empty values", "?width=&height=&framerate=", 1280, 720, 5, 6, 0, 30},
        {"all nine", kAll.c_str(), 1280, 720, 5, 6, 0, 30},
        {"unknown keys only", "?t=123&foo=bar", 1280, 720, 5, 6, 0, 30},
    };
    for (const Case& c : cases) {
        ASSERT_EQ(ApplyCaptureQuery(CaptureQueryFor(c.query)), CaptureQueryResult::kApplied)
            << c.name;
        const CaptureState& s = capture_state();
        EXPECT_EQ(s.width, c.width) << c.name;
        EXPECT_EQ(s.height, c.height) << c.name;
        EXPECT_EQ(s.camera_id, c.camera) << c.name;
        EXPECT_EQ(s.traveling_mode, c.window) << c.name;
        EXPECT_EQ(s.sub_input_type, c.sub) << c.name;
        EXPECT_EQ(s.frame_rate, c.frame_rate) << c.name;
    }
}

// An RTSP URL must carry every key; the first one missing is named.
TEST(CaptureQueryTest, TheFirstMissingKeyIsNamed) {
    platform::fake::FakePlatform fake;
    struct Case {
        std::string query;
        const char* missing;
    };
    const Case cases[] = {
        {"?height=720&cameraid=hd0&win=main&sub=0&dumpvideo=0&dumpaudio=0&specialcase=none"
         "&framerate=30",
         "width="},
        {"?width=1280&height=720&win=main&sub=0&dumpvideo=0&dumpaudio=0&specialcase=none",
         "cameraid="},
        {"?width=1280&height=720&cameraid=hd0&win=sub&dumpvideo=0&dumpaudio=0&specialcase=none"
         "&framerate=30",
         "sub="},
        {"", "width="},
    };
    for (const Case& c : cases) {
        std::string missing;
        EXPECT_EQ(ApplyCaptureQuery(c.query, &missing), CaptureQueryResult::kMissingKey) << c.query;
        EXPECT_EQ(missing, c.missing) << c.query;
    }
}

}  // namespace
