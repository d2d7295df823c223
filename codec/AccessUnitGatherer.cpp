#include "codec/AccessUnitGatherer.h"

#include <algorithm>
#include <iterator>

#include "codec/AnnexB.h"

namespace {

enum NalType : uint8_t { kSlice = 1, kIdr = 5, kSps = 7, kPps = 8, kAud = 9, kFiller = 12 };

}  // namespace

AccessUnitGatherer::AccessUnitGatherer(Sink* sink, Prefix prefix, bool keep_headers,
                                       size_t max_bytes)
    : m_sink(sink), m_prefix(prefix), m_keep_headers(keep_headers), m_max_bytes(max_bytes) {
    m_picture.reserve(512 * 1024);
}

void AccessUnitGatherer::Add(const uint8_t* annexb, size_t len, uint32_t time_ms) {
    ForEachNalUnit(annexb, len, [&](const uint8_t* nal, size_t n) { OnNal(nal, n, time_ms); });
    // Judged per call: a call may carry several slices of one picture.
    if (m_slices == 0 || m_kind == SliceKind::kUnknown) return;
    const int known = SlicesPerPicture(m_kind);
    if (known == 0 || m_slices < known) return;
    m_early_kind = m_kind;
    m_early_slices = m_slices;
    Finish();
    m_sent_early = true;
    m_early_short = false;
}

void AccessUnitGatherer::OnNal(const uint8_t* nal, size_t len, uint32_t time_ms) {
    const uint8_t type = nal[0] & 0x1F;
    if (type == kFiller) return;
    const bool begins = BeginsNextAccessUnit(nal, len);
    if (begins) {
        if (m_slices > 0) Finish();
        m_sent_early = false;
    }
    const bool slice = type == kSlice || type == kIdr;
    if (slice && m_slices == 0 && !begins) {
        // The rest of a picture that is gone: delivered before its end, or begun before the
        // first call. The first is told once, and its kind's count grows to what it had.
        if (m_sent_early) {
            if (!m_early_short) m_sink->OnPictureLost(Loss::kSentEarly);
            m_early_short = true;
            int& count = SlicesPerPicture(m_early_kind);
            count = std::max(count, ++m_early_slices);
        }
        return;
    }
    if (type == kSps || type == kPps) {
        std::vector<uint8_t>& set = type == kSps ? m_sps : m_pps;
        if (len <= kMaxParameterSet && !std::equal(nal, nal + len, set.begin(), set.end())) {
            // Another stream (a new size, say), which the encoder may cut into more slices.
            if (type == kSps && !set.empty())
                std::fill(std::begin(m_slices_per_kind), std::end(m_slices_per_kind), 0);
            set.assign(nal, nal + len);
        }
    }
    if (m_keep_headers || (type != kSps && type != kPps && type != kAud)) {
        Append(nal, len, time_ms);
    }
    if (!slice) return;
    if (m_slices++ == 0) m_kind = SliceKindOf(nal, len);
    if (type == kIdr) m_key = true;
}

void AccessUnitGatherer::Append(const uint8_t* nal, size_t len, uint32_t time_ms) {
    if (m_picture.empty()) m_picture_ms = time_ms;
    if (m_too_large || m_picture.size() + 4 + len > m_max_bytes) {
        m_too_large = true;
        return;
    }
    const uint32_t n = static_cast<uint32_t>(len);
    const uint8_t length[4] = {static_cast<uint8_t>(n >> 24), static_cast<uint8_t>(n >> 16),
                               static_cast<uint8_t>(n >> 8), static_cast<uint8_t>(n)};
    static const uint8_t kStartCode[4] = {0, 0, 0, 1};
    const uint8_t* prefix = m_prefix == Prefix::kLength ? length : kStartCode;
    m_picture.insert(m_picture.end(), prefix, prefix + 4);
    m_picture.insert(m_picture.end(), nal, nal + len);
}

void AccessUnitGatherer::Finish() {
    if (m_kind != SliceKind::kUnknown) {
        int& count = SlicesPerPicture(m_kind);
        count = std::max(count, m_slices);
    }
    if (m_too_large) {
        m_sink->OnPictureLost(Loss::kTooLarge);
    } else {
        m_sink->OnPicture(Picture{m_picture.data(), m_picture.size(), m_picture_ms, m_key});
    }
    m_picture.clear();
    m_slices = 0;
    m_kind = SliceKind::kUnknown;
    m_key = false;
    m_too_large = false;
}
