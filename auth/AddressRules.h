#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace auth {

// A dotted IPv4 address in host order; false for anything but four numbers 0..255.
bool ParseIpv4(std::string_view text, uint32_t* out);

// The addresses that may connect: "CIDR[,CIDR...]" where a CIDR is an address with an optional
// "/0".."/32" (a bare address is /32). Blanks around entries are allowed.
class AllowList {
public:
    // Everyone, as when no list is set.
    AllowList() = default;
    // False (and nobody allowed: a list that cannot be read fails closed) when an entry is
    // malformed; `*bad` then holds that entry.
    bool Parse(std::string_view text, std::string* bad);
    bool Allows(uint32_t address) const;
    bool everyone() const { return m_everyone; }

private:
    struct Range {
        uint32_t network;
        uint32_t mask;
    };
    bool m_everyone = true;
    std::vector<Range> m_ranges;
};

// Ten failed answers from one address within any minute lock it out for a minute. The table is
// bounded: a guesser spread over many addresses evicts the stalest entries, never a locked one
// while an unlocked one remains.
// Thread contract: NOT thread safe; the listener's thread owns it.
class FailureLockout {
public:
    static constexpr int kMaxFailures = 10;
    static constexpr uint64_t kWindowMs = 60000;
    static constexpr uint64_t kLockMs = 60000;
    static constexpr int kTracked = 64;

    // True when this failure locks the address (once per lock: the caller logs it).
    bool RecordFailure(uint32_t address, uint64_t now_ms);
    bool IsLocked(uint32_t address, uint64_t now_ms) const;
    // How long the address stays locked; 0 when it is not.
    uint64_t LockedForMs(uint32_t address, uint64_t now_ms) const;

private:
    struct Entry {
        uint32_t address = 0;
        uint64_t failed_at[kMaxFailures] = {};  // the last failures, a ring
        int next = 0;
        int failures = 0;  // in the ring, up to kMaxFailures
        uint64_t locked_until = 0;
        uint64_t last_seen = 0;
        bool used = false;
    };
    Entry* Slot(uint32_t address, uint64_t now_ms);
    Entry m_entries[kTracked];
};

}  // namespace auth
