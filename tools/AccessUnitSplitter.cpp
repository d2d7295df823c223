#include "tools/AccessUnitSplitter.h"

#include "codec/AnnexB.h"

namespace tools {
namespace {

constexpr uint8_t kStartCode[4] = {0, 0, 0, 1};

// Where a start code found at `sc` begins, counting the zero of a 4-byte one.
size_t StartCodeBegin(const uint8_t* data, size_t sc) {
    return sc > 0 && data[sc - 1] == 0 ? sc - 1 : sc;
}

bool IsSlice(int type) { return type == 1 || type == 5; }

bool StartsUnit(int type, bool first_mb_zero, bool unit_has_slice) {
    if (type == 9) return true;
    if (!unit_has_slice) return false;
    if (IsSlice(type)) return first_mb_zero;
    return (type >= 6 && type <= 8) || (type >= 14 && type <= 18);
}

}  // namespace

std::vector<std::vector<uint8_t>> SplitAccessUnits(const uint8_t* data, size_t size, bool at_end,
                                                   size_t* consumed) {
    std::vector<std::vector<uint8_t>> units;
    size_t sc = FindStartCode(data, size, 0);
    if (sc == size) {
        // Keep a possible start code's first bytes for the next call.
        if (consumed != nullptr) *consumed = at_end ? size : size > 2 ? size - 2 : 0;
        return units;
    }
    std::vector<uint8_t> unit;
    bool unit_has_slice = false;
    size_t pending = StartCodeBegin(data, sc);
    for (;;) {
        size_t header = sc + 3;
        size_t next = FindStartCode(data, size, header);
        if (next == size && !at_end) break;
        size_t end = next;
        while (end > header && data[end - 1] == 0) --end;  // trailing_zero_8bits
        if (end > header) {
            int type = data[header] & 0x1f;
            // first_mb_in_slice is ue(v): its first bit is 1 exactly when it is 0.
            bool first_mb_zero = end > header + 1 && (data[header + 1] & 0x80) != 0;
            if (StartsUnit(type, first_mb_zero, unit_has_slice) && !unit.empty()) {
                units.push_back(std::move(unit));
                unit.clear();
                unit_has_slice = false;
                pending = StartCodeBegin(data, sc);
            }
            unit.insert(unit.end(), kStartCode, kStartCode + 4);
            unit.insert(unit.end(), data + header, data + end);
            unit_has_slice = unit_has_slice || IsSlice(type);
        }
        if (next == size) break;
        sc = next;
        if (unit.empty()) pending = StartCodeBegin(data, sc);
    }
    if (at_end) {
        if (!unit.empty()) units.push_back(std::move(unit));
        pending = size;
    }
    if (consumed != nullptr) *consumed = pending;
    return units;
}

std::vector<Span> NalUnitSpans(const uint8_t* unit, size_t size) {
    std::vector<Span> spans;
    size_t begin = FindFourByteStartCode(unit, size, 0);
    while (begin < size) {
        size_t end = FindFourByteStartCode(unit, size, begin + 4);
        spans.push_back({begin, end});
        begin = end;
    }
    return spans;
}

}  // namespace tools
