#pragma once

#include <cstddef>
#include <memory>

#include "platform/AudioPorts.h"

// A thin owner of one platform audio record: 48000 Hz, stereo, 16-bit PCM from input 1.
// Thread contract: NOT thread safe; lives for one run of the PCM thread.
class orvexAudioRecord {
public:
    orvexAudioRecord();
    virtual ~orvexAudioRecord();

    // 0 when the record is set up with the minimum frame count, 1 otherwise.
    int setaudiorecord();
    // Minimum frames x channels x bytes per sample; -1 when the query fails.
    long getMinBufferSize();
    int start();
    int stop();
    long readaudiodata(void* buffer, size_t size);

private:
    std::shared_ptr<platform::AudioRecord> m_record;
    int m_channel_mask = 12;  // front left and right
    int m_format = 1;         // 16-bit signed PCM
    int m_channels = 2;
    int m_input_source = 1;
    unsigned m_sample_rate = 48000;
};
