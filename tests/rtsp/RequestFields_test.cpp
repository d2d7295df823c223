#include "rtsp/RequestFields.h"

#include <gtest/gtest.h>

#include <climits>

#include "rtsp/RtspResponse.h"

namespace {

constexpr int kNone = INT_MIN + 7;  // stands for "no value" in the tables below

int Or(std::optional<int> v) { return v ? *v : kNone; }

TEST(RequestFieldsTest, LeadingIntReadsAsAtoiWithinRangeAndRefusesBeyond) {
    const std::pair<const char*, int> cases[] = {
        {"42", 42},
        {"  7;x", 7},
        {"+5", 5},
        {"-3", -3},
        {"abc", 0},
        {"", 0},
        {"-", 0},
        {"2147483647", INT_MAX},
        {"-2147483648", INT_MIN},
        {"2147483648", kNone},
        {"-2147483649", kNone},
        {"99999999999999999999", kNone},
        {"\t\n12", 12},
        {"00000000000000000001", 1},
    };
    for (const auto& c : cases) EXPECT_EQ(Or(LeadingInt(c.first)), c.second) << c.first;
}

TEST(RequestFieldsTest, TrackIndexIsBoundedAndUnknownTracksReadAsMinusOne) {
    const std::pair<const char*, int> cases[] = {
        {"trackID=1", 0},
        {"trackID=2", 1},
        {"trackID=0", -1},
        {"trackID=-1", -1},
        {"trackID=-2147483648", -1},  // minus one would overflow
        {"trackID=2147483648", -1},
        {"trackID=99999999999999", -1},
        {"trackID=", -1},
        {"x/trackID=2/y", 1},
        {"h264", kNone},
        {"", kNone},
    };
    for (const auto& c : cases) EXPECT_EQ(Or(TrackIndexOf(c.first)), c.second) << c.first;
}

// Request lines and URLs as ffmpeg, GStreamer and VLC send them.
TEST(RequestFieldsTest, UrlPartsOfRealClientRequests) {
    struct Case {
        const char* line;
        const char* mrl;      // nullptr: none
        const char* session;  // nullptr: none
        const char* stream;   // nullptr: none
        int method;
    };
    const Case cases[] = {
        {"DESCRIBE rtsp://192.168.1.5/skyvo.0?width=640&height=480 RTSP/1.0",
         "rtsp://192.168.1.5/skyvo.0?width=640&height=480", "skyvo.0?width=640&height=480", nullptr,
         kRtspDescribe},
        {"SETUP rtsp://192.168.1.5/skyvo.0?w=1/trackID=1 RTSP/1.0",
         "rtsp://192.168.1.5/skyvo.0?w=1/trackID=1", nullptr, "trackID=1", kRtspSetup},
        {"SETUP rtsp://10.0.0.2:554/skyvo/trackID=2 RTSP/1.0",
         "rtsp://10.0.0.2:554/skyvo/trackID=2", nullptr, "trackID=2", kRtspSetup},
        {"PLAY rtsp://10.0.0.2/skyvo/ RTSP/1.0", "rtsp://10.0.0.2/skyvo/", "skyvo", "", kRtspPlay},
        {"OPTIONS rtsp://h RTSP/1.0", "rtsp://h", nullptr, nullptr, kRtspOptions},
        {"GET_PARAMETER RTSP://H/skyvo   RTSP/1.0", "RTSP://H/skyvo", "skyvo", nullptr,
         kRtspGetParameter},
        {"SETUP rtsp://h/trackID=1 RTSP/1.0", "rtsp://h/trackID=1", nullptr, "trackID=1",
         kRtspSetup},
        {"TEARDOWN rtsp://h/s RTSP/1.1", nullptr, nullptr, nullptr, kRtspTeardown},
        {"PAUSE http://h/s RTSP/1.0", nullptr, nullptr, nullptr, kRtspPause},
        {"SET_PARAMETER rtsp://h/s RTSP/1.0", "rtsp://h/s", "s", nullptr, 0},
    };
    for (const Case& c : cases) {
        std::optional<std::string> mrl = MrlOf(c.line);
        EXPECT_EQ(mrl.value_or("<none>"), c.mrl ? c.mrl : "<none>") << c.line;
        EXPECT_EQ(RequestMethodOf(c.line), c.method) << c.line;
        if (!mrl) continue;
        EXPECT_EQ(SessionNameOf(*mrl).value_or("<none>"), c.session ? c.session : "<none>")
            << c.line;
        EXPECT_EQ(StreamNameOf(*mrl).value_or("<none>"), c.stream ? c.stream : "<none>") << c.line;
    }
}

TEST(RequestFieldsTest, HeadersCSeqAndTransportPorts) {
    const std::vector<std::string> lines = {
        "SETUP rtsp://h/s/trackID=1 RTSP/1.0",
        "Transport: RTP/AVP/UDP;unicast;client_port=50000-50001",
        "CSeq: 3",
        "User-Agent: GStreamer/1.22.0",
        "X-Blank:   ",
    };
    EXPECT_EQ(HeaderValueOf(lines, "cseq").value_or("<none>"), "3");
    EXPECT_EQ(HeaderValueOf(lines, "x-blank").value_or("<none>"), "   ");
    EXPECT_EQ(HeaderValueOf(lines, "Session").value_or("<none>"), "<none>");
    EXPECT_EQ(HeaderValueOf(lines, "RTSP/").value_or("<none>"), "1.0");  // the request line too

    const std::pair<const char*, unsigned> cseqs[] = {
        {"3", 3}, {"", 0}, {"x", 0}, {"4294967296", 0}, {"2147483647", 2147483647u}, {"-1", ~0u},
    };
    for (const auto& c : cseqs) EXPECT_EQ(CSeqOf(c.first), c.second) << c.first;

    struct Ports {
        const char* transport;
        const char* word;
        int first, second;  // kNone: no pair
    };
    const Ports ports[] = {
        {"RTP/AVP/UDP;unicast;client_port=50000-50001", "client_port=", 50000, 50001},
        {"RTP/AVP;unicast;client_port=6970-6971;mode=play", "client_port=", 6970, 6971},
        {"RTP/AVP;unicast;client_port=6970", "client_port=", 6970, 6970},
        {"RTP/AVP/TCP;interleaved=0-1", "interleaved=", 0, 1},
        {"RTP/AVP;unicast;client_port=99999999999-2", "client_port=", 0, 2},
        {"RTP/AVP;unicast;client_port=", "client_port=", 0, 0},
        {"RTP/AVP;unicast", "client_port=", kNone, kNone},
    };
    for (const Ports& p : ports) {
        std::optional<PortPair> pair = PortPairOf(p.transport, p.word);
        EXPECT_EQ(pair ? pair->first : kNone, p.first) << p.transport;
        EXPECT_EQ(pair ? pair->second : kNone, p.second) << p.transport;
    }
}

}  // namespace
