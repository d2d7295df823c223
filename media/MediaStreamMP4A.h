#pragma once

#include <cstdint>
#include <string>

#include "buffers/Buffer.h"
#include "media/MediaStream.h"

// The AAC track: SDP (MPEG4-GENERIC, AAC-hbr) and an RFC 3640 packetiser for ADTS frames.
// Thread contract: as MediaStream.
class MediaStreamMP4A : public MediaStream {
public:
    MediaStreamMP4A(const char* name, int object);

    using MediaStream::Init;
    // The track's own format; three arguments so it never competes with Init(bitrate, size).
    virtual bool Init(int channels, int sample_rate, int object);
    std::string GenerateMediaSdp(unsigned payload_type, int with_control) override;
    int TransportData(unsigned char* frame, unsigned len, int timestamp) override;

    // MPEG-4 sampling frequency index for a rate (ISO/IEC 14496-3 table 1.18, by threshold).
    static int FrequencyIndex(int sample_rate);
    // AudioSpecificConfig of AAC LC: its two bytes (0x11 0x90 for 48000 Hz stereo), and the
    // same in four hex digits ("1190").
    static void Config(int sample_rate, int channels, uint8_t out[2]);
    static std::string ConfigString(int sample_rate, int channels);

    int object() const { return m_object; }

private:
    Buffer m_au_buffer;
    int m_channels = 2;
    int m_sample_rate = 48000;
    int m_object;
};
