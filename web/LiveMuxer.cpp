#include "web/LiveMuxer.h"

#include <algorithm>
#include <cstdlib>
#include <string>

#include "base/OrvexLog.h"
#include "codec/AnnexB.h"
#include "platform/LogPort.h"
#include "stream/StreamFacts.h"
#include "web/Fmp4.h"

namespace {

constexpr const char* kTag = "orvex:::web";
// A picture larger than this is dropped (with the pictures up to the next key frame, which
// depend on it): 4 MiB is far above what the recorder's bit rates give.
constexpr size_t kMaxPicture = 4u << 20;
// Sound is part of a new stream when a frame came this recently.
constexpr uint32_t kAudioRecentMs = 3000;
// The sound's own count of samples follows its time stamps unless they part by more.
constexpr int64_t kAudioResyncSamples = 200 * 48;

}  // namespace

LiveMuxer::LiveMuxer(FragmentRing* ring)
    : m_ring(ring), m_gatherer(this, AccessUnitGatherer::Prefix::kLength, false, kMaxPicture) {
    m_scratch.resize(4096);
}

void LiveMuxer::OnVideoFrame(const uint8_t* data, size_t len, uint32_t time_ms) {
    m_gatherer.Add(data, len, time_ms);
}

void LiveMuxer::OnPictureLost(AccessUnitGatherer::Loss loss) {
    if (loss != AccessUnitGatherer::Loss::kTooLarge) return;  // a slice short: still decodable
    OrvexLogPriority(platform::kLogWarn, kTag,
                     "a picture over %zu bytes: the web viewers skip to the next key frame",
                     kMaxPicture);
    m_started = false;  // nothing that depends on it may follow
    ++m_dropped_pictures;
}

void LiveMuxer::OnPicture(const AccessUnitGatherer::Picture& picture) {
    const bool key = picture.key;
    const uint32_t picture_ms = picture.time_ms;
    // After a pause in the pictures capture has started anew, and its sound with it.
    const uint32_t pause = picture_ms - m_last_seen_ms;
    if (m_pictures_seen++ == 0 || pause > 1000) {
        m_audio_seen = false;
        m_capture_start_ms = picture_ms;
        // The stream's time goes on from where it stopped: a gap would stall the players at
        // it, and a new stream would make every viewer connect again.
        if (m_started && m_pictures_seen > 1) {
            m_origin_ms += pause - m_picture_duration / 90;
            m_audio_running = false;
        }
    }
    m_last_seen_ms = picture_ms;
    const bool want_audio = AudioWanted(picture_ms);
    const std::vector<uint8_t>& sps = m_gatherer.sps();
    const std::vector<uint8_t>& pps = m_gatherer.pps();
    if (key && (!m_started || sps != m_stream_sps || pps != m_stream_pps ||
                want_audio != m_stream_has_audio)) {
        if (!StartStream(picture_ms)) m_started = false;
    }
    if (!m_started) {
        ++m_dropped_pictures;
        return;
    }
    // A browser's MSE takes a step between two pictures of more than twice the last one's
    // duration for a break in the stream, and then drops every picture up to the next key
    // frame: a freeze of up to the key interval. Arrival times jitter (a burst after a stall
    // comes 60, 4, 4, then 33 ms apart), so a step is held under that bound and the time it
    // lost is made up over the next pictures, and a duration (the step to its picture) never
    // falls below three quarters of the one before. Pictures within one millisecond still
    // get increasing times.
    const uint64_t arrived = uint64_t{static_cast<uint32_t>(picture_ms - m_origin_ms)} * 90;
    uint64_t decode_time = arrived;
    if (m_pictures_sent > 0) {
        const uint64_t latest = m_last_decode_time + 2 * uint64_t{m_picture_duration} - 1;
        decode_time = std::min(std::max(arrived, m_last_decode_time + 1), latest);
        const uint32_t step = static_cast<uint32_t>(decode_time - m_last_decode_time);
        m_picture_duration = std::max(step, m_picture_duration / 4 * 3);
    }
    const size_t head = fmp4::WriteFragmentHeader(
        ++m_sequence, fmp4::kVideoTrack, decode_time, m_picture_duration,
        static_cast<uint32_t>(picture.len), key, m_scratch.data(), m_scratch.size());
    if (head == 0 || !m_ring->Append(m_scratch.data(), head, picture.data, picture.len, key)) {
        ++m_dropped_pictures;
        if (key) m_started = false;  // the pictures after it cannot be decoded without it
    }
    m_last_decode_time = decode_time;
    ++m_pictures_sent;
}

bool LiveMuxer::AudioWanted(uint32_t now_ms) const {
    // Capture starts both tracks at once, so sound is expected until a while has passed
    // without any; a stream without it is begun anew when it comes.
    // Signed: the sound's stamps may run a little ahead of the pictures'.
    const uint32_t since = m_audio_seen ? m_last_audio_ms : m_capture_start_ms;
    return static_cast<int32_t>(now_ms - since) < static_cast<int32_t>(kAudioRecentMs);
}

bool LiveMuxer::StartStream(uint32_t time_ms) {
    const std::vector<uint8_t>& sps = m_gatherer.sps();
    const std::vector<uint8_t>& pps = m_gatherer.pps();
    fmp4::VideoConfig video{};
    if (sps.empty() || pps.empty() ||
        !stream::PictureSize(sps.data(), sps.size(), &video.width, &video.height)) {
        OrvexLogPriority(platform::kLogWarn, kTag,
                         "a key frame without a usable SPS and PPS: the web viewers wait for the "
                         "next");
        return false;
    }
    video.sps = sps.data();
    video.sps_len = sps.size();
    video.pps = pps.data();
    video.pps_len = pps.size();
    fmp4::AudioConfig audio{};
    stream::AudioSpecificConfig(audio.asc);
    audio.sample_rate = stream::kAudioRate;
    audio.channels = stream::kAudioChannels;
    const bool with_audio = AudioWanted(time_ms);

    const size_t need = 2048 + sps.size() + pps.size();
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
    m_stream_sps = sps;
    m_stream_pps = pps;
    m_stream_has_audio = with_audio;
    m_started = true;
    m_origin_ms = time_ms;
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
    const uint64_t stamped = static_cast<uint64_t>(since) * (stream::kAudioRate / 1000);
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
