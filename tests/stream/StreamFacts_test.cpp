// The stream's facts as frames bring them, and the SDP parameters made from them.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "stream/StreamFacts.h"
#include "tests/web/HexBytes.h"

namespace {

using hexbytes::Bytes;
using hexbytes::Unhex;

// Baseline 3.0 parameter sets of a 640x480 and a 320x240 picture.
constexpr const char* kSps640 = "6742401ea6c0a03da1000003000100000300280f1022e0";
constexpr const char* kSps320 = "6742401ea6c141fa1000000300100000030280f1022e";
constexpr const char* kPps = "68ca4388";

Bytes AnnexB(const std::vector<std::string>& nals, bool four = true) {
    Bytes out;
    for (const std::string& hex : nals) {
        out.insert(out.end(), {0, 0});
        if (four) out.push_back(0);
        out.push_back(1);
        Bytes nal = Unhex(hex);
        out.insert(out.end(), nal.begin(), nal.end());
    }
    return out;
}

TEST(StreamFactsTest, ParameterSetsInFrontOfTheFirstSliceAreTaken) {
    const struct {
        const char* what;
        Bytes frame;
        const char* sps;  // what the facts hold after it ("" none yet)
        uint16_t width, height;
    } steps[] = {
        {"a P slice alone tells nothing", AnnexB({"419a0102"}), "", 0, 0},
        {"delimiter, SPS, PPS, IDR", AnnexB({"0910", kSps640, kPps, "6588840021"}), kSps640, 640,
         480},
        {"parameter sets behind a slice are not looked for", AnnexB({"419a0102", kSps320, kPps}),
         kSps640, 640, 480},
        {"3-byte start codes, a new size", AnnexB({kSps320, kPps, "658884"}, false), kSps320, 320,
         240},
        {"an SPS that gives no size is left out", AnnexB({"6742", kPps, "658884"}), kSps320, 320,
         240},
    };
    stream::StreamFacts facts;
    uint64_t now = 1000;
    for (const auto& s : steps) {
        SCOPED_TRACE(s.what);
        facts.Note(s.frame.data(), s.frame.size(), ++now);
        stream::StreamFacts::Video video;
        const bool known = facts.Get(&video);
        EXPECT_EQ(known, *s.sps != '\0');
        if (!known) continue;
        EXPECT_EQ(Bytes(video.sps.begin(), video.sps.end()), Unhex(s.sps));
        EXPECT_EQ(Bytes(video.pps.begin(), video.pps.end()), Unhex(kPps));
        EXPECT_EQ(video.width, s.width);
        EXPECT_EQ(video.height, s.height);
        EXPECT_EQ(video.last_frame_ms, now);
    }
}

TEST(StreamFactsTest, FmtpDescribesTheStreamsOwnParameterSets) {
    stream::StreamFacts::Video video;
    EXPECT_EQ(stream::LiveH264Fmtp(video), "packetization-mode=1;");
    Bytes sps = Unhex(kSps640), pps = Unhex(kPps);
    video.sps.assign(sps.begin(), sps.end());
    video.pps.assign(pps.begin(), pps.end());
    // The fixed text the television announces for 640 wide, now read from the stream.
    EXPECT_EQ(stream::LiveH264Fmtp(video),
              "profile-level-id=42401E; sprop-parameter-sets=Z0JAHqbAoD2hAAADAAEAAAMAKA8QIuA=,"
              "aMpDiA==; packetization-mode=1;");
    const Bytes high = Unhex("6764001facd9");  // High profile 3.1
    video.sps.assign(high.begin(), high.end());
    EXPECT_EQ(stream::LiveH264Fmtp(video).substr(0, 24), "profile-level-id=64001F;");
}

}  // namespace
