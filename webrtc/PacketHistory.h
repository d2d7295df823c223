#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>

namespace webrtc {

// The packets last sent to one viewer, kept as they went out (already protected), so that a
// NACK is answered by sending the same bytes again. A slot per sequence number modulo the
// slot count: a packet stays until the sequence number that many later overwrites it.
// 512 slots hold about a second of 720p at 4 Mbit/s (about 400 packets a second); a browser on
// a lossy link asks for packets up to about that late.
// Thread contract: NOT thread safe; the owner's lock.
class PacketHistory {
public:
    static constexpr size_t kSlots = 512;
    static constexpr size_t kSlotBytes = 1280;  // an RTP packet of 1200 bytes with its SRTP tag

    // Memory is taken on the first Keep: a session that never plays costs none.
    void Keep(uint16_t sequence, const uint8_t* packet, size_t len);
    // The packet sent with `sequence`, if it is still kept.
    bool Find(uint16_t sequence, const uint8_t** packet, size_t* len) const;

private:
    struct Slot {
        uint16_t sequence;
        uint16_t len;  // 0: empty
        uint8_t bytes[kSlotBytes];
    };
    std::unique_ptr<Slot[]> m_slots;
};

}  // namespace webrtc
