#pragma once

#include <string>

#include "buffers/Buffer.h"
#include "media/MediaStream.h"

// The H.264 track: SDP with the fixed parameter sets chosen by the capture width, and an
// RFC 6184 packetiser (single NAL unit and FU-A) for its own transport.
// Thread contract: as MediaStream.
class MediaStreamH264 : public MediaStream {
public:
    explicit MediaStreamH264(const char* name);

    using MediaStream::Init;
    // The picture parameters (the first two are the picture size) and a text, kept for the SDP.
    virtual bool Init(unsigned param1, unsigned param2, unsigned param3, std::string text);
    std::string GenerateMediaSdp(unsigned payload_type, int with_control) override;
    int TransportData(unsigned char* data, unsigned len, int timestamp) override;
    // One NAL unit with its 3-byte start code; SPS, PPS and units under 5 bytes are skipped.
    int TransportH264Nal(unsigned char* nal, unsigned len, int timestamp, bool last);

    // The fmtp parameters announced for a capture width.
    static const char* FmtpForWidth(unsigned width);
    // kv.orvex.sdp=live (unset on the television, which keeps the fixed texts): the SDP
    // describes the stream as it is, its own parameter sets and profile.
    static bool DescribesLiveStream();
    static std::string LiveFmtp(unsigned width, unsigned height);

private:
    class NalPayloads;

    unsigned m_param1 = 0;
    unsigned m_param2 = 0;
    unsigned m_param3 = 0;
    std::string m_text;
    Buffer m_fu_buffer;  // each packet's payload is built here
};
