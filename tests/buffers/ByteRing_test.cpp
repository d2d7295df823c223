#include "buffers/ByteRing.h"

#include <gtest/gtest.h>

#include <string>

namespace {

// What a ring of 8 bytes holds after writing `text` at `at` on top of "abcdefgh" at 0, and what
// reading it back at `at` gives.
TEST(ByteRingTest, CopiesWrapAtTheEndOfTheStorage) {
    struct Case {
        const char* name;
        uint64_t at;
        std::string text;
        std::string storage;
    };
    const Case cases[] = {
        {"inside", 2, "XY", "abXYefgh"},
        {"up to the end", 5, "XYZ", "abcdeXYZ"},
        {"across the end", 6, "XYZ", "ZbcdefXY"},
        {"whole ring from the middle", 4, "ABCDEFGH", "EFGHABCD"},
        {"far past 4 GiB", (uint64_t{1} << 32) * 8 + 7, "XY", "YbcdefxX"},
    };
    for (const Case& c : cases) {
        ByteRing ring(8);
        ring.Put(0, "abcdefgh", 8);
        if (c.at > 8) ring.Put(c.at - 1, "x", 1);
        ring.Put(c.at, c.text.data(), c.text.size());
        std::string storage(8, '\0');
        ring.Get(0, &storage[0], 8);
        EXPECT_EQ(storage, c.storage) << c.name;
        std::string back(c.text.size(), '\0');
        ring.Get(c.at, &back[0], back.size());
        EXPECT_EQ(back, c.text) << c.name;
    }
}

TEST(ByteRingTest, AReaderIsOverrunOnlyWhenTheWriterIsMoreThanTheRingAhead) {
    ByteRing ring(100);
    EXPECT_FALSE(ring.Overrun(100, 0));
    EXPECT_TRUE(ring.Overrun(101, 0));
    EXPECT_FALSE(ring.Overrun(uint64_t{5} << 40, (uint64_t{5} << 40) - 100));
}

}  // namespace
