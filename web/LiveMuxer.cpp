#include "web/LiveMuxer.h"

#include <cstdlib>
#include <string>

#include "media/AnnexB.h"
#include "platform/LogPort.h"
#include "rtp/h264_sps.h"
#include "service/OrvexLog.h"
#include "web/Fmp4.h"

namespace {

constexpr const char* kTag = "orvex:::web";
constexpr size_t kMaxParameterSet = 1024;
// A picture larger than this is dropped (with the pictures up to the next key frame, which
// depend on it): 4 MiB is far above what the recorder's bit rates give.
constexpr size_t kMaxPicture = 4u << 20;
// Sound is part of a new stream when a frame came this recently.
constexpr uint32_t kAudioRecentMs = 3000;
// The sound's own count of samples follows its time stamps unless they part by more.
constexpr int64_t kAudioResyncSamples = 200 * 48;

enum NalType : uint8_t {
    kSlice = 1,
    kIdr = 5,
    kSei = 6,
    kSps = 7,
    kPps = 8,
    kAud = 9,
    kFiller = 12
};

}  // namespace

LiveMuxer::LiveMuxer(FragmentRing* ring) : m_ring(ring) {
    m_picture.reserve(512 * 1024);
    m_scratch.resize(4096);
}

void LiveMuxer::OnVideoFrame(const uint8_t* data, size_t len, uint32_t time_ms) {
    ForEachNalUnit(data, len, [&](const uint8_t* nal, size_t n) { OnNal(nal, n, time_ms); });
}

void LiveMuxer::OnNal(const uint8_t* nal, size_t len, uint32_t time_ms) {
    const uint8_t type = nal[0] & 0x1F;
    switch (type) {
        case kSps:
        case kPps: {
            if (m_picture_slices > 0) FinishPicture();
            std::vector<uint8_t>& set = type == kSps ? m_sps : m_pps;
            if (len <= kMaxParameterSet) set.assign(nal, nal + len);
            return;
        }
        case kAud:
        case kSei:
            if (m_picture_slices > 0) FinishPicture();
            if (type == kSei) {
                if (m_picture.empty()) m_picture_ms = time_ms;
                AddToPicture(nal, len);
            }
            return;
        case kFiller:  // bit-rate padding: nothing a viewer needs
            return;
        case kSlice:
        case kIdr: {
            // first_mb_in_slice is the slice header's first field: a leading 1 bit is ue(v) 0.
            const bool first_slice = len > 1 && (nal[1] & 0x80) != 0;
            if (m_picture_slices > 0 && first_slice) FinishPicture();
            if (m_picture_slices == 0 && !first_slice) {
                // The rest of a picture that is gone: sent before its end (so wait for picture
                // ends from now on), or never begun.
                if (m_sent_early) m_slices_per_picture = 0;
                m_sent_early = false;
                return;
            }
            m_sent_early = false;
            if (m_picture.empty()) m_picture_ms = time_ms;
            AddToPicture(nal, len);
            ++m_picture_slices;
            if (type == kIdr) m_picture_key = true;
            if (m_slices_per_picture > 0 && m_picture_slices >= m_slices_per_picture) {
                FinishPicture();
                m_sent_early = true;
            }
            return;
        }
        default:
            if (m_picture.empty()) m_picture_ms = time_ms;
            AddToPicture(nal, len);
            return;
    }
}

void LiveMuxer::AddToPicture(const uint8_t* nal, size_t len) {
    if (m_picture_too_large || m_picture.size() + 4 + len > kMaxPicture) {
        m_picture_too_large = true;
        return;
    }
    const uint32_t n = static_cast<uint32_t>(len);
    const uint8_t prefix[4] = {static_cast<uint8_t>(n >> 24), static_cast<uint8_t>(n >> 16),
                               static_cast<uint8_t>(n >> 8), static_cast<uint8_t>(n)};
    m_picture.insert(m_picture.end(), prefix, prefix + 4);
    m_picture.insert(m_picture.end(), nal, nal + len);
}

void LiveMuxer::FinishPicture() {
    const bool key = m_picture_key;
    const int slices = m_picture_slices;
    m_picture_key = false;
    m_picture_slices = 0;
    if (slices == 0) {
        m_picture.clear();
        return;
    }
    m_slices_per_picture = slices;
    if (m_picture_too_large) {
        OrvexLogPriority(platform::kLogWarn, kTag,
                         "a picture over %zu bytes: the web viewers skip to the next key frame",
                         kMaxPicture);
        m_picture_too_large = false;
        m_started = false;  // nothing that depends on it may follow
        m_picture.clear();
        ++m_dropped_pictures;
        return;
    }
    // After a pause in the pictures capture has started anew, and its sound with it.
    const uint32_t pause = m_picture_ms - m_last_seen_ms;
    if (m_pictures_seen++ == 0 || pause > 1000) {
        m_audio_seen = false;
        m_capture_start_ms = m_picture_ms;
        // The stream's time goes on from where it stopped: a gap would stall the players at
        // it, and a new stream would make every viewer connect again.
        if (m_started && m_pictures_seen > 1) {
            m_origin_ms += pause - m_picture_duration / 90;
            m_audio_running = false;
        }
    }
    m_last_seen_ms = m_picture_ms;
    const bool want_audio = AudioWanted(m_picture_ms);
    if (key && (!m_started || m_sps != m_stream_sps || m_pps != m_stream_pps ||
                want_audio != m_stream_has_audio)) {
        if (!StartStream(m_picture_ms)) m_started = false;
    }
    if (!m_started) {
        m_picture.clear();
        ++m_dropped_pictures;
        return;
    }
    const uint32_t since_last = m_picture_ms - m_last_picture_ms;
    if (since_last >= 1 && since_last <= 1000) m_picture_duration = since_last * 90;
    uint64_t decode_time = uint64_t{static_cast<uint32_t>(m_picture_ms - m_origin_ms)} * 90;
    // Two pictures handed over within one millisecond still get increasing times.
    if (m_pictures_sent > 0 && decode_time <= m_last_decode_time)
        decode_time = m_last_decode_time + 1;
    const size_t head = fmp4::WriteFragmentHeader(
        ++m_sequence, fmp4::kVideoTrack, decode_time, m_picture_duration,
        static_cast<uint32_t>(m_picture.size()), key, m_scratch.data(), m_scratch.size());
    if (head == 0 ||
        !m_ring->Append(m_scratch.data(), head, m_picture.data(), m_picture.size(), key)) {
        ++m_dropped_pictures;
        if (key) m_started = false;  // the pictures after it cannot be decoded without it
    }
    m_last_picture_ms = m_picture_ms;
    m_last_decode_time = decode_time;
    ++m_pictures_sent;
    m_picture.clear();
}

bool LiveMuxer::AudioWanted(uint32_t now_ms) const {
    // Capture starts both tracks at once, so sound is expected until a while has passed
    // without any; a stream without it is begun anew when it comes.
    // Signed: the sound's stamps may run a little ahead of the pictures'.
    const uint32_t since = m_audio_seen ? m_last_audio_ms : m_capture_start_ms;
    return static_cast<int32_t>(now_ms - since) < static_cast<int32_t>(kAudioRecentMs);
}

bool LiveMuxer::StartStream(uint32_t time_ms) {
    fmp4::VideoConfig video{};
    if (m_sps.empty() || m_pps.empty() ||
        !h264_picture_size(m_sps.data(), m_sps.size(), &video.width, &video.height)) {
        OrvexLogPriority(platform::kLogWarn, kTag,
                         "a key frame without a usable SPS and PPS: the web viewers wait for the "
                         "next");
        return false;
    }
    video.sps = m_sps.data();
    video.sps_len = m_sps.size();
    video.pps = m_pps.data();
    video.pps_len = m_pps.size();
    fmp4::AudioConfig audio{};
    // AudioSpecificConfig: AAC-LC (2), sampling frequency index 3 (48 kHz), channels.
    audio.asc[0] = 0x11;
    audio.asc[1] = static_cast<uint8_t>(0x80 | (kAudioChannels << 3));
    audio.sample_rate = kAudioRate;
    audio.channels = kAudioChannels;
    const bool with_audio = AudioWanted(time_ms);

    const size_t need = 2048 + m_sps.size() + m_pps.size();
    if (m_scratch.size() < need) m_scratch.resize(need);
    const size_t n = fmp4::WriteInitSegment(&video, with_audio ? &audio : nullptr, m_scratch.data(),
                                            m_scratch.size());
    if (n == 0) {
        OrvexLogPriority(platform::kLogWarn, kTag,
                         "the stream's SPS/PPS make no init segment: the web viewers wait for the "
                         "next key frame");
        return false;
    }
    std::string type = "video/mp4; codecs=\"" + fmp4::AvcCodecString(video);
    if (with_audio) type += "," + fmp4::AacCodecString(audio);
    type += "\"";
    m_ring->Restart(m_scratch.data(), n, type);
    m_stream_sps = m_sps;
    m_stream_pps = m_pps;
    m_stream_has_audio = with_audio;
    m_started = true;
    m_origin_ms = time_ms;
    m_last_picture_ms = time_ms;
    m_audio_running = false;
    m_pictures_sent = 0;
    ++m_restarts;
    OrvexLog(kTag, "web stream %ux%u %s\n", video.width, video.height, type.c_str());
    return true;
}

void LiveMuxer::OnAudioFrame(const uint8_t* data, size_t len, uint32_t time_ms) {
    // The encoder frames its output in ADTS; MP4 carries the raw frame (browsers refuse the
    // header), and the init segment says what the header would.
    if (!StripAdtsHeader(&data, &len)) return;
    m_audio_seen = true;
    m_last_audio_ms = time_ms;
    if (!m_started || !m_stream_has_audio) return;
    // Capture is starting again: the sound waits for the picture, which sets the time anew.
    if (static_cast<int32_t>(time_ms - m_last_seen_ms) > 1000) return;
    const int32_t since = static_cast<int32_t>(time_ms - m_origin_ms);
    if (since < 0) return;  // from before the stream's first picture
    const uint64_t stamped = static_cast<uint64_t>(since) * (kAudioRate / 1000);
    const int64_t drift = static_cast<int64_t>(stamped) - static_cast<int64_t>(m_audio_samples);
    if (!m_audio_running || std::llabs(drift) > kAudioResyncSamples) {
        m_audio_samples = stamped;
        m_audio_running = true;
    }
    const size_t head = fmp4::WriteFragmentHeader(++m_sequence, fmp4::kAudioTrack, m_audio_samples,
                                                  1024, static_cast<uint32_t>(len), true,
                                                  m_scratch.data(), m_scratch.size());
    if (head != 0) m_ring->Append(m_scratch.data(), head, data, len, false);
    m_audio_samples += 1024;
}
