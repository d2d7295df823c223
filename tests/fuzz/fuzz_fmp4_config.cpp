// Arbitrary stream parameters as the web viewer would take them from a capture source: the
// first 14 bytes are width, height (16 bits each), sample rate (24 bits), channels, the two ASC
// bytes, a selector (bit 0 video, bit 1 audio, bit 2 key), a cap picker and the SPS length
// (16 bits); the SPS and then the PPS follow, and the same bytes are an Annex B unit too. The
// fragment's numbers reuse the first bytes. Every writer runs with caps around the size it needs;
// none may write at or past its cap, and a written init segment must be whole boxes end to end.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "web/Fmp4.h"

namespace {

constexpr size_t kGuard = 32;
constexpr uint8_t kFill = 0xa5;

uint32_t Be(const uint8_t* p, size_t n) {
    uint32_t v = 0;
    for (size_t i = 0; i < n; ++i) v = v << 8 | p[i];
    return v;
}

// Box sizes from `at` to `end` must tile the range exactly; containers are checked inside too.
void CheckBoxes(const uint8_t* p, size_t at, size_t end) {
    static const char* const kContainers[] = {"moov", "trak", "mdia", "minf",
                                              "dinf", "stbl", "mvex"};
    while (at < end) {
        if (end - at < 8) abort();
        uint32_t size = Be(p + at, 4);
        if (size < 8 || size > end - at) abort();
        for (const char* type : kContainers) {
            if (memcmp(p + at + 4, type, 4) == 0) CheckBoxes(p, at + 8, at + size);
        }
        at += size;
    }
}

// Runs `write` into a buffer of `cap` bytes followed by a guard; returns what it wrote.
template <typename Write>
std::vector<uint8_t> Run(size_t cap, Write write) {
    std::vector<uint8_t> buf(cap + kGuard, kFill);
    size_t n = write(buf.data(), cap);
    if (n > cap) abort();
    for (size_t i = cap; i < buf.size(); ++i) {
        if (buf[i] != kFill) abort();
    }
    buf.resize(n);
    return buf;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 14) return 0;
    const uint8_t selector = data[10];
    const uint8_t picker = data[11];
    size_t sps_len = Be(data + 12, 2);
    const uint8_t* rest = data + 14;
    size_t rest_len = size - 14;
    if (sps_len > rest_len) sps_len = rest_len;
    fmp4::VideoConfig video{rest,
                            sps_len,
                            rest + sps_len,
                            rest_len - sps_len,
                            static_cast<uint16_t>(Be(data, 2)),
                            static_cast<uint16_t>(Be(data + 2, 2))};
    fmp4::AudioConfig audio{{data[8], data[9]}, Be(data + 4, 3), data[7]};
    const bool key = (selector & 4) != 0;
    const fmp4::VideoConfig* v = (selector & 1) ? &video : nullptr;
    const fmp4::AudioConfig* a = (selector & 2) ? &audio : nullptr;

    if (fmp4::AvcCodecString(video).size() > 11) abort();
    if (fmp4::AacCodecString(audio).size() > 11) abort();

    auto init = [&](uint8_t* out, size_t cap) { return fmp4::WriteInitSegment(v, a, out, cap); };
    std::vector<uint8_t> full = Run(4096 + 2 * size, init);
    if (!full.empty()) {
        CheckBoxes(full.data(), 0, full.size());
        if (Run(full.size(), init) != full) abort();
        if (!Run(full.size() - 1, init).empty()) abort();
        if (!Run(picker % full.size(), init).empty()) abort();
    }

    const uint32_t sample_size = Be(data + 4, 4);
    for (size_t cap : {fmp4::kFragmentHeaderSize, fmp4::kFragmentHeaderSize - 1,
                       static_cast<size_t>(picker % fmp4::kFragmentHeaderSize)}) {
        std::vector<uint8_t> header = Run(cap, [&](uint8_t* out, size_t c) {
            uint64_t decode_time = static_cast<uint64_t>(Be(data, 4)) << 32 | Be(data + 8, 4);
            return fmp4::WriteFragmentHeader(Be(data, 4), data[7], decode_time, Be(data + 2, 4),
                                             sample_size, key, out, c);
        });
        if (header.empty()) continue;
        if (header.size() != fmp4::kFragmentHeaderSize) abort();
        // moof, then an mdat header covering exactly the sample.
        CheckBoxes(header.data(), 0, header.size() - 8);
        if (Be(&header[header.size() - 8], 4) != 8 + static_cast<uint64_t>(sample_size)) abort();
    }

    auto avcc = [&](uint8_t* out, size_t cap) {
        return fmp4::AnnexBToAvcc(rest, rest_len, out, cap);
    };
    std::vector<uint8_t> converted = Run(rest_len + rest_len / 3 + 8, avcc);
    if (!converted.empty()) {
        // Length prefixes tile the output; each unit is shorter than what it came from.
        for (size_t at = 0; at < converted.size();) {
            if (converted.size() - at < 4) abort();
            uint32_t len = Be(&converted[at], 4);
            if (len == 0 || len > converted.size() - at - 4 || len > rest_len) abort();
            at += 4 + len;
        }
        if (!Run(converted.size() - 1, avcc).empty()) abort();
    }
    return 0;
}
