#include "auth/AddressRules.h"

#include <charconv>

namespace auth {

namespace {

std::string_view Trim(std::string_view s) {
    while (!s.empty() && (s.front() == ' ' || s.front() == '\t')) s.remove_prefix(1);
    while (!s.empty() && (s.back() == ' ' || s.back() == '\t')) s.remove_suffix(1);
    return s;
}

// A decimal number of 1 to 3 digits, no sign, no leading blanks.
bool SmallNumber(std::string_view text, unsigned max, unsigned* out) {
    if (text.empty() || text.size() > 3) return false;
    unsigned value = 0;
    auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value);
    if (error != std::errc() || end != text.data() + text.size() || value > max) return false;
    *out = value;
    return true;
}

}  // namespace

bool ParseIpv4(std::string_view text, uint32_t* out) {
    uint32_t address = 0;
    for (int part = 0; part < 4; ++part) {
        size_t dot = part < 3 ? text.find('.') : text.size();
        if (dot == std::string_view::npos) return false;
        unsigned byte = 0;
        if (!SmallNumber(text.substr(0, dot), 255, &byte)) return false;
        address = (address << 8) | byte;
        text.remove_prefix(part < 3 ? dot + 1 : dot);
    }
    *out = address;
    return true;
}

bool AllowList::Parse(std::string_view text, std::string* bad) {
    m_everyone = false;
    m_ranges.clear();
    std::vector<Range> ranges;
    for (;;) {
        size_t comma = text.find(',');
        std::string_view entry = Trim(text.substr(0, comma));
        size_t slash = entry.find('/');
        uint32_t address = 0;
        unsigned bits = 32;
        bool ok =
            ParseIpv4(entry.substr(0, slash), &address) &&
            (slash == std::string_view::npos || SmallNumber(entry.substr(slash + 1), 32, &bits));
        if (!ok) {
            if (bad != nullptr) *bad = std::string(entry);
            return false;
        }
        uint32_t mask = bits == 0 ? 0 : ~uint32_t{0} << (32 - bits);
        ranges.push_back({address & mask, mask});
        if (comma == std::string_view::npos) break;
        text.remove_prefix(comma + 1);
    }
    m_ranges = std::move(ranges);
    return true;
}

bool AllowList::Allows(uint32_t address) const {
    if (m_everyone) return true;
    for (const Range& r : m_ranges) {
        if ((address & r.mask) == r.network) return true;
    }
    return false;
}

FailureLockout::Entry* FailureLockout::Slot(uint32_t address, uint64_t now_ms) {
    Entry* victim = nullptr;
    for (Entry& e : m_entries) {
        if (e.used && e.address == address) return &e;
    }
    // A free slot, else the stalest unlocked one, else the lock that ends first.
    for (Entry& e : m_entries) {
        if (!e.used) return &(e = Entry{});
        bool locked = e.locked_until > now_ms;
        if (victim == nullptr) {
            victim = &e;
            continue;
        }
        bool victim_locked = victim->locked_until > now_ms;
        if (victim_locked != locked) {
            if (victim_locked) victim = &e;
        } else if (locked ? e.locked_until < victim->locked_until
                          : e.last_seen < victim->last_seen) {
            victim = &e;
        }
    }
    *victim = Entry{};
    return victim;
}

bool FailureLockout::RecordFailure(uint32_t address, uint64_t now_ms) {
    Entry* e = Slot(address, now_ms);
    e->used = true;
    e->address = address;
    e->last_seen = now_ms;
    if (e->locked_until > now_ms) return false;
    e->failed_at[e->next] = now_ms;
    e->next = (e->next + 1) % kMaxFailures;
    if (e->failures < kMaxFailures) ++e->failures;
    // The oldest of the last ten is where the ring goes next.
    if (e->failures < kMaxFailures || now_ms - e->failed_at[e->next] >= kWindowMs) return false;
    e->failures = 0;
    e->locked_until = now_ms + kLockMs;
    return true;
}

bool FailureLockout::IsLocked(uint32_t address, uint64_t now_ms) const {
    return LockedForMs(address, now_ms) > 0;
}

uint64_t FailureLockout::LockedForMs(uint32_t address, uint64_t now_ms) const {
    for (const Entry& e : m_entries) {
        if (e.used && e.address == address)
            return e.locked_until > now_ms ? e.locked_until - now_ms : 0;
    }
    return 0;
}

}  // namespace auth
