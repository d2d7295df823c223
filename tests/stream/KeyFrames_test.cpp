// Key frames asked for by joining viewers: spaced so that a crowd joining costs one.
#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"
#include "stream/KeyFrames.h"

namespace {

TEST(KeyFramesTest, RequestsAreSpacedHalfASecondApart) {
    const struct {
        uint64_t now;
        bool due;
    } steps[] = {
        {1000, true},  {1499, false}, {1500, true}, {1501, false},
        {1999, false}, {2000, true},  {6000, true}, {6499, false},
    };
    uint64_t last = 0;
    for (const auto& s : steps) EXPECT_EQ(stream::KeyFrameDue(s.now, &last), s.due) << s.now;
}

TEST(KeyFramesTest, AskingGoesToThePlatformsRecorder) {
    platform::fake::FakePlatform fake;
    const bool asked = stream::AskForKeyFrame();
    EXPECT_EQ(fake.media_recorder.key_frame_requests.load(), asked ? 1 : 0);
    EXPECT_FALSE(stream::AskForKeyFrame()) << "a second request at once is spaced out";
    EXPECT_LE(fake.media_recorder.key_frame_requests.load(), 1);
}

}  // namespace
