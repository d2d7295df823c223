#include <gtest/gtest.h>

#include <string>

#include "platform/fake/FakePlatform.h"
#include "rtsp/KeyWordValue.h"
#include "rtsp/RtspResponse.h"
#include "tests/rtsp/SocketPair.h"

namespace {

// Reads one request (request line plus headers) into a fresh connection object.
std::unique_ptr<RtspWire> Parsed(const std::string& request_line, const std::string& headers = "") {
    auto wire = std::make_unique<RtspWire>();
    wire->Send(request_line + "\r\n" + headers + "\r\n");
    EXPECT_TRUE(wire->server->GetRequests());
    return wire;
}

TEST(RtspParseTest, MethodIsTheFirstWordFoundInFixedOrder) {
    const std::pair<const char*, int> cases[] = {
        {"OPTIONS rtsp://h/s RTSP/1.0", 1},
        {"DESCRIBE rtsp://h/s RTSP/1.0", 2},
        {"SETUP rtsp://h/s/trackID=1 RTSP/1.0", 8},
        {"TEARDOWN rtsp://h/s RTSP/1.0", 64},
        {"PLAY rtsp://h/s RTSP/1.0", 128},
        {"PAUSE rtsp://h/s RTSP/1.0", 256},
        {"GET_PARAMETER rtsp://h/s RTSP/1.0", 16},
        {"PLAY rtsp://h/SETUP RTSP/1.0", 8},
        {"TEARDOWN rtsp://h/OPTIONS RTSP/1.0", 1},
        {"SET_PARAMETER rtsp://h/s RTSP/1.0", 0},
        {"play rtsp://h/s RTSP/1.0", 0},
    };
    for (const auto& c : cases) {
        auto w = Parsed(c.first);
        int type = 0;
        EXPECT_EQ(w->server->GetRequestType(&type), c.second != 0) << c.first;
        EXPECT_EQ(type, c.second) << c.first;
        EXPECT_EQ(w->server->GetRequestType(nullptr), c.second != 0);
    }
    RtspWire silent;
    EXPECT_FALSE(silent.server->GetRequestType(nullptr));
}

TEST(RtspParseTest, HeaderLookupIgnoresCaseAndTakesTheFirstLineContainingTheKey) {
    auto w = Parsed("OPTIONS rtsp://h/s RTSP/1.0",
                    "User-Agent: client with cseq inside\r\nCSeq: 4\r\nX:   \r\n");
    struct Case {
        const char* key;
        std::string value;
    };
    const Case cases[] = {
        {"CSeq", "inside"},  // the first line that contains the key wins
        {"user-agent", "client with cseq inside"},
        {"X:", "   "},     // only blanks left: kept
        {"RTSP/", "1.0"},  // the request line matches too
        {"Missing", "as before"},
    };
    for (const Case& c : cases) {
        std::string value = "as before";
        EXPECT_TRUE(w->server->SearchRequests(&value, c.key));
        EXPECT_EQ(value, c.value) << c.key;
    }
}

TEST(RtspParseTest, UrlPartsTable) {
    struct Case {
        std::string line;
        std::string mrl, server, name;
        bool name_ok;
        std::string stream;
        bool stream_ok;
    };
    const Case cases[] = {
        {"DESCRIBE rtsp://10.0.0.5/skyvo?width=720 RTSP/1.0", "rtsp://10.0.0.5/skyvo?width=720",
         "10.0.0.5", "skyvo?width=720", true, "", false},
        {"SETUP rtsp://h:554/skyvo/trackID=1 RTSP/1.0", "rtsp://h:554/skyvo/trackID=1", "h:554", "",
         false, "trackID=1", true},
        {"SETUP rtsp://h/trackID=0 RTSP/1.0", "rtsp://h/trackID=0", "h", "", false, "trackID=0",
         true},
        {"SETUP rtsp://h/skyvo.5?w=1/trackID=2 RTSP/1.0", "rtsp://h/skyvo.5?w=1/trackID=2", "h", "",
         false, "trackID=2", true},
        {"SETUP rtsp://h/skyvo/ RTSP/1.0", "rtsp://h/skyvo/", "h", "skyvo", true, "", true},
        {"PLAY RTSP://H/a/b/c   RTSP/1.0", "RTSP://H/a/b/c", "H", "a", true, "b/c", true},
        {"PLAY rtsp://h RTSP/1.0", "rtsp://h", "h", "", false, "", false},
        {"PLAY rtsp:/// RTSP/1.0", "rtsp:///", "", "", true, "", false},
        {"PLAY http://h/s RTSP/1.0", "", "", "", false, "", false},
        {"PLAY rtsp://h/s RTSP/2.0", "", "", "", false, "", false},
    };
    for (const Case& c : cases) {
        auto w = Parsed(c.line);
        std::string mrl, server, name, stream = "before";
        EXPECT_EQ(w->server->GetRequestMrl(&mrl), !c.mrl.empty()) << c.line;
        EXPECT_EQ(mrl, c.mrl) << c.line;
        EXPECT_EQ(w->server->GetRequestServerUrl(&server), !c.server.empty()) << c.line;
        EXPECT_EQ(server, c.server) << c.line;
        EXPECT_EQ(w->server->GetRequestSessionName(&name), c.name_ok) << c.line;
        EXPECT_EQ(name, c.name) << c.line;
        EXPECT_EQ(w->server->GetRequestStreamName(&stream), c.stream_ok) << c.line;
        EXPECT_EQ(stream, c.stream) << c.line;
    }
}

TEST(RtspParseTest, SessionNameCarriesTheAuthenticationTime) {
    struct Case {
        std::string line, name, auth;
    };
    const Case cases[] = {
        {"DESCRIBE rtsp://h/skyvo.1700000000 RTSP/1.0", "skyvo", "1700000000"},
        {"DESCRIBE rtsp://h/skyvo.17?width=1&a=b RTSP/1.0", "skyvo", "17?width=1&a=b"},
        {"DESCRIBE rtsp://h/sky vo.1 7 RTSP/1.0", "skyvo", "17"},  // blanks dropped first
        {"DESCRIBE rtsp://h/skyvo RTSP/1.0", "skyvo", "untouched"},
        {"DESCRIBE rtsp://h/a.b.c RTSP/1.0", "a", "b.c"},
    };
    for (const Case& c : cases) {
        auto w = Parsed(c.line);
        std::string name, auth = "untouched";
        EXPECT_TRUE(w->server->GetRequestSessionName(&name, auth)) << c.line;
        EXPECT_EQ(name, c.name) << c.line;
        EXPECT_EQ(auth, c.auth) << c.line;
    }
}

TEST(RtspParseTest, TransportPortsAndChannels) {
    struct Case {
        const char* transport;
        bool ports_ok;
        int rtp, rtcp;
        bool channels_ok;
        int ch1, ch2;
    };
    const Case cases[] = {
        {"RTP/AVP;unicast;client_port=5000-5001", true, 5000, 5001, false, 0, 0},
        {"RTP/AVP;unicast;client_port=5000", true, 5000, 5000, false, 0, 0},
        {"RTP/AVP;client_port=5000-5001;mode=play", true, 5000, 5001, false, 0, 0},
        {"RTP/AVP/TCP;unicast;interleaved=0-1", false, 0, 0, true, 0, 1},
        {"RTP/AVP/TCP;interleaved=4", false, 0, 0, true, 4, 4},
        {"RTP/AVP;client_port=x-y", true, 0, 0, false, 0, 0},
    };
    for (const Case& c : cases) {
        auto w = Parsed("SETUP rtsp://h/s/trackID=1 RTSP/1.0",
                        std::string("Transport: ") + c.transport + "\r\n");
        int a = -1, b = -1;
        EXPECT_EQ(w->server->GetRequestTransportInfo(&a, &b), c.ports_ok) << c.transport;
        if (c.ports_ok) {
            EXPECT_EQ(a, c.rtp) << c.transport;
            EXPECT_EQ(b, c.rtcp) << c.transport;
        }
        a = b = -1;
        EXPECT_EQ(w->server->GetRequestTransportintleaved(&a, &b), c.channels_ok) << c.transport;
        if (c.channels_ok) {
            EXPECT_EQ(a, c.ch1) << c.transport;
            EXPECT_EQ(b, c.ch2) << c.transport;
        }
    }
    auto none = Parsed("SETUP rtsp://h/s RTSP/1.0");
    EXPECT_FALSE(none->server->GetRequestTransportInfo(nullptr, nullptr));
}

TEST(KeyWordValueTest, QueryValuesAreCutAt10CharactersAndMissingKeysFail) {
    platform::fake::FakePlatform fake;
    const std::string url =
        "skyvo?width=1920&height=1080&win=allwithoutosd&x=123456789012&e=&cameraid";
    struct Case {
        const char* key;
        const char* value;
    };
    const Case cases[] =
        {
            {"width=", "1920"},   {"height=", "1080"}, {"win=", "allwithout"},
            {"x=", "1234567890"}, {"e=", ""},          {"cameraid=", "failed"},
            {"skyvo?", "failed"},  // at the very start: position 0 counts as absent
        };
    ::testing::internal::CaptureStdout();
    for (const Case& c : cases) EXPECT_EQ(getKeyWordValue(c.key, url), c.value) << c.key;
    std::string out = ::testing::internal::GetCapturedStdout();
    EXPECT_NE(out.find("\n\n sessionAuthUrl is " + url + " ,\n\n"), std::string::npos);
    EXPECT_NE(out.find("sub string is width=,return result string is 1920 \n"), std::string::npos);
    EXPECT_EQ(fake.log.Texts("orvex:::RtspSession").size(), 2u * (sizeof cases / sizeof cases[0]));
}

TEST(KeyWordValueTest, KmpFindsTheFirstOccurrenceAndTracesItsTable) {
    ::testing::internal::CaptureStdout();
    EXPECT_EQ(kmp("abababca", "abab"), 0);
    EXPECT_EQ(::testing::internal::GetCapturedStdout(),
              "next[0]=0\nnext[1]=0\nnext[2]=1\nnext[3]=2\n");
    ::testing::internal::CaptureStdout();
    EXPECT_EQ(kmp("xxaabaabaaay", "aabaaa"), 5);
    EXPECT_EQ(kmp("aaaa", "b"), -1);
    EXPECT_EQ(kmp("", "a"), -1);
    EXPECT_EQ(kmp("", ""), 0);
    EXPECT_EQ(kmp("abc", ""), 0);
    ::testing::internal::GetCapturedStdout();
}

}  // namespace
