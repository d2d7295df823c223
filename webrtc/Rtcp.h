#pragma once

#include <cstddef>
#include <cstdint>

// RTCP as a WebRTC sender reads and writes it: receiver reports (RFC 3550 §6.4), generic NACK
// (RFC 4585 §6.2.1), picture loss (RFC 4585 §6.3.1) and full intra requests (RFC 5104 §4.3.1)
// in; sender reports out.
// Thread contract: pure functions, any thread.
namespace webrtc {

constexpr int kMaxNacked = 256;

struct RtcpFeedback {
    // Sequence numbers asked again (each PID and its BLP bits expanded), in the order asked,
    // at most kMaxNacked (the rest are dropped). Only NACKs about nack_media_ssrc, the media
    // SSRC of the first NACK, are taken; the caller checks it is ours.
    uint16_t nacked[kMaxNacked];
    int nacked_count;
    uint32_t nack_media_ssrc;
    // A key frame asked for by PLI or FIR; keyframe_media_ssrc is the media SSRC of the first
    // such request. fir_sequence is the first FIR's command sequence number: a number seen
    // before is a retransmission of a request already served (RFC 5104 §4.3.1.2).
    bool pli, fir;
    uint32_t keyframe_media_ssrc;
    uint8_t fir_sequence;
    // The first report block of an SR or RR; report_ssrc is the source it is about.
    bool has_report;
    uint32_t report_ssrc;
    uint8_t fraction_lost;
    int32_t cumulative_lost;  // 24-bit signed on the wire
    uint32_t highest_sequence, jitter;
};

// A compound packet (or a reduced-size one, RFC 5506), after SRTCP unprotect. False when
// malformed: a version other than 2, a length that overruns the datagram, a report or feedback
// packet shorter than its counts say; `out` is meaningful only when true. Other packet types
// (SDES, BYE, APP, XR, transport-cc, REMB) are skipped.
bool ReadRtcp(const uint8_t* p, size_t n, RtcpFeedback* out);

// A sender report without report blocks (28 bytes; RFC 3550 §6.4.1): `ntp` is the 64-bit NTP
// time of `rtp_time`. Returns the bytes written, 0 if `cap` is too small.
size_t WriteSenderReport(uint32_t ssrc, uint64_t ntp, uint32_t rtp_time, uint32_t packets,
                         uint32_t octets, uint8_t* out, size_t cap);

// RFC 5761 §4 demultiplexing under rtcp-mux: version 2 and a second byte of 192..223, where
// RTCP packet types lie and RTP's marker bit with a payload type of 64..95 would.
bool LooksLikeRtcp(const uint8_t* p, size_t n);

}  // namespace webrtc
