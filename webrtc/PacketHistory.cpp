#include "webrtc/PacketHistory.h"

#include <cstring>

namespace webrtc {

void PacketHistory::Keep(uint16_t sequence, const uint8_t* packet, size_t len) {
    if (len == 0 || len > kSlotBytes) return;  // larger than any packet sent: not kept
    if (m_slots == nullptr) m_slots.reset(new Slot[kSlots]());
    Slot& slot = m_slots[sequence % kSlots];
    slot.sequence = sequence;
    slot.len = static_cast<uint16_t>(len);
    memcpy(slot.bytes, packet, len);
}

bool PacketHistory::Find(uint16_t sequence, const uint8_t** packet, size_t* len) const {
    if (m_slots == nullptr) return false;
    const Slot& slot = m_slots[sequence % kSlots];
    if (slot.len == 0 || slot.sequence != sequence) return false;
    *packet = slot.bytes;
    *len = slot.len;
    return true;
}

}  // namespace webrtc
