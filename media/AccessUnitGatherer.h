#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

// Gathers the NAL units a recorder hands over (one or a few per call) into pictures for the
// consumers beside the RTP rings, which send whole access units. A picture ends where the next
// one begins (BeginsNextAccessUnit); once a picture is known to have N slices, the next one
// that reaches N goes at the end of that call instead of waiting for its successor's first
// NAL unit, a frame interval later. When that guess proves wrong (a further slice comes), the
// slice is dropped, the consumer is told, and pictures wait for their end until one teaches
// the count again. Filler data (bit-rate padding) is left out.
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

    Sink* m_sink;
    Prefix m_prefix;
    bool m_keep_headers;
    size_t m_max_bytes;
    std::vector<uint8_t> m_sps, m_pps;
    std::vector<uint8_t> m_picture;  // capacity kept between pictures
    uint32_t m_picture_ms = 0;
    int m_slices = 0;
    bool m_key = false;
    bool m_too_large = false;
    int m_slices_per_picture = 0;  // of the last picture that ended; 0: unknown
    bool m_sent_early = false;     // the picture just delivered went before its end was seen
};
