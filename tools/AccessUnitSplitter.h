#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

namespace tools {

// Splits an H.264 Annex B byte stream into access units, each NAL unit behind a 4-byte start
// code whatever the input used. A unit begins at an access unit delimiter; at SPS, PPS, SEI
// (or NAL types 14-18) after a slice of the current unit; or at a slice whose
// first_mb_in_slice is 0 once the unit has a slice. Parameter sets thus travel with the
// picture that follows them. Bytes before the first start code are skipped.
//
// With `at_end` false the input may continue: the last unit (and a NAL whose end is not yet
// seen) is held back and `*consumed` tells where the bytes not yet split begin, so the caller
// passes them again with what it reads next. With `at_end` true everything is consumed.
// Thread contract: a pure function, any thread.
std::vector<std::vector<uint8_t>> SplitAccessUnits(const uint8_t* data, size_t size,
                                                   bool at_end = true, size_t* consumed = nullptr);

// The NAL units of one access unit as SplitAccessUnits makes it: [begin, end) spans, each with
// its 4-byte start code, in order. The platform recorder hands over one NAL unit per
// transaction, and the service stores each transaction as one unit.
struct Span {
    size_t begin;
    size_t end;
};
std::vector<Span> NalUnitSpans(const uint8_t* unit, size_t size);

}  // namespace tools
