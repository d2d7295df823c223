#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "config/PlatformFlavour.h"
#include "config/livepipmanager.h"
#include "config/orvexPIPCfg.h"
#include "platform/fake/FakePlatform.h"

namespace {

using Calls = std::vector<std::string>;

class PipTest : public ::testing::Test {
protected:
    PipTest() {
        g_pip_stop_flag = 0;
        g_follow_main_flag = 0;
    }
    ~PipTest() override { closePipManager(); }
    platform::fake::FakePlatform fake;
};

// Each case: flags before, the events delivered, flags after.
TEST_F(PipTest, EventsRaiseStopAndFastQuitClearsFollowMain) {
    struct Case {
        const char* name;
        std::vector<int> events;
        unsigned stop_after;
        unsigned follow_after;
        std::vector<std::string> logs;
    };
    const Case cases[] = {
        {"unsupported",
         {1},
         1,
         1,
         {"PipListener::dataCallback ----->EV_TRAVELING_CALLBACK_UNSUPPORT"}},
        {"other type ignored", {2}, 0, 1, {}},
        {"fast quit",
         {3},
         1,
         0,
         {"PipListener::dataCallback ----->EV_TRAVELING_CALLBACK_TVOS_FAST_QUIT"}},
        {"fast quit after unsupported",
         {1, 3},
         1,
         0,
         {"PipListener::dataCallback ----->EV_TRAVELING_CALLBACK_UNSUPPORT",
          "PipListener::dataCallback ----->EV_TRAVELING_CALLBACK_TVOS_FAST_QUIT"}},
    };
    for (const Case& c : cases) {
        g_pip_stop_flag = 0;
        g_follow_main_flag = 1;
        fake.log.Clear();
        PipListener listener;
        for (int e : c.events) listener.eventCallback(e);
        EXPECT_EQ(g_pip_stop_flag.load(), c.stop_after) << c.name;
        EXPECT_EQ(g_follow_main_flag.load(), c.follow_after) << c.name;
        EXPECT_EQ(fake.log.Texts("orvex:::livecamera"), c.logs) << c.name;
    }
}

TEST_F(PipTest, OpenHoldsAClientAndCloseDisconnectsIt) {
    EXPECT_EQ(openPipManager(), 0);
    EXPECT_NE(PipManagerClientHeld(), nullptr);
    closePipManager();
    EXPECT_EQ(PipManagerClientHeld(), nullptr);
    EXPECT_EQ(fake.journal.Calls(), (Calls{"PipManager::connect", "PipManager::disconnect"}));
    EXPECT_EQ(fake.log.Texts("orvex:::livepipmanager"),
              (Calls{"openPipManager", "closePipManager begin", "closePipManager end"}));
}

TEST_F(PipTest, OpenFailsWhenTheManagerCannotBeReached) {
    fake.pip_manager.set_connectable(false);
    EXPECT_EQ(openPipManager(), -1);
    EXPECT_EQ(PipManagerClientHeld(), nullptr);
    EXPECT_EQ(fake.log.Texts("orvex:::livepipmanager"),
              (Calls{"openPipManager", "can't get pip manager"}));
}

TEST_F(PipTest, CloseWithoutClientOnlyLogs) {
    closePipManager();
    EXPECT_TRUE(fake.journal.Calls().empty());
    EXPECT_EQ(fake.log.Texts("orvex:::livepipmanager"),
              (Calls{"closePipManager begin", "closePipManager end"}));
}

TEST_F(PipTest, ListenerRegisteredThroughTheClientReceivesPlatformEvents) {
    ASSERT_EQ(openPipManager(), 0);
    ASSERT_EQ(PipManagerClientHeld()->setListener(std::make_shared<PipListener>()), 0);
    fake.pip_manager.DeliverEvent(1);
    EXPECT_EQ(g_pip_stop_flag.load(), 1u);
}

TEST_F(PipTest, FlavourPropertyIsExactAndUnknownIsLookedUpAgain) {
    const std::pair<const char*, PlatformFlavour> cases[] = {
        {"sa", kFlavourSa},      {"px", kFlavourPx},    {"dqx", kFlavourDqx},
        {"SA", kFlavourUnknown}, {"", kFlavourUnknown}, {"sa ", kFlavourUnknown}};
    for (const auto& c : cases) {
        fake.properties.Set("kelvo.build.kelvotv", c.first);
        EXPECT_EQ(ReadPlatformFlavour(), c.second) << '"' << c.first << '"';
    }
    PlatformFlavourCache cache;
    fake.properties.Set("kelvo.build.kelvotv", "bogus");
    EXPECT_EQ(cache.Get(), kFlavourUnknown);
    fake.properties.Set("kelvo.build.kelvotv", "px");
    EXPECT_EQ(cache.Get(), kFlavourPx);
    fake.properties.Set("kelvo.build.kelvotv", "sa");
    EXPECT_EQ(cache.Get(), kFlavourPx);  // a known flavour stays cached
}

}  // namespace
