// The picture gatherer: which calls deliver which pictures, byte for byte, and when a picture
// is sent before its end is seen.
#include "codec/AccessUnitGatherer.h"

#include <gtest/gtest.h>

#include <cctype>
#include <cstdio>
#include <string>
#include <vector>

namespace {

using Bytes = std::vector<uint8_t>;

Bytes Unhex(const std::string& hex) {
    std::string digits;
    for (char c : hex) {
        if (isxdigit(static_cast<unsigned char>(c))) digits += c;
    }
    Bytes out;
    for (size_t i = 0; i + 1 < digits.size(); i += 2)
        out.push_back(static_cast<uint8_t>(std::stoul(digits.substr(i, 2), nullptr, 16)));
    return out;
}

// Slices with their first_mb_in_slice (0 begins a picture) and slice_type.
#define SPS "67 42 c0 1e d9 00 a0 3d b0 11 00 00 03 00 01 00 00 03 00 3c 0f 16 2e 48"
#define SPS_720 "67 42 c0 1f d9 00 50 05 bb 01 10 00 00 03 00 10 00 00 03 03 c0 f1 83 24 80"
#define PPS "68 cb 8c b2"
#define AUD "09 f0"
#define FILL "0c ff ff 80"
#define IDR "65 88 84 21"  // 0, I
#define IDR_1 "65 42 20"   // 1, I
#define P "41 9a 00 11"    // 0, P
#define P_1 "41 46 80"     // 1, P
#define P_2 "41 66 80"     // 2, P
#define I "61 88 80"       // 0, I (not IDR)
#define I_1 "61 42 20"     // 1, I
#define B "01 9e"          // 0, B
#define SC "00 00 00 01 "  // start code

class Recorder : public AccessUnitGatherer::Sink {
public:
    std::vector<std::string> events;
    void OnPicture(const AccessUnitGatherer::Picture& p) override {
        std::string hex;
        char b[3];
        for (size_t i = 0; i < p.len; ++i) {
            snprintf(b, sizeof b, "%02x", p.data[i]);
            hex += b;
        }
        events.push_back((p.key ? "key " : "pic ") + std::to_string(p.time_ms) + " " + hex);
    }
    void OnPictureLost(AccessUnitGatherer::Loss loss) override {
        events.push_back(loss == AccessUnitGatherer::Loss::kTooLarge ? "too large" : "cut");
    }
};

// "key 0 00 00 00 01 65 ..." as the recorder writes it: the hex without its blanks.
std::string Clean(const std::string& event) {
    if (event.rfind("key ", 0) != 0 && event.rfind("pic ", 0) != 0) return event;
    const size_t hex = event.find(' ', 4) + 1;
    std::string out = event.substr(0, hex);
    for (size_t i = hex; i < event.size(); ++i) {
        if (event[i] != ' ') out += event[i];
    }
    return out;
}

struct Call {
    const char* annexb;
    uint32_t ms;
    std::vector<std::string> out;  // "key|pic MS HEX" (blanks in HEX for the reader), "cut"
};

struct Case {
    const char* name;
    std::vector<Call> calls;
    AccessUnitGatherer::Prefix prefix = AccessUnitGatherer::Prefix::kStartCode;
    bool keep_headers = true;
    size_t max_bytes = 1 << 16;
};

void Gather(const Case& c) {
    SCOPED_TRACE(c.name);
    Recorder sink;
    AccessUnitGatherer gatherer(&sink, c.prefix, c.keep_headers, c.max_bytes);
    for (size_t i = 0; i < c.calls.size(); ++i) {
        SCOPED_TRACE("call " + std::to_string(i));
        const Bytes in = Unhex(c.calls[i].annexb);
        sink.events.clear();
        gatherer.Add(in.data(), in.size(), c.calls[i].ms);
        std::vector<std::string> expected;
        for (const std::string& e : c.calls[i].out) expected.push_back(Clean(e));
        EXPECT_EQ(sink.events, expected);
    }
}

TEST(AccessUnitGathererTest, PicturesGoWholeAndAsSoonAsTheirKindIsKnown) {
    // clang-format off
    const Case cases[] = {
        {"a key picture of two slices after pictures of one is not cut", {
            {SC SPS SC PPS SC IDR, 0, {}},
            {SC IDR_1, 0, {}},
            {SC P, 33, {"key 0 " SC SPS SC PPS SC IDR SC IDR_1}},
            {SC P, 66, {"pic 33 " SC P, "pic 66 " SC P}},
            {SC SPS, 100, {}},
            {SC PPS SC IDR, 100, {}},
            {SC IDR_1, 100, {"key 100 " SC SPS SC PPS SC IDR SC IDR_1}},
            {SC P, 133, {"pic 133 " SC P}}}},
        {"a kind never seen waits for its end, whatever the others have", {
            {SC SPS SC PPS SC IDR, 0, {}},
            {SC P, 33, {"key 0 " SC SPS SC PPS SC IDR}},
            {SC P, 66, {"pic 33 " SC P, "pic 66 " SC P}},
            {SC I, 100, {}},
            {SC I_1, 100, {}},
            {SC B, 133, {"pic 100 " SC I SC I_1}},
            {SC P, 166, {"pic 133 " SC B, "pic 166 " SC P}},
            {SC I, 200, {}},
            {SC I_1, 200, {"pic 200 " SC I SC I_1}},
            {SC B, 233, {"pic 233 " SC B}}}},
        {"a call that brings a picture to its count sends it, however many slices it holds", {
            {SC IDR, 0, {}},
            {SC P SC P_1, 33, {"key 0 " SC IDR}},
            {SC P SC P_1, 66, {"pic 33 " SC P SC P_1, "pic 66 " SC P SC P_1}},
            {SC AUD SC P, 100, {}},
            {SC P_1, 100, {"pic 100 " SC AUD SC P SC P_1}}}},
        {"a count that proves short: the late slices are dropped, told once, and counted", {
            {SC IDR, 0, {}},
            {SC P, 33, {"key 0 " SC IDR}},
            {SC P, 66, {"pic 33 " SC P, "pic 66 " SC P}},
            {SC P_1, 66, {"cut"}},
            {SC P_2, 66, {}},
            {SC P, 100, {}},
            {SC P_1, 100, {}},
            {SC P_2, 100, {"pic 100 " SC P SC P_1 SC P_2}},
            {SC P, 133, {}},
            {SC AUD, 166, {"pic 133 " SC P}}}},
        {"another stream's parameter sets forget the counts", {
            {SC SPS SC PPS SC IDR, 0, {}},
            {SC P, 33, {"key 0 " SC SPS SC PPS SC IDR}},
            {SC SPS SC PPS SC IDR, 66, {"pic 33 " SC P, "key 66 " SC SPS SC PPS SC IDR}},
            {SC SPS_720 SC PPS SC IDR, 100, {}},
            {SC IDR_1, 100, {}},
            {SC P, 133, {"key 100 " SC SPS_720 SC PPS SC IDR SC IDR_1}}}},
        {"MP4 pictures: lengths, no parameter sets or delimiters, no filler", {
            {SC SPS SC PPS SC AUD SC IDR SC FILL, 0, {}},
            {SC AUD SC P SC FILL, 33, {"key 0 00000004 65888421"}},
            {SC AUD, 66, {"pic 33 00000004 419a0011"}}},
         AccessUnitGatherer::Prefix::kLength, false},
        {"slices of a picture begun before the first call are dropped quietly", {
            {SC IDR_1, 0, {}},
            {SC P_1, 0, {}},
            {SC P, 33, {}},
            {SC AUD, 66, {"pic 33 " SC P}}}},
        {"a picture over the limit is lost, and its count still learnt", {
            {SC IDR SC IDR_1, 0, {}},
            {SC P, 33, {"too large"}},
            {SC IDR SC IDR_1, 66, {"pic 33 " SC P, "too large"}}},
         AccessUnitGatherer::Prefix::kStartCode, true, 12},
    };
    // clang-format on
    for (const Case& c : cases) Gather(c);
}

TEST(AccessUnitGathererTest, SliceKindsFromTheSliceHeader) {
    const std::pair<const char*, SliceKind> cases[] = {
        {IDR, SliceKind::kIdr},
        {IDR_1, SliceKind::kIdr},
        {P, SliceKind::kP},
        {P_1, SliceKind::kP},
        {I, SliceKind::kI},
        {B, SliceKind::kB},
        {"41 e0", SliceKind::kP},                          // slice_type 0
        {"41 a8", SliceKind::kB},                          // 1
        {"41 92", SliceKind::kP},                          // 3: SP
        {"41 96", SliceKind::kI},                          // 4: SI
        {"41 00 00 03 01 00 00 03 00 68", SliceKind::kP},  // emulation prevented: 5
        {"41 8b 80", SliceKind::kUnknown},                 // slice_type 10
        {"41 00", SliceKind::kUnknown},                    // cut short
        {"41", SliceKind::kUnknown},
        {"67 42", SliceKind::kUnknown},  // not a slice
    };
    for (const auto& c : cases) {
        const Bytes nal = Unhex(c.first);
        EXPECT_EQ(SliceKindOf(nal.data(), nal.size()), c.second) << c.first;
    }
}

}  // namespace
