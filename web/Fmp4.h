#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

// Fragmented MP4 for the web viewer: browsers play it through Media Source Extensions. An init
// segment describes the tracks once; then every sample travels as its own fragment (moof, then
// mdat) so a viewer can join at any key frame and nothing waits for a second sample.
// Every writer fills the caller's buffer and never writes at or past `cap`; on refusal it
// returns 0 and what lies before `cap` is garbage.
// Thread contract: pure functions, any thread.
namespace fmp4 {

struct VideoConfig {
    const uint8_t* sps;  // NAL units without start code, header byte included
    size_t sps_len;
    const uint8_t* pps;
    size_t pps_len;
    uint16_t width;  // display size: the browser sizes the element from it
    uint16_t height;
};

struct AudioConfig {
    uint8_t asc[2];        // AAC decoder configuration (ASC), e.g. 0x11 0x90 = LC 48 kHz stereo
    uint32_t sample_rate;  // also the track's timescale; 1..65535
    uint8_t channels;
};

constexpr uint32_t kVideoTrack = 1;
constexpr uint32_t kAudioTrack = 2;
constexpr uint32_t kVideoTimescale = 90000;  // the RTP clock: decode times carry over as they are

// moof with one track fragment of one sample, plus the mdat header: the same for every track.
constexpr size_t kFragmentHeaderSize = 108;

// "avc1.PPCCLL" from sps[1..3] in lower-case hex; "" when the SPS is shorter than 4 bytes or
// not NAL type 7.
std::string AvcCodecString(const VideoConfig& video);
// "mp4a.40.N", N the audio object type of the ASC (escape 31 followed); "" for type 0.
std::string AacCodecString(const AudioConfig& audio);

// ftyp and moov: one track per config given (video is track 1, audio track 2), each with empty
// sample tables, and mvex announcing that samples come in fragments. Either config may be null,
// not both. Returns the bytes written; 0 when `cap` is too small or a config is invalid: SPS
// shorter than 4 bytes, not type 7 or over 65535 bytes; PPS empty, not type 8 or over 65535
// bytes; width or height 0; audio object type 0, channels 0, sample rate 0 or over 65535.
size_t WriteInitSegment(const VideoConfig* video, const AudioConfig* audio, uint8_t* out,
                        size_t cap);

// A fragment of one sample: moof (sequence number, then the track's decode time in its
// timescale, duration, size and whether it is a sync sample) and the 8-byte mdat header whose
// size covers the `sample_size` payload bytes the caller appends right after. Video payload is
// AVCC (see AnnexBToAvcc), audio raw AAC without ADTS header. Returns kFragmentHeaderSize; 0
// when `cap` is smaller, `track` is 0 or the mdat would exceed 32-bit sizes.
size_t WriteFragmentHeader(uint32_t sequence, uint32_t track, uint64_t decode_time,
                           uint32_t duration, uint32_t sample_size, bool key, uint8_t* out,
                           size_t cap);

// Annex B access unit to AVCC: every NAL unit (trailing zero bytes dropped, empty ones skipped)
// behind its 4-byte big-endian length, in order; bytes before the first start code are
// skipped. The output grows by one byte per 3-byte start code. Returns the bytes written; 0
// when there is no NAL unit or `cap` is too small. `out` must not overlap `in`.
size_t AnnexBToAvcc(const uint8_t* in, size_t len, uint8_t* out, size_t cap);

}  // namespace fmp4
