// The host's publishing port keeps FFmpeg out of the process until a server is published to,
// and says why when its module cannot be loaded.
#include <gtest/gtest.h>

#include <cstdlib>
#include <fstream>
#include <string>

#include "platform/host/publish/HostPublish.h"

namespace {

bool Mapped(const std::string& part) {
    std::ifstream maps("/proc/self/maps");
    std::string line;
    while (std::getline(maps, line)) {
        if (line.find(part) != std::string::npos) return true;
    }
    return false;
}

TEST(HostPublishTest, LibavformatIsMappedOnlyOnceAServerIsPublishedTo) {
    platform::PublishTarget target;
    target.url = "rtmp://127.0.0.1:1/live/tv";  // nobody listens on port 1
    target.container = "flv";
    target.sps = {0x67, 0x42, 0xc0, 0x1f, 0x8c, 0x8d, 0x40, 0x28, 0x02, 0xdd, 0x35};
    target.pps = {0x68, 0xce, 0x3c, 0x80};
    platform::host::HostPublish port;
    ASSERT_FALSE(Mapped("libavformat"));

    setenv("ORVEX_HOST_AV_MODULE", "/nonexistent/liborvex_host_av.so", 1);
    std::string error;
    EXPECT_EQ(port.Open(target, &error), nullptr);
    unsetenv("ORVEX_HOST_AV_MODULE");
    EXPECT_EQ(error.rfind("cannot load liborvex_host_av.so: /nonexistent/liborvex_host_av.so", 0),
              0u)
        << error;
    EXPECT_FALSE(Mapped("libavformat"));

    // Tried again at the next attempt, which loads it.
    error.clear();
    EXPECT_EQ(port.Open(target, &error), nullptr);
    EXPECT_EQ(error.rfind("cannot connect: ", 0), 0u) << error;
    EXPECT_TRUE(Mapped("libavformat"));
}

}  // namespace
