#include "rtp/SendLoopState.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace {

// Feeds items through Admit; `paused` lists the item numbers (1-based) seen while paused.
std::string Verdicts(int items, std::vector<int> paused) {
    H264SendState s;
    std::string out;
    for (int i = 1; i <= items; ++i) {
        bool p = std::find(paused.begin(), paused.end(), i) != paused.end();
        out += s.Admit(p) == H264SendState::kSend ? 'S' : '-';
    }
    return out;
}

TEST(H264SendStateTest, PositionZeroAtTheThirdItemThenEvery21st) {
    H264SendState s;
    std::vector<unsigned> zeros;
    for (unsigned i = 1; i <= 70; ++i) {
        s.Admit(false);
        if (s.position() == 0) zeros.push_back(i);
    }
    EXPECT_EQ(zeros, (std::vector<unsigned>{3, 24, 45, 66}));
}

TEST(H264SendStateTest, AfterAPauseSendingRestartsAtAPositionZeroItem) {
    const std::pair<std::vector<int>, std::string> cases[] = {
        {{}, "SSSSS"},
        {{1}, "--SSS"},                        // item 3 is the first position 0
        {{2, 3}, "S----------------------S"},  // item 3 was paused; next zero is 24
        {{24}, "SSSSSSSSSSSSSSSSSSSSSSS---------------------S"},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(Verdicts(static_cast<int>(c.second.size()), c.first), c.second);
    }
}

TEST(H264SendStateTest, VideoWaitsWhen251MsAheadAfterTwoItems) {
    H264SendState s;
    uint16_t seq = 0;
    EXPECT_FALSE(s.MustWaitForAudio(5000, 0));  // not before two items were sent
    s.AfterSend(&seq);
    s.AfterSend(&seq);
    EXPECT_FALSE(s.MustWaitForAudio(1250, 1000));
    EXPECT_TRUE(s.MustWaitForAudio(1251, 1000));
    EXPECT_FALSE(s.MustWaitForAudio(1000, 4000));       // behind: never waits
    EXPECT_TRUE(s.MustWaitForAudio(200, 4294967000u));  // across the 32-bit wrap
    EXPECT_TRUE(s.TakeFirstItem());
    EXPECT_FALSE(s.TakeFirstItem());
}

TEST(SendStateTest, SequenceWraps) {
    H264SendState video;
    uint16_t seq = 65424;
    video.AfterSend(&seq);
    EXPECT_EQ(seq, 65424);
    seq = 65425;
    video.AfterSend(&seq);
    EXPECT_EQ(seq, 1);
    AacSendState audio;
    seq = 65532;
    audio.AfterSend(&seq);
    EXPECT_EQ(seq, 65533);
    audio.AfterSend(&seq);
    EXPECT_EQ(seq, 0);
}

TEST(SendStateTest, TimestampsFollowItemTimes) {
    struct Step {
        uint32_t item_ms;
        uint32_t ts;
    };
    const Step steps[] = {
        {1000, 90000},                 // from 0: the whole gap
        {1000, 90000},                 // the same millisecond: the same timestamp
        {1033, 92970}, {1020, 92970},  // time went back: unchanged...
        {1040, 94770},                 // ...and counted from the earlier time
    };
    uint32_t ts = 0, last = 0;
    for (const Step& s : steps) {
        AdvanceTimestamp(&ts, 90000, s.item_ms, &last);
        EXPECT_EQ(ts, s.ts) << s.item_ms;
        EXPECT_EQ(last, s.item_ms);
    }
    EXPECT_EQ(PositionMs(94770, 90000), 1053u);
    EXPECT_EQ(PositionMs(48000, 48000), 1000u);
    EXPECT_EQ(PositionMs(12345, 0), 0u);
}

// Long gaps (a stalled source, a clock that wrapped) move the time stamp modulo 2^32, as RTP
// time stamps wrap, rather than overflowing the conversion.
TEST(SendStateTest, LongGapsWrapTheTimestamp) {
    struct Case {
        uint32_t ts, last_ms, item_ms;
        unsigned rate;
        uint32_t expected;
    };
    const Case cases[] = {
        {0, 0, 47721858, 90000, 4294967220u},  // 13.3 hours: just below 2^32
        {0, 0, 47721859, 90000, 14u},          // 4294967310 - 2^32
        {100, 0, 4294967295u, 90000, 10u},     // 49.7 days at 90 kHz
        {0, 0, 4294967295u, 4294967295u, 1262720384u},
    };
    for (const Case& c : cases) {
        uint32_t ts = c.ts, last = c.last_ms;
        AdvanceTimestamp(&ts, c.rate, c.item_ms, &last);
        EXPECT_EQ(ts, c.expected) << c.item_ms << " ms at " << c.rate;
    }
    EXPECT_EQ(PositionMs(4294967295u, 1), 4294966296u);  // 4294967295000 mod 2^32
}

}  // namespace
