#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

// The RTP header of WebRTC playback with its header extensions in the one-byte form of
// RFC 8285 §4.2: playout-delay (min = max = 0: the browser shows each picture as soon as it is
// decoded, no jitter buffer beyond what it needs) and the BUNDLE mid (RFC 8843 §15.2).
// Thread contract: pure functions, any thread.
namespace webrtc {

// 12 (RTP) + 4 (0xBEDE, length) + 4 (playout-delay: id/len, 3 bytes) + 17 (mid: id/len, at
// most 16 bytes) rounded up to 4.
constexpr size_t kMaxRtpHeaderWithExtensions = 40;

// Writes an RTP header (V=2, marker, payload type, sequence, timestamp, ssrc) with the X bit and
// one one-byte-header extension block holding playout-delay min = max = 0 (id `playout_delay_id`,
// 3 bytes) and, when mid_id > 0, the mid; returns the header length (a multiple of 4, at most
// kMaxRtpHeaderWithExtensions). Packets are built with the payload after this header. An id
// outside 1..14, or a mid that is empty or longer than 16 bytes, leaves its element out; with
// neither element the header is the plain 12 bytes without the X bit.
size_t WriteRtpHeaderWithExtensions(uint8_t* p, bool marker, uint8_t payload_type, uint16_t seq,
                                    uint32_t ts, uint32_t ssrc, int playout_delay_id, int mid_id,
                                    std::string_view mid);

}  // namespace webrtc
