#include "media/MediaStreamH264.h"

#include <cstdio>
#include <cstring>

#include "codec/AnnexB.h"
#include "codec/H264Packetiser.h"
#include "config/GlobalConfig.h"
#include "config/LivecameraResolution.h"
#include "config/Settings.h"
#include "stream/StreamFacts.h"

MediaStreamH264::MediaStreamH264(const char* name) : MediaStream(name, kMediaTypeH264) {}

bool MediaStreamH264::Init(unsigned param1, unsigned param2, unsigned param3, std::string text) {
    m_param1 = param1;
    m_param2 = param2;
    m_param3 = param3;
    m_text = std::move(text);
    return true;
}

const char* MediaStreamH264::FmtpForWidth(unsigned width) {
    // Fixed Baseline 3.0 parameter sets per capture width; they do not describe the live
    // encoder's own, which arrive in band.
    if (width == 640) {
        return "profile-level-id=42401E; sprop-parameter-sets=Z0JAHqbAoD2hAAADAAEAAAMAKA8QIuA=,"
               "aMpDiA==; packetization-mode=1;";
    }
    if (width == 480) {
        return "profile-level-id=42401E; sprop-parameter-sets=Z0JAHqbB4KaEAAADAAQAAAMAoDxAi4A=,"
               "aMpDiA==; packetization-mode=1;";
    }
    return "profile-level-id=42401E; sprop-parameter-sets=Z0JAHqbBQfoQAAADABAAAAMCgPECLg==,"
           "aMpDiA==; packetization-mode=1;";
}

bool MediaStreamH264::DescribesLiveStream() {
    return config::Reread(config::Property::kSdp).number != 0;
}

std::string MediaStreamH264::LiveFmtp(unsigned width, unsigned height) {
    // A stream that is flowing is what the client will get, whatever size it asked for; a
    // stopped one still describes the next capture when the size is the same (one encoder,
    // one size, one SPS). Capture that is just starting gets a moment to send its first.
    constexpr uint64_t kFlowingMs = 500;
    constexpr int kStartWaitMs = 300;
    const uint64_t now = stream::SteadyMs();
    stream::StreamFacts::Video video;
    const bool known = stream::Facts().Get(&video);
    const bool flowing = known && now - video.last_frame_ms < kFlowingMs;
    if (flowing || (known && video.width == width && video.height == height))
        return stream::LiveH264Fmtp(video);
    if (stream::Facts().WaitFresh(&video, now, kStartWaitMs)) return stream::LiveH264Fmtp(video);
    // Nothing known: the parameter sets come in band, ahead of the first key picture.
    return "packetization-mode=1;";
}

std::string MediaStreamH264::GenerateMediaSdp(unsigned payload_type, int with_control) {
    m_rtp_payload_type = static_cast<int>(payload_type);
    Global_Config* config = Global_Config::instance();
    unsigned width = 0, height = 0;
    get_video_resolution(&width, &height);
    char line[256];
    std::string sdp;
    int pt = config->m_video_payload_type;
    snprintf(line, sizeof line, "m=video %u RTP/AVP %d\r\n", m_remote_port, pt);
    sdp += line;
    snprintf(line, sizeof line, "a=rtpmap:%d H264/%u\r\n", pt, config->m_video_rtp_frequency);
    sdp += line;
    if (DescribesLiveStream()) {
        sdp += "a=fmtp:" + std::to_string(pt) + " " + LiveFmtp(width, height) + "\r\n";
    } else {
        snprintf(line, sizeof line, "a=fmtp:%d %s\r\n", pt, FmtpForWidth(width));
        sdp += line;
    }
    if (with_control != 0) {
        snprintf(line, sizeof line, "a=control:trackID=%d\r\n",
                 static_cast<int>(payload_type) - 95);
        sdp += line;
    }
    return sdp;
}

int MediaStreamH264::TransportData(unsigned char* data, unsigned len, int timestamp) {
    TLock::Scoped hold(m_state_lock);
    if (m_playing == 0 || data == nullptr || len < 5) return 0;
    unsigned pos = static_cast<unsigned>(FindStartCode(data, len, 0));
    int total = 0;
    while (pos < len && len - pos >= 5) {
        unsigned next = static_cast<unsigned>(FindStartCode(data, len, pos + 3));
        bool last = next >= len;
        unsigned end = next;
        if (!last && next > pos + 3 && data[next - 1] == 0) end = next - 1;  // 0 0 0 1
        total += TransportH264Nal(data + pos, end - pos, timestamp, last);
        pos = next;
    }
    return total;
}

// Each payload through the track's transport; the marker only at the end of the last unit.
class MediaStreamH264::NalPayloads final : public H264PayloadSink {
public:
    NalPayloads(MediaStreamH264& track, int timestamp, bool last)
        : track_(track), timestamp_(timestamp), last_(last) {}
    void Payload(unsigned char* packet, unsigned length, bool end) override {
        int marker = last_ && end ? 1 : 0;
        total += track_.SendPacket(packet + kRtpHeaderSize, length, timestamp_, marker);
    }
    int total = 0;

private:
    MediaStreamH264& track_;
    int timestamp_;
    bool last_;
};

int MediaStreamH264::TransportH264Nal(unsigned char* nal, unsigned len, int timestamp, bool last) {
    if (nal == nullptr || len < 5 || m_packet_size <= kRtpHeaderSize + 2) return 0;
    unsigned type = nal[3] & 0x1F;
    if (type == 7 || type == 8) return 0;
    // Whole up to the packet size, else FU-A pieces that fill it; the unit's F bit is kept.
    const H264Packing packing = {m_packet_size - kRtpHeaderSize, m_packet_size - kRtpHeaderSize - 2,
                                 false, false};
    m_fu_buffer.ExtendBuffer(m_packet_size);
    NalPayloads payloads(*this, timestamp, last);
    PacketiseH264Nal(nal + 3, len - 3, packing, m_fu_buffer.GetData(), payloads);
    return payloads.total;
}
