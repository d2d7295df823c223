#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdlib>
#include <fstream>
#include <regex>
#include <sstream>
#include <string>

#include "config/PropertyTable.h"
#include "platform/Ports.h"
#include "platform/host/HostLog.h"
#include "platform/host/HostProperties.h"
#include "platform/host/KnownProperties.h"
#include "platform/host/StartLine.h"

namespace {

using platform::host::HostLog;
using platform::host::HostProperties;

std::string TempPath(const char* name) {
    return ::testing::TempDir() + "orvex_" + std::to_string(getpid()) + "_" + name;
}

void WriteFile(const std::string& path, const std::string& text) {
    std::ofstream(path, std::ios::trunc) << text;
}

std::string ReadFile(const std::string& path) {
    std::stringstream s;
    s << std::ifstream(path).rdbuf();
    return s.str();
}

TEST(HostPropertiesTest, ParsesBuildPropLines) {
    auto v = HostProperties::Parse(
        "# comment\n"
        "ro.board.platform=tarvo9\n"
        "  kv.orvex.log = 2 \r\n"
        "\n"
        "no equals sign\n"
        "=no key\n"
        "a.b=x=y\n"
        "kv.orvex.log=3\n"
        "   # indented comment=1\n");
    std::map<std::string, std::string> expected = {
        {"ro.board.platform", "tarvo9"}, {"kv.orvex.log", "3"}, {"a.b", "x=y"}};
    EXPECT_EQ(v, expected);
}

TEST(HostPropertiesTest, MissingKeysAndFilesGiveTheDefault) {
    std::string path = TempPath("props");
    WriteFile(path, "kelvo.build.kelvotv=sa\nempty.value=\n");
    HostProperties props(path);
    char value[platform::kPropertyValueMax];
    EXPECT_EQ(props.Get("kelvo.build.kelvotv", value, "x"), 2);
    EXPECT_STREQ(value, "sa");
    EXPECT_EQ(props.Get("ro.board.platform", value, "android"), 7);
    EXPECT_STREQ(value, "android");
    EXPECT_EQ(props.Get("empty.value", value, "dflt"), 4);
    EXPECT_STREQ(value, "dflt");
    EXPECT_EQ(props.Get("nothing", value, nullptr), 0);
    EXPECT_STREQ(value, "");

    HostProperties none(path + ".absent");
    EXPECT_EQ(none.Get("kelvo.build.kelvotv", value, "0"), 1);
    EXPECT_STREQ(value, "0");
    unlink(path.c_str());
}

TEST(HostPropertiesTest, EditsTakeEffectAtTheNextLookup) {
    std::string path = TempPath("props_edit");
    WriteFile(path, "kv.orvex.log=0\n");
    HostProperties props(path);
    char value[platform::kPropertyValueMax];
    props.Get("kv.orvex.log", value, "");
    EXPECT_STREQ(value, "0");
    WriteFile(path, "kv.orvex.log=12\n");  // a different size: seen even within one mtime tick
    props.Get("kv.orvex.log", value, "");
    EXPECT_STREQ(value, "12");
    unlink(path.c_str());
    props.Get("kv.orvex.log", value, "gone");
    EXPECT_STREQ(value, "gone");
}

TEST(HostPropertiesTest, ALaterFileWinsAndEachIsReadAgainWhenEdited) {
    const std::string shipped = TempPath("props_shipped"), own = TempPath("props_own");
    WriteFile(shipped, "orvex.host.video=pattern\nkv.orvex.http=8080\nkv.orvex.auth=\n");
    WriteFile(own, "kv.orvex.auth=/home/u/users\nkv.orvex.http=\n");
    HostProperties props(shipped + ":" + own + ":" + own + ".absent");
    EXPECT_EQ(props.paths(), (std::vector<std::string>{shipped, own, own + ".absent"}));
    const struct {
        const char* key;
        const char* value;
    } before[] = {
        {"orvex.host.video", "pattern"},     // only in the first
        {"kv.orvex.auth", "/home/u/users"},  // set by the second
        {"kv.orvex.http", "none"},           // emptied by the second: unset
    };
    char value[platform::kPropertyValueMax];
    for (const auto& c : before) {
        props.Get(c.key, value, "none");
        EXPECT_STREQ(value, c.value) << c.key;
    }
    WriteFile(shipped, "orvex.host.video=x11::1\n");  // the file people edit, while it runs
    props.Get("orvex.host.video", value, "");
    EXPECT_STREQ(value, "x11::1");
    unlink(shipped.c_str());
    unlink(own.c_str());
}

TEST(HostPropertiesTest, LongValuesAreCutToThePropertyLimit) {
    std::string path = TempPath("props_long");
    WriteFile(path, "k=" + std::string(200, 'v') + "\n");
    HostProperties props(path);
    char value[platform::kPropertyValueMax];
    EXPECT_EQ(props.Get("k", value, ""), platform::kPropertyValueMax - 1);
    EXPECT_EQ(std::string(value), std::string(platform::kPropertyValueMax - 1, 'v'));
    unlink(path.c_str());
}

TEST(HostLogTest, FileSinkWritesLogcatLinesOnePerTextLine) {
    std::string path = TempPath("log");
    unlink(path.c_str());
    {
        HostLog log("file:" + path);
        log.Write(3, 3, "orvex:::cycle_buffer", "\n first line\nsecond\n");
        log.Write(3, 6, "orvex:::RtspSession", "set reuse rtsp address wrong x");
        log.Write(3, 3, "globalconfig", "\n\n");
    }
    std::string text = ReadFile(path);
    std::regex line(
        R"(\d\d-\d\d \d\d:\d\d:\d\d\.\d{3} +\d+ +\d+ ([A-Z?]) ([^:]+(?::::[^:]+)?): (.*))");
    std::vector<std::string> got;
    std::istringstream in(text);
    for (std::string l; std::getline(in, l);) {
        std::smatch m;
        ASSERT_TRUE(std::regex_match(l, m, line)) << l;
        got.push_back(m[1].str() + " " + m[2].str() + ": " + m[3].str());
    }
    EXPECT_EQ(got,
              (std::vector<std::string>{
                  "D orvex:::cycle_buffer:  first line", "D orvex:::cycle_buffer: second",
                  "E orvex:::RtspSession: set reuse rtsp address wrong x", "D globalconfig: "}));
    unlink(path.c_str());
}

// The default ports read the property file named by the environment and log where it says.
TEST(HostPlatformTest, DefaultPortsFollowThePropertyFile) {
    std::string props = TempPath("default_props");
    std::string log = TempPath("default_log");
    unlink(log.c_str());
    WriteFile(props, "kelvo.build.kelvotv=px\norvex.host.log=file:" + log +
                         "\norvex.host.log.level=debug\n");
    setenv("ORVEX_PROP_FILE", props.c_str(), 1);
    unsetenv("ORVEX_LOG");
    platform::Ports before = platform::Installed();
    platform::InstallDefaultPorts();
    char value[platform::kPropertyValueMax];
    platform::Properties().Get("kelvo.build.kelvotv", value, "");
    EXPECT_STREQ(value, "px");
    platform::Log().Write(3, 3, "orvex:::test", "hello host");
    EXPECT_NE(ReadFile(log).find("D orvex:::test: hello host"), std::string::npos);
    EXPECT_NE(platform::PipManager().connect(), nullptr);
    auto audio = platform::AudioManager().connect();
    ASSERT_NE(audio, nullptr);
    EXPECT_EQ(audio->setAudioCaptureSource(0, 1), 0);
    platform::Install(before);
    unsetenv("ORVEX_PROP_FILE");
    unlink(props.c_str());
    unlink(log.c_str());
}

// The environment wins over the property, which wins over the television's kv.orvex.log; a
// level nobody knows is info and one sentence naming where it came from.
TEST(HostLogTest, LevelComesFromTheEnvironmentThenThePropertyThenKvOrvexLog) {
    const struct {
        const char* env;
        const char* property;
        const char* kv_log;
        int level;
        const char* complaint;
    } cases[] = {
        {nullptr, "", "", platform::kLogInfo, ""},
        {"", "", "0", platform::kLogInfo, ""},
        {nullptr, "", "1", platform::kLogDebug, ""},
        {nullptr, "", "debug", platform::kLogDebug, ""},
        {nullptr, "", "no", platform::kLogInfo, ""},
        {nullptr, "warn", "1", platform::kLogWarn, ""},
        {nullptr, "DEBUG", "", platform::kLogDebug, ""},
        {"debug", "error", "", platform::kLogDebug, ""},
        {"Warning", "", "", platform::kLogWarn, ""},
        {"verbose", "", "", 2, ""},
        {"loud", "debug", "", platform::kLogInfo,
         "ORVEX_LOG_LEVEL=\"loud\" is not debug, info, warn or error; logging at info"},
        {nullptr, "3", "", platform::kLogInfo,
         "orvex.host.log.level=\"3\" is not debug, info, warn or error; logging at info"},
    };
    for (const auto& c : cases) {
        std::string complaint;
        EXPECT_EQ(platform::host::ChooseLogLevel(c.env, c.property, c.kv_log, &complaint), c.level)
            << (c.env ? c.env : "-") << " " << c.property << " " << c.kv_log;
        EXPECT_EQ(complaint, c.complaint);
    }
}

// Below the level nothing is written, and the stdout copy of the traces is shown only at debug
// or once asked for.
TEST(HostLogTest, LinesBelowTheLevelAreLeftOut) {
    std::string path = TempPath("level_log");
    unlink(path.c_str());
    {
        platform::host::HostLog log("file:" + path, platform::kLogInfo);
        EXPECT_FALSE(log.MirrorToStdout());
        log.Write(3, 3, "orvex:::RtspSession", "sendppsandspsframe");
        log.Write(3, 4, "orvex:::host", "serving");
        log.Write(3, 5, "orvex:::web", "refused");
        log.ShowMirror();
        EXPECT_TRUE(log.MirrorToStdout());
        EXPECT_TRUE(platform::host::HostLog("stderr").MirrorToStdout());
    }
    std::string text = ReadFile(path);
    EXPECT_EQ(text.find("sendppsandspsframe"), std::string::npos) << text;
    EXPECT_NE(text.find(" I orvex:::host: serving\n"), std::string::npos) << text;
    EXPECT_NE(text.find(" W orvex:::web: refused\n"), std::string::npos) << text;
    unlink(path.c_str());
}

// The start line names both sources as configured and every address served.
TEST(StartLineTest, NamesSourcesAndAddresses) {
    using platform::host::SourceChoice;
    const struct {
        const char* video;
        const char* audio;
        unsigned http;
        const char* access;
        const char* line;
    } cases[] = {
        {"pattern", "tone", 8080, "",
         "serving picture: test pattern, sound: 1 kHz tone at rtsp://10.0.0.5:554/skyvo.0 and "
         "http://10.0.0.5:8080/"},
        {"x11", "pulse", 0, "",
         "serving picture: the screen of $DISPLAY, sound: what the machine plays (PulseAudio) at "
         "rtsp://10.0.0.5:554/skyvo.0"},
        {"x11::1", "pulse:mic", 0, "",
         "serving picture: the screen :1, sound: PulseAudio source mic at "
         "rtsp://10.0.0.5:554/skyvo.0"},
        {"v4l2", "alsa:hw:1,0", 0, "",
         "serving picture: camera /dev/video0, sound: ALSA hw:1,0 at rtsp://10.0.0.5:554/skyvo.0"},
        {"gst:videotestsrc pattern=ball", "none", 0, "",
         "serving picture: GStreamer videotestsrc pattern=ball, sound: none at "
         "rtsp://10.0.0.5:554/skyvo.0"},
        {"none", "alsa", 8080, "users of /etc/orvex/users",
         "serving picture: none (only what orvex-feed sends), sound: ALSA default at "
         "rtsp://10.0.0.5:554/skyvo.0 and http://10.0.0.5:8080/; users of /etc/orvex/users"},
    };
    for (const auto& c : cases) {
        SourceChoice video, audio;
        ASSERT_TRUE(platform::host::ParseVideoSource(c.video, &video)) << c.video;
        ASSERT_TRUE(platform::host::ParseAudioSource(c.audio, &audio)) << c.audio;
        EXPECT_EQ(platform::host::StartLine(video, audio, "10.0.0.5", 554, c.http, c.access),
                  c.line);
    }
    EXPECT_EQ(platform::host::ReachableAddress("192.168.7.2"), "192.168.7.2");
}

// A key that nothing reads is named with the known key it most likely meant.
TEST(KnownPropertiesTest, MisspeltKeysPointToTheNearestKnownOne) {
    const struct {
        const char* key;
        const char* nearest;
    } cases[] = {
        {"orvex.host.vidoe", "orvex.host.video"},  {"orvex.host.video.sbu", "orvex.host.video.sub"},
        {"kv.orvex.wakeup", "kv.orvex.wake"},      {"kv.orvx.auth", "kv.orvex.auth"},
        {"ro.board", "ro.board.platform"},         {"KV.ORVEX.LOG", "kv.orvex.log"},
        {"orvex.host.audio ", "orvex.host.audio"}, {"kv.orvex.alow", "kv.orvex.allow"},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(platform::host::NearestKnownKey(c.key), c.nearest) << c.key;
    }
}

// The keys the build listed for the host are the property table's, in its order.
TEST(KnownPropertiesTest, TheKnownKeysAreThePropertyTables) {
    std::vector<std::string> table;
    for (size_t i = 0; i < config::kPropertyCount; ++i) table.push_back(config::Defs()[i].key);
    EXPECT_EQ(platform::host::KnownPropertyKeys(), table);
}

// The shipped host properties use only keys that something reads.
TEST(KnownPropertiesTest, TheShippedPropertiesHoldOnlyKnownKeys) {
    std::map<std::string, std::string> values =
        HostProperties::Parse(ReadFile(ORVEX_SHIPPED_PROPERTIES));
    ASSERT_GT(values.size(), 5u);
    EXPECT_EQ(platform::host::WarnUnknownPropertyKeys(values, ORVEX_SHIPPED_PROPERTIES), 0);
    values["orvex.host.vidoe"] = "x11";
    EXPECT_EQ(platform::host::WarnUnknownPropertyKeys(values, "p"), 1);
}

}  // namespace
