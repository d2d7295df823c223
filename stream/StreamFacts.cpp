#include "stream/StreamFacts.h"

#include <chrono>
#include <cstdio>

#include "codec/AnnexB.h"
#include "codec/Base64.h"
#include "codec/h264_sps.h"

namespace stream {

uint64_t SteadyMs() {
    return static_cast<uint64_t>(std::chrono::duration_cast<std::chrono::milliseconds>(
                                     std::chrono::steady_clock::now().time_since_epoch())
                                     .count());
}

void StreamFacts::Note(const uint8_t* data, size_t len, uint64_t now_ms) {
    const uint8_t* sps = nullptr;
    const uint8_t* pps = nullptr;
    size_t sps_len = 0, pps_len = 0;
    // Parameter sets come before the slices: the walk ends at the first one.
    ForEachNalUnitWhile(data, len, [&](const uint8_t* nal, size_t nal_len) {
        const unsigned type = nal[0] & 0x1F;
        if (type >= 1 && type <= 5) return false;
        if (type == 7) {
            sps = nal;
            sps_len = nal_len;
        } else if (type == 8) {
            pps = nal;
            pps_len = nal_len;
        }
        return true;
    });
    thread_mutex::Scoped hold(m_lock);
    m_video.last_frame_ms = now_ms;
    if (sps == nullptr && pps == nullptr) return;
    if (sps != nullptr && m_video.sps.compare(0, std::string::npos,
                                              reinterpret_cast<const char*>(sps), sps_len) != 0) {
        uint16_t width = 0, height = 0;
        if (!h264_picture_size(sps, sps_len, &width, &height)) return;  // not one we can use
        m_video.sps.assign(reinterpret_cast<const char*>(sps), sps_len);
        m_video.width = width;
        m_video.height = height;
    }
    if (pps != nullptr) m_video.pps.assign(reinterpret_cast<const char*>(pps), pps_len);
    m_sets_frame_ms = now_ms;
    m_changed.notify_all();
}

bool StreamFacts::Get(Video* out) const {
    thread_mutex::Scoped hold(m_lock);
    if (m_video.sps.empty() || m_video.pps.empty()) return false;
    *out = m_video;
    return true;
}

bool StreamFacts::WaitFresh(Video* out, uint64_t since_ms, int timeout_ms) {
    const auto until = std::chrono::steady_clock::now() + std::chrono::milliseconds(timeout_ms);
    thread_mutex::Scoped hold(m_lock);
    while (m_sets_frame_ms < since_ms || m_video.sps.empty() || m_video.pps.empty()) {
        if (!m_changed.wait_until(m_lock, until)) break;
    }
    if (m_video.sps.empty() || m_video.pps.empty()) return false;
    *out = m_video;
    return true;
}

StreamFacts& Facts() {
    static StreamFacts* facts = new StreamFacts();  // never destroyed: frames may come late
    return *facts;
}

bool PictureSize(const uint8_t* sps, size_t len, uint16_t* width, uint16_t* height) {
    return h264_picture_size(sps, len, width, height);
}

void AudioSpecificConfig(uint8_t out[2]) {
    constexpr unsigned kObjectType = 2, kFrequencyIndex = 3;  // AAC LC, 48000 Hz
    out[0] = static_cast<uint8_t>(kObjectType << 3 | kFrequencyIndex >> 1);
    out[1] = static_cast<uint8_t>((kFrequencyIndex & 1) << 7 | kAudioChannels << 3);
}

std::string LiveH264Fmtp(const StreamFacts::Video& video) {
    std::string fmtp;
    if (video.sps.size() >= 4) {
        char id[7];
        snprintf(id, sizeof id, "%02X%02X%02X", static_cast<unsigned char>(video.sps[1]),
                 static_cast<unsigned char>(video.sps[2]),
                 static_cast<unsigned char>(video.sps[3]));
        fmtp += std::string("profile-level-id=") + id + "; ";
    }
    if (!video.sps.empty() && !video.pps.empty()) {
        std::string sps, pps;
        Base64Encode(reinterpret_cast<const unsigned char*>(video.sps.data()),
                     static_cast<unsigned>(video.sps.size()), sps);
        Base64Encode(reinterpret_cast<const unsigned char*>(video.pps.data()),
                     static_cast<unsigned>(video.pps.size()), pps);
        fmtp += "sprop-parameter-sets=" + sps + "," + pps + "; ";
    }
    return fmtp + "packetization-mode=1;";
}

}  // namespace stream
