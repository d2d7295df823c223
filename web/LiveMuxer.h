#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "codec/AccessUnitGatherer.h"
#include "stream/FrameTap.h"
#include "web/FragmentRing.h"

// Turns the encoded frames into the live fMP4 stream of the web viewers: NAL units are
// gathered into pictures (length-prefixed, as MP4 wants them), each picture and each AAC
// frame becomes one fragment, and a new init segment starts the stream at the first key frame
// and whenever the SPS or PPS change.
// Thread contract: the frame tap calls OnVideoFrame and OnAudioFrame one at a time (it
// serialises its sinks), so the muxer's own state needs no lock; the ring has its own.
class LiveMuxer : public EncodedFrameSink, private AccessUnitGatherer::Sink {
public:
    explicit LiveMuxer(FragmentRing* ring);

    void OnVideoFrame(const uint8_t* data, size_t len, uint32_t time_ms) override;
    void OnAudioFrame(const uint8_t* data, size_t len, uint32_t time_ms) override;

    // Counters for the log and the tests.
    unsigned dropped_pictures() const { return m_dropped_pictures; }
    unsigned restarts() const { return m_restarts; }

private:
    void OnPicture(const AccessUnitGatherer::Picture& picture) override;
    void OnPictureLost(AccessUnitGatherer::Loss loss) override;
    bool StartStream(uint32_t time_ms);
    bool AudioWanted(uint32_t now_ms) const;

    FragmentRing* m_ring;
    uint32_t m_sequence = 0;

    AccessUnitGatherer m_gatherer;
    // The parameter sets of the running stream's init segment.
    std::vector<uint8_t> m_stream_sps, m_stream_pps;
    bool m_started = false;
    bool m_stream_has_audio = false;
    uint32_t m_origin_ms = 0;  // time 0 of both tracks

    uint32_t m_picture_duration = 3000;  // the last picture's, in 90 kHz ticks
    uint64_t m_last_decode_time = 0;
    unsigned m_pictures_sent = 0;  // in the running stream

    // Sound: the last frame's arrival, and the running count of samples since the origin.
    unsigned m_pictures_seen = 0;
    uint32_t m_last_seen_ms = 0;      // the last picture's time, sent or not
    uint32_t m_capture_start_ms = 0;  // the first picture after a pause
    bool m_audio_seen = false;
    uint32_t m_last_audio_ms = 0;
    bool m_audio_running = false;
    uint64_t m_audio_samples = 0;

    std::vector<uint8_t> m_scratch;  // init segments and fragment headers

    unsigned m_dropped_pictures = 0;
    unsigned m_restarts = 0;
};
