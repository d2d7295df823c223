#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "codec/AnnexB.h"

// Gathers the NAL units a recorder hands over (one or a few per call) into pictures for the
// consumers beside the RTP rings, which send whole access units. A picture ends where the next
// one begins (BeginsNextAccessUnit). Waiting for that costs a frame interval, so the gatherer
// learns how many slices a picture has, per kind (IDR, I, P, B, by its first slice): once a
// picture of that kind has ended, the next one goes at the end of the call that brings it to
// that count. Kinds differ (an encoder may cut its key pictures into more slices), so a kind
// never seen waits for its end. The count kept is the largest seen; when a further slice of a
// picture already sent comes anyway, that slice is dropped, the consumer is told, and the
// count grows to what that picture really had. New parameter sets (another stream) forget the
// counts. Filler data (bit-rate padding) is left out.
// Thread contract: NOT thread safe; the frame tap's calls, which are serialised.
class AccessUnitGatherer {
public:
    // Each NAL unit in a picture behind its 4-byte length (MP4) or a 4-byte start code.
    enum class Prefix { kLength, kStartCode };
    enum class Loss {
        kTooLarge,   // over the size limit: the picture is not delivered
        kSentEarly,  // a slice of a picture already delivered came: that picture lacks it
    };
    struct Picture {
        const uint8_t* data;
        size_t len;
        uint32_t time_ms;  // of its first NAL unit
        bool key;          // holds an IDR slice
    };
    class Sink {
    public:
        virtual ~Sink() = default;
        virtual void OnPicture(const Picture& picture) = 0;
        virtual void OnPictureLost(Loss loss) = 0;
    };

    static constexpr size_t kMaxParameterSet = 1024;

    // `keep_headers`: SPS, PPS and delimiters stay in the picture (Annex B consumers);
    // without it they are left out, the parameter sets being carried apart (MP4's avcC).
    AccessUnitGatherer(Sink* sink, Prefix prefix, bool keep_headers, size_t max_bytes);

    void Add(const uint8_t* annexb, size_t len, uint32_t time_ms);

    // The parameter sets last seen, NAL header byte first.
    const std::vector<uint8_t>& sps() const { return m_sps; }
    const std::vector<uint8_t>& pps() const { return m_pps; }

private:
    void OnNal(const uint8_t* nal, size_t len, uint32_t time_ms);
    void Append(const uint8_t* nal, size_t len, uint32_t time_ms);
    void Finish();
    int& SlicesPerPicture(SliceKind kind) { return m_slices_per_kind[static_cast<int>(kind)]; }

    Sink* m_sink;
    Prefix m_prefix;
    bool m_keep_headers;
    size_t m_max_bytes;
    std::vector<uint8_t> m_sps, m_pps;
    std::vector<uint8_t> m_picture;  // capacity kept between pictures
    uint32_t m_picture_ms = 0;
    int m_slices = 0;
    SliceKind m_kind = SliceKind::kUnknown;  // of the picture's first slice
    bool m_key = false;
    bool m_too_large = false;
    // Slices a picture of each SliceKind has, the largest seen; 0: none has ended yet.
    int m_slices_per_kind[4] = {};
    // The picture last delivered before its end was seen, while that end is still to come.
    bool m_sent_early = false;
    SliceKind m_early_kind = SliceKind::kUnknown;
    int m_early_slices = 0;      // including the ones that came too late
    bool m_early_short = false;  // a slice of it came too late, and was told
};
