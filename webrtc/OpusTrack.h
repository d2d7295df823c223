#pragma once

#include <cstddef>
#include <cstdint>

struct OpusEncoder;

namespace webrtc {

// The sound as WebRTC viewers take it: Opus at 48 kHz, stereo (RFC 7587), encoded from the
// same PCM blocks the AAC encoder takes, one 20 ms block (960 samples) per packet.
// Thread contract: NOT thread safe; the audio tap's calls, which are serialised.
class OpusTrack {
public:
    static constexpr unsigned kRate = 48000;
    static constexpr unsigned kChannels = 2;
    static constexpr unsigned kFrameSamples = 960;  // 20 ms at 48 kHz
    static constexpr size_t kMaxPacket = 1000;      // 96 kbit/s is 240 bytes a frame

    OpusTrack();
    ~OpusTrack();
    OpusTrack(const OpusTrack&) = delete;
    OpusTrack& operator=(const OpusTrack&) = delete;

    bool ok() const { return m_encoder != nullptr; }
    // Takes PCM frames (interleaved stereo) and encodes each whole 20 ms as it fills; `packet`
    // is called with each encoded packet and the RTP time stamp of its first sample.
    template <typename F>
    void Add(const int16_t* samples, size_t frames, F&& packet) {
        while (frames > 0) {
            size_t take = kFrameSamples - m_filled;
            if (take > frames) take = frames;
            for (size_t i = 0; i < take * kChannels; ++i)
                m_block[m_filled * kChannels + i] = samples[i];
            m_filled += take;
            samples += take * kChannels;
            frames -= take;
            if (m_filled < kFrameSamples) break;
            m_filled = 0;
            const int n = Encode();
            if (n > 0) packet(m_packet, static_cast<size_t>(n), m_timestamp);
            m_timestamp += kFrameSamples;
        }
    }

private:
    int Encode();

    OpusEncoder* m_encoder = nullptr;
    int16_t m_block[kFrameSamples * kChannels] = {};
    size_t m_filled = 0;
    uint32_t m_timestamp = 0;
    uint8_t m_packet[kMaxPacket] = {};
};

}  // namespace webrtc
