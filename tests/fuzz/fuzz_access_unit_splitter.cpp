// Arbitrary bytes as an H.264 file read by orvex-feed: split into access units, in one call or
// in two pieces as a pipe delivers them (the first byte picks the cut), then each unit into
// the NAL units it sends. Every span must lie inside its unit.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <vector>

#include "tools/AccessUnitSplitter.h"

namespace {

void Check(const std::vector<std::vector<uint8_t>>& units) {
    for (const auto& unit : units) {
        for (const tools::Span& s : tools::NalUnitSpans(unit.data(), unit.size())) {
            if (s.begin >= s.end || s.end > unit.size()) abort();
        }
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 1) return 0;
    const uint8_t* stream = data + 1;
    size_t length = size - 1;
    Check(tools::SplitAccessUnits(stream, length));
    size_t cut = length == 0 ? 0 : data[0] % (length + 1);
    size_t consumed = 0;
    Check(tools::SplitAccessUnits(stream, cut, false, &consumed));
    if (consumed > cut) abort();
    Check(tools::SplitAccessUnits(stream + consumed, length - consumed));
    return 0;
}
