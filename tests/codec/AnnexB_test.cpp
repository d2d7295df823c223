#include "codec/AnnexB.h"

#include <gtest/gtest.h>

#include <vector>

namespace {

using Bytes = std::vector<uint8_t>;

TEST(AnnexBTest, StartCodesFoundWhereverTheyAre) {
    struct Case {
        const char* name;
        Bytes data;
        size_t from, three, four;  // FindStartCode, FindFourByteStartCode
    };
    const Case cases[] = {
        {"four-byte at the front", {0, 0, 0, 1, 0x65}, 0, 1, 0},
        {"three-byte at the front", {0, 0, 1, 0x65}, 0, 0, 4},
        {"after a payload", {0x65, 0x88, 0, 0, 1, 0x41}, 0, 2, 6},
        {"from past the first", {0, 0, 0, 1, 0x67, 0, 0, 0, 1, 0x68}, 2, 6, 5},
        {"emulation prevented", {0x65, 0, 0, 3, 1, 0, 0, 2}, 0, 8, 8},
        {"cut short", {0, 0}, 0, 2, 2},
        {"empty", {}, 0, 0, 0},
        {"zero run before the code", {0, 0, 0, 0, 0, 1, 9}, 0, 3, 2},
        {"from beyond the end", {0, 0, 1}, 7, 3, 3},
    };
    for (const Case& c : cases) {
        EXPECT_EQ(FindStartCode(c.data.data(), c.data.size(), c.from), c.three) << c.name;
        EXPECT_EQ(FindFourByteStartCode(c.data.data(), c.data.size(), c.from), c.four) << c.name;
    }
    const std::pair<Bytes, size_t> lengths[] = {
        {{0, 0, 0, 1}, 4}, {{0, 0, 1}, 3}, {{0, 0, 0}, 0}, {{0, 1}, 0}, {{1, 0, 0, 1}, 0},
    };
    for (const auto& l : lengths)
        EXPECT_EQ(StartCodeLength(l.first.data(), l.first.size()), l.second);
}

}  // namespace
