#include "rtsp/CaptureQuery.h"

#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"

namespace {

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
