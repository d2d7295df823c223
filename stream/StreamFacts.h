#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

#include "sync/thread_mutex.h"

namespace stream {

// What the live picture stream says of itself: its latest parameter sets and the picture size
// they give, read from the encoded frames as they enter the service (whatever encoder made
// them: the recorder, or a stream fed from outside), and when the last frame came. Consumers
// that must describe the stream before sending it (an RTSP DESCRIBE) ask here instead of
// assuming an encoder.
// Thread contract: thread safe; Note on the frame entry's thread, the rest on any.
class StreamFacts {
public:
    struct Video {
        std::string sps;  // NAL units without start codes
        std::string pps;
        uint16_t width = 0;
        uint16_t height = 0;
        uint64_t last_frame_ms = 0;  // steady clock; 0: no frame yet
    };

    // One entering frame (Annex B): parameter sets in front of its first slice are taken.
    // Costs a scan up to that slice and, only when they changed, a copy.
    void Note(const uint8_t* data, size_t len, uint64_t now_ms);
    // False when no parameter sets were seen yet.
    bool Get(Video* out) const;
    // Waits until parameter sets were seen with a frame at or after `since_ms`, up to
    // `timeout_ms`; then as Get.
    bool WaitFresh(Video* out, uint64_t since_ms, int timeout_ms);

private:
    mutable thread_mutex m_lock;
    thread_condition m_changed;
    Video m_video ORVEX_GUARDED_BY(m_lock);
    uint64_t m_sets_frame_ms ORVEX_GUARDED_BY(m_lock) = 0;  // the frame the sets came with
};

// The service's one instance, fed by the frame entry.
StreamFacts& Facts();
uint64_t SteadyMs();

// The displayed size an SPS (NAL header byte first) gives; false when it gives none.
bool PictureSize(const uint8_t* sps, size_t len, uint16_t* width, uint16_t* height);

// The sound every platform's AAC encoder gives: AAC LC, 48 kHz, stereo.
constexpr uint32_t kAudioRate = 48000;
constexpr uint8_t kAudioChannels = 2;
// Its AudioSpecificConfig (ISO/IEC 14496-3 1.6.2.1): object type 2, frequency index 3,
// channel configuration 2: 0x11 0x90.
void AudioSpecificConfig(uint8_t out[2]);

// The a=fmtp parameters of an SDP that describes `video`: profile-level-id from its SPS,
// sprop-parameter-sets (RFC 6184 §8.1), packetization-mode=1. Pure.
std::string LiveH264Fmtp(const StreamFacts::Video& video);

}  // namespace stream
