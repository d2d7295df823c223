#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

// The SDP of WebRTC playback (WHEP): the browser's recvonly offer read into what the answer
// needs, and the answer of an ICE-lite, DTLS-passive, send-only peer (RFC 8829 §5.3, RFC 8843
// BUNDLE, RFC 6184 §8 for H.264, RFC 7587 for Opus).
// Thread contract: pure functions, any thread.
namespace webrtc {

struct WebRtcOffer {
    std::string ice_ufrag, ice_pwd;     // session level, else the first media section's
    std::string fingerprint_algorithm;  // "sha-256"
    std::vector<uint8_t> fingerprint;   // the bytes of the hex pairs
    std::string setup;                  // "actpass", "active", ...
    struct Media {
        std::string kind;  // "video", "audio", "application", ...
        std::string mid;
        std::string direction;  // "recvonly", "sendrecv", ... ("sendrecv" when absent)
        std::string protocol;   // "UDP/TLS/RTP/SAVPF", as offered
        std::string formats;    // the m= line's format list, as offered
        // We send on this section: the first video with a chosen H.264 type and the first
        // audio with Opus, each with a receiving direction and a port other than 0.
        bool accepted = false;
        int payload_type = -1;      // chosen: H.264 packetization-mode=1 / opus/48000/2; -1 none
        int rtx_payload_type = -1;  // the rtx whose apt= is the chosen type, -1 none
        std::string h264_profile_level_id;            // of the chosen H.264 type, as offered
        bool nack = false, pli = false, fir = false;  // rtcp-fb of the chosen type
        bool rtcp_rsize = false;                      // RFC 5506 reduced-size RTCP offered
        // a=extmap ids (one-byte form, 1..14; -1 when absent or out of that range)
        int playout_delay_extension =
            -1;                  // http://www.webrtc.org/experiments/rtp-hdrext/playout-delay
        int mid_extension = -1;  // urn:ietf:params:rtp-hdrext:sdes:mid
    };
    std::vector<Media> media;  // in offer order, every m= line
    bool bundle = false;       // a=group:BUNDLE offered; the answer groups the accepted sections
    bool rtcp_mux = false;     // on every accepted section (an offer without it is refused)
};

// `profile_idc`/`constraints` from the stream's own SPS choose among the offered H.264 types:
// the packetization-mode=1 type whose profile-level-id has the same profile_idc and whose
// constraint flags the stream meets (an exact match first) wins; else the constrained baseline
// one (42e0xx); else any mode-1 type. False with `why` (one short sentence for an HTTP 400 body
// and the log) on anything unusable: not SDP, over 64 KiB or 32 m= lines, control characters, no
// ice-ufrag/pwd, no sha-256 fingerprint, a passive DTLS role, no video with H.264 mode 1, no
// receiving direction, no mid, no rtcp-mux.
bool ReadWebRtcOffer(std::string_view sdp, int profile_idc, int constraints, WebRtcOffer* out,
                     std::string* why);

struct WebRtcAnswerParams {
    std::string ice_ufrag, ice_pwd;
    std::string fingerprint_sha256;  // "AB:CD:..." uppercase
    std::string address;             // the one host candidate
    uint16_t port;
    uint32_t video_ssrc, audio_ssrc;
    uint32_t rtx_ssrc = 0;  // the video's retransmissions (RFC 4588), 0 to announce none
    std::string cname, stream_id;
    std::string h264_profile_level_id;  // what we send (from the stream's SPS), 6 hex digits
    uint64_t session_id;
};

// Every offered m= line answered in order: the accepted ones send-only on the one BUNDLE
// transport, the others refused (port 0, a=inactive, their mid kept).
std::string WriteWebRtcAnswer(const WebRtcOffer& offer, const WebRtcAnswerParams& p);

}  // namespace webrtc
