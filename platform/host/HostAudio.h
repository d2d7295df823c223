#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "platform/AudioPorts.h"

namespace platform {
namespace host {

// Sound on Linux: a record that delivers 48000 Hz stereo 16-bit PCM in real time, in blocks of
// at most the minimum buffer size (20 ms), from the source the property orvex.host.audio names
// at start: a test tone (1 kHz, beeping during the first 100 ms of every second of the host
// clock, as the test picture flashes), silence, or a GStreamer source (PulseAudio, ALSA, any
// pipeline). A source that cannot start fails start; one lost while recording gives silence.
// Thread contract: one reader thread per record.
class HostAudioRecordPort final : public AudioRecordPort {
public:
    std::shared_ptr<AudioRecord> create(const std::string& package) override;
    int getMinFrameCount(size_t* frame_count, unsigned sample_rate, int format,
                         unsigned channel_mask) override;
    bool setFlingerParameters(int io, const std::string& key_values) override;
};

// Fills `frames` stereo frames of the beeping tone for the samples that start at sample
// index `first` of a stream whose sample 0 is at `start_ms` on the host clock.
void FillTone(int16_t* out, size_t frames, uint64_t first, uint64_t start_ms);

// The AAC encoder library on Linux: Debian's libvo-aacenc, with the same VisualOn API
// (voGetAACEncAPI) as the television's library. Thread contract: any thread.
class HostAacLibrary final : public AacLibraryPort {
public:
    const char* name() override { return "libvo-aacenc.so.0"; }
    void* open() override;
    void* symbol(void* library, const char* symbol) override;
    void close(void* library) override;
};

}  // namespace host
}  // namespace platform
