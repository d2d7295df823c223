#pragma once

#include <cstddef>
#include <cstdint>

// A consumer of the encoded frames beside the RTP send rings (the web viewer, the publisher).
// Frames reach it as the producers hand them to the server, before the rings, so a consumer
// sees every frame whether or not the rings had room.
class EncodedFrameSink {
public:
    virtual ~EncodedFrameSink() = default;
    // One H.264 NAL unit as the recorder delivers it (Annex B start code included), stamped with
    // the monotonic millisecond clock the video ring uses. Called on a binder pool thread (one
    // at a time: calls are serialised by the tap): copy what is needed and return, never block.
    virtual void OnVideoFrame(const uint8_t* data, size_t len, uint32_t time_ms) = 0;
    // One AAC frame as the encoder gives it (behind its ADTS header on both platforms), 1024
    // samples, with the producer's time stamp (the monotonic clock when the producer gave
    // none). Called on the AAC encoder thread.
    virtual void OnAudioFrame(const uint8_t* data, size_t len, uint32_t time_ms) = 0;
    // The PCM the AAC encoder takes (16-bit little-endian, interleaved at kAudioRate and
    // kAudioChannels of StreamFacts.h), for a consumer that encodes the sound its own way; one
    // block per call, on the AAC encoder thread. Most consumers want the AAC frames only.
    virtual void OnAudioPcm(const int16_t* samples, size_t frames, uint32_t time_ms) {
        (void)samples, (void)frames, (void)time_ms;
    }
};

// Any thread. At most kMaxFrameSinks sinks; false when full or already added.
// RemoveFrameSink returns only once no call into the sink is under way.
constexpr int kMaxFrameSinks = 4;
bool AddFrameSink(EncodedFrameSink* sink);
void RemoveFrameSink(EncodedFrameSink* sink);

// Called by the server's frame entry points. With no sink added they cost one atomic load.
void TapVideoFrame(const uint8_t* data, size_t len);
void TapAudioFrame(const uint8_t* data, size_t len, uint32_t time_ms);
// `len` bytes of interleaved 16-bit PCM; a trailing odd sample is left out.
void TapAudioPcm(const uint8_t* data, size_t len, uint32_t time_ms);
