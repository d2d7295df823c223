#include "media/MediaStreamMP4A.h"

#include <cstdio>
#include <cstring>

#include "rtp/RtpPackets.h"

MediaStreamMP4A::MediaStreamMP4A(const char* name, int object)
    : MediaStream(name, kMediaTypeMP4A), m_object(object) {}

bool MediaStreamMP4A::Init(int channels, int sample_rate, int object) {
    m_channels = channels;
    m_sample_rate = sample_rate;
    m_object = object;
    return true;
}

int MediaStreamMP4A::FrequencyIndex(int rate) {
    if (rate > 94999) return 0;
    if (rate >= 87200) return 1;
    if (rate >= 63000) return 2;
    if (rate >= 47000) return 3;
    if (rate >= 43100) return 4;
    if (rate >= 31000) return 5;
    if (rate >= 23000) return 6;
    if (rate >= 21050) return 7;
    if (rate >= 15000) return 8;
    if (rate >= 11000) return 9;
    if (rate >= 10025) return 10;
    if (rate >= 7000) return 11;
    if (rate >= -1000) return 12;
    return 15;
}

void MediaStreamMP4A::Config(int sample_rate, int channels, uint8_t out[2]) {
    int index = FrequencyIndex(sample_rate);
    // 5 bits object type (2, AAC LC), 4 bits frequency index, 4 bits channels, 3 bits zero.
    out[0] = static_cast<uint8_t>(0x10 | ((index >> 1) & 0xF));
    out[1] = static_cast<uint8_t>(((((index & 1) * 8 + (channels >> 1)) & 0xF) << 4) |
                                  (((channels & 1) * 8) & 0xF));
}

std::string MediaStreamMP4A::ConfigString(int sample_rate, int channels) {
    static const char kHex[] = "0123456789abcdef";
    uint8_t config[2];
    Config(sample_rate, channels, config);
    std::string s(4, '0');
    for (int i = 0; i < 4; ++i) s[i] = kHex[(config[i / 2] >> (i % 2 == 0 ? 4 : 0)) & 0xF];
    return s;
}

std::string MediaStreamMP4A::GenerateMediaSdp(unsigned payload_type, int with_control) {
    m_rtp_payload_type = static_cast<int>(payload_type);
    char line[256];
    std::string sdp;
    snprintf(line, sizeof line, "m=audio %u RTP/AVP %u\r\n", m_remote_port, payload_type);
    sdp += line;
    snprintf(line, sizeof line, "a=rtpmap:%u MPEG4-GENERIC/%u/%u\r\n", payload_type,
             static_cast<unsigned>(m_sample_rate), static_cast<unsigned>(m_channels));
    sdp += line;
    snprintf(line, sizeof line,
             "a=fmtp:%u streamtype=5; profile-level-id=1; mode=AAC-hbr; config=%s; SizeLength=13; "
             "IndexLength=3; IndexDeltaLength=3;\r\n",
             payload_type, ConfigString(m_sample_rate, m_channels).c_str());
    sdp += line;
    if (with_control != 0) {
        snprintf(line, sizeof line, "a=control:trackID=%d\r\n",
                 static_cast<int>(payload_type) - 95);
        sdp += line;
    }
    return sdp;
}

int MediaStreamMP4A::TransportData(unsigned char* frame, unsigned len, int timestamp) {
    TLock::Scoped hold(m_state_lock);
    if (m_playing == 0 || frame == nullptr || len < kAdtsHeaderBytes ||
        m_packet_size <= kRtpHeaderSize + kAuHeaderSectionBytes) {
        return 0;
    }
    unsigned frame_length = ((frame[3] & 0x03u) << 11) | (frame[4] << 3) | (frame[5] >> 5);
    unsigned header = kAdtsHeaderBytes + ((frame[1] & 0x01) == 0 ? 2 : 0);  // CRC when not absent
    if (frame_length > len) frame_length = len;
    if (frame_length <= header) return 0;
    unsigned size = frame_length - header;
    const unsigned max_piece = m_packet_size - kRtpHeaderSize - kAuHeaderSectionBytes;
    m_au_buffer.ExtendBuffer(max_piece + kAuHeaderSectionBytes);
    unsigned char* out = m_au_buffer.GetData();
    // Every piece repeats the AU header with the size of the whole access unit.
    WriteAuHeaderSection(out, size);
    unsigned char* piece = frame + header;
    unsigned remaining = size;
    int total = 0;
    while (remaining > 0) {
        unsigned n = remaining < max_piece ? remaining : max_piece;
        memcpy(out + kAuHeaderSectionBytes, piece, n);
        remaining -= n;
        piece += n;
        total += SendPacket(out, n + kAuHeaderSectionBytes, timestamp, remaining == 0 ? 1 : 0);
    }
    return total;
}
