#include "buffers/Buffer.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>

#include "buffers/cmnMemory.h"

namespace {

std::string Content(const Buffer& b) {
    return std::string(reinterpret_cast<const char*>(b.GetStart()), b.GetLength());
}
const unsigned char* U(const char* s) { return reinterpret_cast<const unsigned char*>(s); }

TEST(BufferTest, AppendGrowsToExactlyWhatIsNeededAndKeepsContent) {
    Buffer b;
    ASSERT_TRUE(b.AppendData(U("abc"), 3));
    EXPECT_EQ(b.GetCapacity(), 3u);
    ASSERT_TRUE(b.AppendData(U("defg"), 4));
    EXPECT_EQ(b.GetCapacity(), 7u);
    EXPECT_EQ(Content(b), "abcdefg");
    b.ClearData();
    ASSERT_TRUE(b.AppendData(U("xy"), 2));
    EXPECT_EQ(b.GetCapacity(), 7u);
    EXPECT_EQ(Content(b), "xy");
}

TEST(BufferTest, ExtendKeepsLargeEnoughStorageAndOtherwiseLosesContent) {
    Buffer b;
    ASSERT_TRUE(b.FillData(U("hello"), 5));
    unsigned char* storage = b.GetData();
    EXPECT_TRUE(b.ExtendBuffer(5));
    EXPECT_EQ(b.GetData(), storage);
    EXPECT_EQ(Content(b), "hello");
    EXPECT_TRUE(b.ExtendBuffer(64));
    EXPECT_EQ(b.GetCapacity(), 64u);
    EXPECT_EQ(b.GetLength(), 0u);
}

TEST(BufferTest, RewindCountsBytesWrittenAtTheStart) {
    Buffer b;
    ASSERT_TRUE(b.AllocateBuffer(16));
    memcpy(b.GetData(), "0123456789ab", 12);
    b.Rewind(12);
    ASSERT_TRUE(b.AppendData(U("cd"), 2));
    EXPECT_EQ(Content(b), "0123456789abcd");
    b.Rewind(100);
    EXPECT_EQ(b.GetLength(), 16u);
    b.FreeBuffer();
    EXPECT_EQ(b.GetData(), nullptr);
    EXPECT_EQ(b.GetLength(), 0u);
}

TEST(CmnMemoryTest, OperatorsWorkAndPrintTheirNames) {
    ::testing::internal::CaptureStdout();
    EXPECT_EQ(cmnMemAlloc(0, nullptr), 0x80000004u);
    VO_MEM_INFO info{};
    info.Size = 16;
    ASSERT_EQ(cmnMemAlloc(1, &info), 0u);
    ASSERT_NE(info.VBuffer, nullptr);
    EXPECT_EQ(cmnMemSet(1, info.VBuffer, 0xAB, 16), 0u);
    unsigned char copy[16];
    EXPECT_EQ(cmnMemCopy(1, copy, info.VBuffer, 16), 0u);
    EXPECT_EQ(copy[15], 0xAB);
    EXPECT_EQ(cmnMemCheck(1, info.VBuffer, 16), 0u);
    EXPECT_EQ(cmnMemFree(1, info.VBuffer), 0u);
    EXPECT_EQ(::testing::internal::GetCapturedStdout(),
              "orvex:::cmnMemmory__cmnMemAlloc\n"
              "orvex:::cmnMemmory__cmnMemAlloc\n"
              "orvex:::cmnMemmory__cmnMemSet\n"
              "orvex:::cmnMemmory__cmnMemCheck\n"
              "orvex:::cmnMemmory__cmnMemFree\n");
}

}  // namespace
