#pragma once

#include <cstddef>
#include <memory>
#include <string>

// Ports to the platform's sound capture (Android: AudioRecord, AudioSystem's audio flinger)
// and to its loadable AAC encoder library (VisualOn, voGetAACEncAPI).
// Thread contract: the record is used by the PCM thread only; the library by the encoder
// thread only.

namespace platform {

class AudioRecord {
public:
    virtual ~AudioRecord() = default;
    // AudioRecord::set with the given format and the minimum frame count; 0 on success.
    virtual int set(int input_source, unsigned sample_rate, int format, unsigned channel_mask,
                    size_t frame_count) = 0;
    virtual int start() = 0;
    virtual void stop() = 0;
    // Blocking read of up to `size` bytes: the count, or a value below 1 on error.
    virtual long read(void* buffer, size_t size) = 0;
};

class AudioRecordPort {
public:
    virtual ~AudioRecordPort() = default;
    virtual std::shared_ptr<AudioRecord> create(const std::string& package) = 0;
    // AudioRecord::getMinFrameCount: 0 and the count, or an error.
    virtual int getMinFrameCount(size_t* frame_count, unsigned sample_rate, int format,
                                 unsigned channel_mask) = 0;
    // AudioSystem::get_audio_flinger()->setParameters(io, text): false when there is no
    // audio flinger to ask.
    virtual bool setFlingerParameters(int io, const std::string& key_values) = 0;
};

// The encoder library as dlopen/dlsym reach it; the name differs per platform.
class AacLibraryPort {
public:
    virtual ~AacLibraryPort() = default;
    virtual const char* name() = 0;
    virtual void* open() = 0;
    virtual void* symbol(void* library, const char* symbol) = 0;
    virtual void close(void* library) = 0;
};

}  // namespace platform
