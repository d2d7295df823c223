#include "webrtc/Rtcp.h"

namespace webrtc {
namespace {

constexpr uint8_t kSenderReport = 200;
constexpr uint8_t kReceiverReport = 201;
constexpr uint8_t kTransportFeedback = 205;  // RTPFB
constexpr uint8_t kPayloadFeedback = 206;    // PSFB
constexpr uint8_t kGenericNack = 1;          // RTPFB FMT
constexpr uint8_t kPli = 1;                  // PSFB FMT
constexpr uint8_t kFir = 4;                  // PSFB FMT

constexpr size_t kReportBlockSize = 24;
constexpr size_t kFeedbackHeaderSize = 12;  // header, sender SSRC, media SSRC

uint32_t Get32(const uint8_t* p) {
    return uint32_t(p[0]) << 24 | uint32_t(p[1]) << 16 | uint32_t(p[2]) << 8 | p[3];
}
void Put32(uint8_t* p, uint32_t v) {
    p[0] = uint8_t(v >> 24);
    p[1] = uint8_t(v >> 16);
    p[2] = uint8_t(v >> 8);
    p[3] = uint8_t(v);
}

void TakeReport(const uint8_t* block, RtcpFeedback* out) {
    if (out->has_report) return;
    out->has_report = true;
    out->report_ssrc = Get32(block);
    out->fraction_lost = block[4];
    // Sign-extend the 24-bit count (it goes negative with duplicates, RFC 3550 §6.4.1).
    const uint32_t lost = Get32(block + 4) & 0xffffff;
    out->cumulative_lost = int32_t(lost ^ 0x800000) - 0x800000;
    out->highest_sequence = Get32(block + 8);
    out->jitter = Get32(block + 12);
}

void TakeNack(const uint8_t* body, size_t size, RtcpFeedback* out) {
    const uint32_t media = Get32(body + 8);
    if (out->nacked_count > 0 && media != out->nack_media_ssrc) return;
    out->nack_media_ssrc = media;
    for (size_t i = kFeedbackHeaderSize; i + 4 <= size; i += 4) {
        const uint16_t pid = uint16_t(body[i] << 8 | body[i + 1]);
        const uint16_t blp = uint16_t(body[i + 2] << 8 | body[i + 3]);
        for (int k = -1; k < 16; ++k) {
            if (k >= 0 && !(blp & (1 << k))) continue;
            if (out->nacked_count == kMaxNacked) return;
            out->nacked[out->nacked_count++] = uint16_t(pid + k + 1);
        }
    }
}

void TakeKeyFrameRequest(bool fir, uint32_t media, uint8_t sequence, RtcpFeedback* out) {
    if (!out->pli && !out->fir) out->keyframe_media_ssrc = media;
    if (fir && !out->fir) out->fir_sequence = sequence;
    (fir ? out->fir : out->pli) = true;
}

}  // namespace

bool ReadRtcp(const uint8_t* p, size_t n, RtcpFeedback* out) {
    out->nacked_count = 0;
    out->nack_media_ssrc = 0;
    out->pli = out->fir = false;
    out->keyframe_media_ssrc = 0;
    out->fir_sequence = 0;
    out->has_report = false;
    out->report_ssrc = 0;
    out->fraction_lost = 0;
    out->cumulative_lost = 0;
    out->highest_sequence = out->jitter = 0;
    if (n < 4) return false;
    for (size_t offset = 0; offset < n;) {
        if (n - offset < 4) return false;
        const uint8_t* h = p + offset;
        if (h[0] >> 6 != 2) return false;
        const size_t whole = (size_t(h[2] << 8 | h[3]) + 1) * 4;
        if (whole > n - offset) return false;
        size_t size = whole;
        if (h[0] & 0x20) {
            // RFC 3550 §6.4.1: the last octet counts the padding, itself included.
            const size_t padding = h[whole - 1];
            if (padding == 0 || padding > whole - 4) return false;
            size = whole - padding;
        }
        const int count = h[0] & 0x1f;
        switch (h[1]) {
            case kSenderReport:
            case kReceiverReport: {
                const size_t first = h[1] == kSenderReport ? 28 : 8;
                if (size < first + count * kReportBlockSize) return false;
                if (count > 0) TakeReport(h + first, out);
                break;
            }
            case kTransportFeedback:
                if (size < kFeedbackHeaderSize) return false;
                if (count == kGenericNack) TakeNack(h, size, out);
                break;
            case kPayloadFeedback:
                if (size < kFeedbackHeaderSize) return false;
                if (count == kPli) {
                    TakeKeyFrameRequest(false, Get32(h + 8), 0, out);
                } else if (count == kFir) {
                    // §4.3.1.2: the header's media SSRC is unused; each 8-byte FCI names one.
                    if (size < kFeedbackHeaderSize + 8) return false;
                    const uint8_t* fci = h + kFeedbackHeaderSize;
                    TakeKeyFrameRequest(true, Get32(fci), fci[4], out);
                }
                break;
            default:
                break;
        }
        offset += whole;
    }
    return true;
}

size_t WriteSenderReport(uint32_t ssrc, uint64_t ntp, uint32_t rtp_time, uint32_t packets,
                         uint32_t octets, uint8_t* out, size_t cap) {
    constexpr size_t kSize = 28;
    if (cap < kSize) return 0;
    out[0] = 0x80;  // V=2, no padding, no report blocks
    out[1] = kSenderReport;
    out[2] = 0;
    out[3] = kSize / 4 - 1;
    Put32(out + 4, ssrc);
    Put32(out + 8, uint32_t(ntp >> 32));
    Put32(out + 12, uint32_t(ntp));
    Put32(out + 16, rtp_time);
    Put32(out + 20, packets);
    Put32(out + 24, octets);
    return kSize;
}

bool LooksLikeRtcp(const uint8_t* p, size_t n) {
    return n >= 8 && p[0] >> 6 == 2 && p[1] >= 192 && p[1] <= 223;
}

}  // namespace webrtc
