// A television build without the web viewer or the publisher: their properties, when set,
// are answered with one line each, and nothing else happens.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "platform/fake/FakePlatform.h"
#include "publish/Publisher.h"
#include "web/WebViewer.h"

namespace {

TEST(OptionalModulesTest, LeftOutModulesSayWhyOnceWhenAskedFor) {
    struct Case {
        const char* key;
        const char* value;
        const char* tag;
        std::vector<std::string> lines;
    } const cases[] = {
        {"kv.orvex.http", "", "orvex:::web", {}},
        {"kv.orvex.http",
         "8080",
         "orvex:::web",
         {"kv.orvex.http=8080: this build has no web viewer (docs/android.md says how to build "
          "it in); no port is opened"}},
        {"kv.orvex.publish", " \t", "orvex:::publish", {}},
        {"kv.orvex.publish",
         "rtmp://127.0.0.1/live/tv",
         "orvex:::publish",
         {"kv.orvex.publish is set, but this build has no publisher (docs/android.md says how "
          "to build it in); nothing is published"}},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(std::string(c.key) + "=" + c.value);
        platform::fake::FakePlatform fake;
        fake.properties.Set(c.key, c.value);
        const config::Settings settings = config::ReadSettings(fake.properties);
        StartWebViewer(settings, nullptr, nullptr);
        StartPublishing(settings, nullptr);
        StopPublishing();
        StopWebViewer();
        EXPECT_EQ(fake.log.Texts(c.tag), c.lines);
    }
}

}  // namespace
