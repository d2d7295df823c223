#include "base/OrvexLog.h"

#include <gtest/gtest.h>

#include "platform/fake/FakePlatform.h"

namespace {

class OrvexLogTest : public ::testing::Test {
protected:
    ~OrvexLogTest() override { g_orvex_debug_printf = 0; }
    platform::fake::FakePlatform fake;
};

TEST_F(OrvexLogTest, LogGoesToSystemBufferAtDebugPriority) {
    OrvexLog("orvex:::unit", "value %d,", 7);
    auto entries = fake.log.Entries();
    ASSERT_EQ(entries.size(), 1u);
    EXPECT_EQ(entries[0].buffer, 3);
    EXPECT_EQ(entries[0].priority, 3);
    EXPECT_EQ(entries[0].tag, "orvex:::unit");
    EXPECT_EQ(entries[0].text, "value 7,");
}

// What reaches stdout for each helper, with the debug switch off and on.
TEST_F(OrvexLogTest, StdoutMirrorFollowsTheSwitch) {
    struct Case {
        const char* name;
        void (*emit)();
        const char* off;
        const char* on;
    };
    const Case cases[] = {
        {"log", [] { OrvexLog("t", "a%s", "b"); }, "", "\nab\n"},
        {"print+log", [] { OrvexPrintLog("t", "ab"); }, "\nab\n", "\nab\n"},
        {"print", [] { OrvexPrint("%d", 5); }, "\n5\n", "\n5\n"},
        {"debug print", [] { OrvexDebugPrint("x"); }, "", "\nx\n"},
        {"puts", [] { OrvexPuts("\n t "); }, "\n t \n", "\n t \n"},
        {"debug puts", [] { OrvexDebugPuts("u"); }, "", "u\n"},
    };
    for (const Case& c : cases) {
        for (unsigned char on : {0, 1}) {
            g_orvex_debug_printf = on;
            ::testing::internal::CaptureStdout();
            c.emit();
            EXPECT_EQ(::testing::internal::GetCapturedStdout(), on ? c.on : c.off)
                << c.name << " switch " << int(on);
        }
    }
}

}  // namespace
