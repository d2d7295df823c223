#include "rtsp/RtspResponse.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "tests/rtsp/SocketPair.h"

namespace {

const std::string kQuery =
    "?width=1280&height=720&cameraid=hd0&win=main&sub=0&dumpvideo=0&dumpaudio=0&specialcase=none"
    "&framerate=30";
const std::string kUrl = "rtsp://127.0.0.1:8554/skyvo.0" + kQuery;
const std::string kSdp = "v=0\r\ns=skyvo\r\n";

// What the session layer does with each request, reduced to the answer operations.
void Answer(RtspResponse& r) {
    int type = 0;
    if (!r.GetRequestType(&type)) {
        r.ResponseError("RTSP/1.0 400 Bad Request");
        return;
    }
    switch (type) {
        case kRtspOptions:
            r.ResponseOptions();
            break;
        case kRtspDescribe:
            r.ResponseDescribe(kSdp.c_str(), static_cast<unsigned>(kSdp.size()));
            break;
        case kRtspSetup: {
            int rtp = 0, rtcp = 0;
            if (!r.GetRequestTransportInfo(&rtp, &rtcp)) {
                r.ResponseError("RTSP/1.0 400 Bad Request");
                break;
            }
            r.ResponseSetup(nullptr, 8000, nullptr, rtp, 1);
            break;
        }
        case kRtspPlay:
            r.ResponsePlay(("url=" + kUrl + "/trackID=1").c_str());
            break;
        case kRtspPause:
        case kRtspGetParameter:
            r.ResponsePause();
            break;
        default:
            r.ResponseError("RTSP/1.0 404 Session Not Found");
    }
}

struct Exchange {
    std::string request;
    std::string answer;
};

struct Conversation {
    const char* name;
    std::vector<Exchange> exchanges;
};

// Requests as ffmpeg (Lavf) and GStreamer send them; answers byte for byte.
const Conversation kConversations[] = {
    {"ffmpeg options",
     {{"OPTIONS " + kUrl + " RTSP/1.0\r\nCSeq: 1\r\nUser-Agent: Lavf59.27.100\r\n\r\n",
       "RTSP/1.0 200 OK\r\nCSeq: 1\r\n"
       "Public: OPTIONS, DESCRIBE, SETUP, TEARDOWN, PLAY, PAUSE,GET_PARAMETER\r\n\r\n"}}},
    {"ffmpeg describe",
     {{"DESCRIBE " + kUrl +
           " RTSP/1.0\r\nAccept: application/sdp\r\nCSeq: 2\r\n"
           "User-Agent: Lavf59.27.100\r\n\r\n",
       "RTSP/1.0 200 OK\r\nCSeq: 2\r\nServer: RTSP Service\r\nContent-Base: " + kUrl +
           "\r\nContent-Type: application/sdp\r\nContent-Length: 14\r\n\r\n" + kSdp}}},
    {"ffmpeg setup, setup, play: the session line from the first setup on",
     {{"SETUP " + kUrl +
           "/trackID=1 RTSP/1.0\r\nTransport: RTP/AVP/UDP;unicast;"
           "client_port=15190-15191\r\nCSeq: 3\r\nUser-Agent: Lavf59.27.100\r\n\r\n",
       "RTSP/1.0 200 OK\r\nCSeq: 3\r\nSession: 1881;timeout=10\r\nTransport: RTP/AVP;unicast;"
       "server_port=8000-8001;client_port=15190-15191;ssrc=1\r\n\r\n"},
      {"SETUP " + kUrl +
           "/trackID=2 RTSP/1.0\r\nTransport: RTP/AVP/UDP;unicast;"
           "client_port=15192-15193\r\nCSeq: 4\r\nUser-Agent: Lavf59.27.100\r\nSession: "
           "1881\r\n\r\n",
       "RTSP/1.0 200 OK\r\nCSeq: 4\r\nSession: 1881;timeout=10\r\nTransport: RTP/AVP;unicast;"
       "server_port=8000-8001;client_port=15192-15193;ssrc=1\r\n\r\n"},
      {"PLAY " + kUrl +
           " RTSP/1.0\r\nRange: npt=0.000-\r\nCSeq: 5\r\n"
           "User-Agent: Lavf59.27.100\r\nSession: 1881\r\n\r\n",
       "RTSP/1.0 200 OK\r\nCSeq: 5\r\nSession: 1881;timeout=10\r\nRTP-Info: url=" + kUrl +
           "/trackID=1\r\n\r\n"},
      {"PAUSE " + kUrl + " RTSP/1.0\r\nCSeq: 6\r\nSession: 1881\r\n\r\n",
       "RTSP/1.0 200 OK\r\nCSeq: 6\r\nSession: 1881;timeout=10\r\n\r\n"},
      {"BOGUS " + kUrl + " RTSP/1.0\r\nCSeq: 7\r\n\r\n",
       "RTSP/1.0 400 Bad Request\r\nCSeq: 7\r\nSession: 1881;timeout=10\r\n\r\n"}}},
    {"gstreamer setup: single port, interleaved ignored",
     {{"SETUP rtsp://127.0.0.1:8555/trackID=1 RTSP/1.0\r\nCSeq: 3\r\nUser-Agent: "
       "GStreamer/1.22.0\r\nTransport: RTP/AVP;unicast;client_port=52100\r\n\r\n",
       "RTSP/1.0 200 OK\r\nCSeq: 3\r\nSession: 1881;timeout=10\r\nTransport: RTP/AVP;unicast;"
       "server_port=8000-8001;client_port=52100-52101;ssrc=1\r\n\r\n"}}},
    {"error before any setup has no session line; setup without client_port is refused",
     {{"SETUP rtsp://h/skyvo/trackID=1 RTSP/1.0\r\nCSeq: 9\r\n"
       "Transport: RTP/AVP/TCP;unicast;interleaved=0-1\r\n\r\n",
       "RTSP/1.0 400 Bad Request\r\nCSeq: 9\r\n\r\n"}}},
    {"cseq missing, lower case, no blank, several blanks",
     {{"OPTIONS rtsp://h/s RTSP/1.0\r\n\r\n",
       "RTSP/1.0 200 OK\r\nCSeq: 0\r\nPublic: OPTIONS, DESCRIBE, SETUP, TEARDOWN, PLAY, "
       "PAUSE,GET_PARAMETER\r\n\r\n"},
      {"PAUSE rtsp://h/s RTSP/1.0\r\ncseq: 7\r\n\r\n", "RTSP/1.0 200 OK\r\nCSeq: 7\r\n\r\n"},
      {"PAUSE rtsp://h/s RTSP/1.0\r\nCSeq:8\r\n\r\n", "RTSP/1.0 200 OK\r\nCSeq: 8\r\n\r\n"},
      {"PAUSE rtsp://h/s RTSP/1.0\r\nCSeq:    9\r\n\r\n", "RTSP/1.0 200 OK\r\nCSeq: 9\r\n\r\n"}}},
    {"a play whose URL holds SETUP is a setup",
     {{"PLAY rtsp://h/SETUP RTSP/1.0\r\nCSeq: 2\r\nTransport: "
       "RTP/AVP;client_port=6000-6001\r\n\r\n",
       "RTSP/1.0 200 OK\r\nCSeq: 2\r\nSession: 1881;timeout=10\r\nTransport: RTP/AVP;unicast;"
       "server_port=8000-8001;client_port=6000-6001;ssrc=1\r\n\r\n"}}},
};

TEST(RtspResponseTest, ConversationsAreAnsweredByteForByte) {
    for (const Conversation& c : kConversations) {
        RtspResponse::SetSessionCounter(1880);
        RtspWire wire;
        for (const Exchange& e : c.exchanges) {
            wire.Send(e.request);
            ASSERT_TRUE(wire.server->GetRequests()) << c.name;
            Answer(*wire.server);
            EXPECT_EQ(wire.Received(), e.answer) << c.name << "\n" << e.request;
        }
    }
}

TEST(RtspResponseTest, EmptyDescriptionStillSendsLengthAndBlankLine) {
    RtspWire wire;
    wire.Send("DESCRIBE rtsp://h/s RTSP/1.0\r\nCSeq: 3\r\n\r\n");
    ASSERT_TRUE(wire.server->GetRequests());
    wire.server->ResponseDescribe("", 0);
    EXPECT_EQ(wire.Received(),
              "RTSP/1.0 200 OK\r\nCSeq: 3\r\nServer: RTSP Service\r\nContent-Base: rtsp://h/s\r\n"
              "Content-Type: application/sdp\r\nContent-Length: 0\r\n\r\n");
}

TEST(RtspResponseTest, SessionIdentifiersWrapFrom91883To1881AndStayPerConnection) {
    const std::string setup =
        "SETUP rtsp://h/s/trackID=1 RTSP/1.0\r\nCSeq: 1\r\n"
        "Transport: RTP/AVP;unicast;client_port=5000-5001\r\n\r\n";
    RtspResponse::SetSessionCounter(91882);
    std::vector<int> ids;
    for (int i = 0; i < 3; ++i) {
        RtspWire wire;
        for (int again = 0; again < 2; ++again) {  // a second SETUP keeps the identifier
            wire.Send(setup);
            ASSERT_TRUE(wire.server->GetRequests());
            Answer(*wire.server);
            wire.Received();
        }
        ids.push_back(wire.server->session_id());
    }
    EXPECT_EQ(ids, (std::vector<int>{91883, 1881, 1882}));
}

TEST(RtspResponseTest, LinesLongerThan255CharactersAreCut) {
    RtspResponse::SetSessionCounter(1880);
    RtspWire wire;
    wire.Send("PLAY rtsp://h/s RTSP/1.0\r\nCSeq: 1\r\n\r\n");
    ASSERT_TRUE(wire.server->GetRequests());
    std::string info(300, 'u');
    wire.server->ResponsePlay(info.c_str());
    std::string expected_field = ("RTP-Info: " + info).substr(0, 255);
    EXPECT_EQ(wire.Received(), "RTSP/1.0 200 OK\r\nCSeq: 1\r\n" + expected_field + "\r\n\r\n");
}

TEST(RtspResponseTest, ClosedConnectionEndsTheRequest) {
    RtspWire wire;
    wire.Send("OPTIONS rtsp://h/s RTSP/1.0\r\nCSeq: 1\r\n");
    wire.CloseClient();
    EXPECT_FALSE(wire.server->GetRequests());
    EXPECT_EQ(wire.server->request_lines().size(), 2u);  // the lines read so far stay
}

}  // namespace
