#include "config/PropertyTable.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>

#include "config/Settings.h"
#include "platform/fake/FakePlatform.h"

namespace {

using config::Property;

// Each property's text as the port gives it, to its typed value and the one line a refused
// value earns (tag and priority as the reader logged them before the table).
TEST(PropertyTableTest, TextBecomesTheTypedValueOrTheDefaultWithItsLine) {
    constexpr int kTrace = platform::kLogDebug;  // OrvexLog's priority
    const std::string long_text(120, 'x');
    struct Case {
        const char* name;
        Property id;
        const char* text;  // null: unset
        long number;
        std::string value;  // the text the reader sees
        int priority;       // of the line; 0: no line
        std::string line;
    } const cases[] = {
        {"unset payload type is 98", Property::kAudioPayloadType, nullptr, 98, "", 0, ""},
        {"payload type in range", Property::kAudioPayloadType, "127", 127, "127", 0, ""},
        {"payload type above range keeps 98", Property::kAudioPayloadType, "128", 98, "128", kTrace,
         "kv.orvex.audiopt=\"128\" is not a payload type from 96 to 127; audio RTP keeps 98"},
        {"trailing junk is refused", Property::kAudioPayloadType, "97x", 98, "97x", kTrace,
         "kv.orvex.audiopt=\"97x\" is not a payload type from 96 to 127; audio RTP keeps 98"},
        {"unset http is no viewer, silently", Property::kHttp, nullptr, 0, "", 0, ""},
        {"port 0 is not a port", Property::kHttp, "0", 0, "0", platform::kLogError,
         "kv.orvex.http=\"0\" is not a port number; no web viewer"},
        {"highest port", Property::kHttp, "65535", 65535, "65535", 0, ""},
        {"unset WebRTC is none", Property::kWebRtc, nullptr, -1, "", 0, ""},
        {"WebRTC on any free port", Property::kWebRtc, "0", 0, "0", 0, ""},
        {"WebRTC port out of range is none", Property::kWebRtc, "65536", -1, "65536",
         platform::kLogError, "kv.orvex.webrtc=\"65536\" is not a UDP port number; no WebRTC"},
        {"unset viewer limit is 16", Property::kHttpMax, nullptr, 16, "16", 0, ""},
        {"viewer limit above 64 gives 16", Property::kHttpMax, "65", 16, "65", platform::kLogWarn,
         "kv.orvex.http.max=\"65\" is not 1 to 64; 16 viewers at most"},
        {"switch on", Property::kWake, "event", 1, "event", 0, ""},
        {"switch off word", Property::kWake, "poll", 0, "poll", 0, ""},
        {"switch words are case-sensitive", Property::kWake, "Event", 0, "Event", kTrace,
         "kv.orvex.wake=\"Event\" is neither poll nor event; idle loops keep polling"},
        {"join junk joins at once", Property::kJoin, "keys", 0, "keys", kTrace,
         "kv.orvex.join=\"keys\" is neither now nor key; clients join at once"},
        {"sdp other than live is fixed, silently", Property::kSdp, "LIVE", 0, "LIVE", 0, ""},
        {"sdp live", Property::kSdp, "live", 1, "live", 0, ""},
        {"debug switch is atoi", Property::kLog, "2x", 1, "2x", 0, ""},
        {"debug switch words are off", Property::kDumpToSd, "abc", 0, "abc", 0, ""},
        {"flavour px", Property::kFlavour, "px", 2, "px", 0, ""},
        {"flavour is exact", Property::kFlavour, "sa ", 0, "sa ", 0, ""},
        {"address", Property::kBind, "127.0.0.2", 0, "127.0.0.2", 0, ""},
        {"a name is not an address", Property::kBind, "localhost", 0, "localhost",
         platform::kLogError, "kv.orvex.bind=\"localhost\" is not an IPv4 address; not listening"},
        {"unset board is android", Property::kBoard, nullptr, 0, "android", 0, ""},
        {"text stops where the port's copy does", Property::kPublish, long_text.c_str(), 0,
         long_text.substr(0, platform::kPropertyValueMax - 1), 0, ""},
        {"whole text does not", Property::kHostVideo, long_text.c_str(), 0, long_text, 0, ""},
        {"unset sound source is the tone", Property::kHostAudio, nullptr, 0, "tone", 0, ""},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        platform::fake::FakePlatform fake;
        if (c.text != nullptr) fake.properties.Set(config::Def(c.id).key, c.text);
        const config::PropertyValue v = config::Reread(c.id);
        EXPECT_EQ(v.number, c.number);
        EXPECT_EQ(v.text, c.value);
        EXPECT_EQ(v.refused, c.priority != 0);
        const auto entries = fake.log.Entries();
        ASSERT_EQ(entries.size(), c.line.empty() ? 0u : 1u);
        if (c.line.empty()) continue;
        EXPECT_EQ(entries[0].priority, c.priority);
        EXPECT_EQ(entries[0].tag, config::Def(c.id).tag);
        EXPECT_EQ(entries[0].text, c.line);
    }
}

// The table is indexed by Property, its keys unique and in order (the misspelt-key warning
// names the first of equally near keys), and each refusal is a format of one %s.
TEST(PropertyTableTest, EntriesAreWellFormed) {
    for (size_t i = 0; i < config::kPropertyCount; ++i) {
        const config::PropertyDef& def = config::Defs()[i];
        SCOPED_TRACE(def.key);
        EXPECT_EQ(&config::Def(def.id), &def);
        EXPECT_EQ(config::FindDef(def.key), &def);
        if (i > 0) {
            EXPECT_LT(strcmp(config::Defs()[i - 1].key, def.key), 0);
        }
        if (def.refusal != nullptr) {
            const std::string f = def.refusal;
            EXPECT_EQ(f.find('%'), f.rfind('%'));
            EXPECT_NE(f.find("%s"), std::string::npos);
            EXPECT_NE(def.tag, nullptr);
        }
    }
    EXPECT_EQ(config::FindDef("kv.orvex.htp"), nullptr);
}

// The viewer limit belongs to the web viewer: without kv.orvex.http it is not read, so a bad
// one costs no line.
TEST(PropertyTableTest, SettingsReadTheViewerLimitOnlyForAViewer) {
    platform::fake::FakePlatform fake;
    fake.properties.Set("kv.orvex.http.max", "0");
    EXPECT_EQ(config::ReadSettings(fake.properties).http_max, 16);
    EXPECT_TRUE(fake.log.Texts("orvex:::web").empty());
    fake.properties.Set("kv.orvex.http", "8080");
    const config::Settings s = config::ReadSettings(fake.properties);
    EXPECT_EQ(s.http_port, 8080u);
    EXPECT_EQ(s.http_max, 16);
    EXPECT_EQ(fake.log.Texts("orvex:::web").size(), 1u);
}

}  // namespace
