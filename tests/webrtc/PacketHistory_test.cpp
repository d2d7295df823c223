#include "webrtc/PacketHistory.h"

#include <gtest/gtest.h>

#include <vector>

namespace webrtc {
namespace {

TEST(PacketHistoryTest, KeepsTheLastSlotsWorthBySequenceAcrossTheWrap) {
    PacketHistory history;
    const uint8_t* packet = nullptr;
    size_t len = 0;
    EXPECT_FALSE(history.Find(0, &packet, &len)) << "nothing kept yet";
    // 600 packets from 65300 on: the sequence wraps at 65536, the first 88 are overwritten.
    for (unsigned i = 0; i < 600; ++i) {
        const uint16_t sequence = static_cast<uint16_t>(65300 + i);
        std::vector<uint8_t> bytes(100 + i % 7, static_cast<uint8_t>(i));
        history.Keep(sequence, bytes.data(), bytes.size());
    }
    struct Case {
        uint16_t sequence;
        bool kept;
        size_t len;
        uint8_t first;
    } cases[] = {
        {65300, false, 0, 0},  // 512 later, its slot holds another
        {65387, false, 0, 0},  // the last one overwritten
        {65388, true, 100 + 88 % 7, 88},
        {65535, true, 100 + 235 % 7, 235},
        {0, true, 100 + 236 % 7, 236},                          // across the wrap
        {363, true, 100 + 599 % 7, static_cast<uint8_t>(599)},  // the latest
        {364, false, 0, 0},  // not sent yet: its slot holds an older sequence
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.sequence);
        EXPECT_EQ(history.Find(c.sequence, &packet, &len), c.kept);
        if (!c.kept) continue;
        EXPECT_EQ(len, c.len);
        EXPECT_EQ(packet[0], c.first);
    }
    // A packet larger than a slot is not kept, and leaves the slot's older packet alone.
    std::vector<uint8_t> huge(PacketHistory::kSlotBytes + 1, 1);
    history.Keep(363, huge.data(), huge.size());
    ASSERT_TRUE(history.Find(363, &packet, &len));
    EXPECT_EQ(len, 100u + 599 % 7);
}

}  // namespace
}  // namespace webrtc
