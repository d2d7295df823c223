#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "auth/Digest.h"

namespace auth {

// One line of an htdigest file: user:realm:HA1.
struct Credential {
    std::string user;
    std::string realm;
    std::string ha1;  // 32 lowercase hex digits
};

// Reads htdigest text: one credential a line, blank lines and '#' comments skipped, CR LF
// accepted. False at the first malformed line (its number, from 1, in `*bad_line`).
bool ParseHtdigest(std::string_view text, std::vector<Credential>* out, int* bad_line);

// What became of a request's credentials.
enum class DigestVerdict {
    kOk,
    kMissing,    // no Authorization header: the usual first request, not a failure
    kNotDigest,  // another scheme
    kMalformed,  // a header that cannot be read
    kWrongRealm,
    // A nonce of the right shape that this service cannot use: too old, issued to another
    // address, or under a secret it no longer has. The client may simply retry (stale=TRUE).
    kStale,
    kForeignNonce,  // not shaped as our nonces are: made up
    kWrongUri,      // the uri field does not name the request's URL
    kUnknownUser,
    kWrongResponse,    // the password is wrong
    kRetiredPassword,  // the user's password before its last change: refused, not a guess
    kReplayed,         // a nonce count already used with this nonce
};
const char* VerdictText(DigestVerdict verdict);
// Whether the verdict counts towards a lockout: a wrong guess, not a protocol step.
bool IsFailedGuess(DigestVerdict verdict);

// What a checked answer carried, for the caller's nonce-count book.
struct DigestAnswer {
    std::string user;
    std::string nonce;
    uint32_t nc = 0;  // 0 without qop
};

// Checks Digest answers against a credentials table. Nonces carry their time and an HMAC of it
// and of the address they were given to, under a secret the caller keeps (across restarts, so
// browsers' nonces stay good), so they need no table: one from another secret or another
// address, or older than kNonceLifetimeMs, is stale; one that is not shaped like ours is
// foreign. The stamp's top 16 bits are the caller's serial: two clients at one address
// challenged in the same millisecond must not share a nonce, or the second one's first count
// would read as a replay of the first one's. The challenge offers qop=auth; answers without
// qop are still taken (RFC 2617 §3.2.2, the RFC 2069 form GStreamer and VLC send).
// Thread contract: const after construction; any thread.
class DigestGate {
public:
    static constexpr uint64_t kNonceLifetimeMs = 5 * 60 * 1000;

    // The realm is that of the first credential ("orvex" when there is none). `retired`: users'
    // previous credentials, whose answers are refused without counting as guesses.
    DigestGate(std::vector<Credential> users, std::string secret,
               std::vector<Credential> retired = {});

    const std::string& realm() const { return m_realm; }
    const std::vector<Credential>& users() const { return m_users; }
    std::string MakeNonce(uint64_t now_ms, uint16_t serial, uint32_t address) const;
    // The value of a 401 answer's WWW-Authenticate header.
    std::string Challenge(uint64_t now_ms, uint16_t serial, uint32_t address, bool stale) const;
    // `authorization`: the header's value, or null when the request has none; `method` and
    // `uri`: the request line's first two words; `address`: the client's, host order.
    DigestVerdict Check(const std::string* authorization, std::string_view method,
                        std::string_view uri, uint64_t now_ms, uint32_t address,
                        DigestAnswer* answer) const;

private:
    const Credential* Find(const std::vector<Credential>& table, std::string_view user) const;

    std::vector<Credential> m_users;
    std::vector<Credential> m_retired;
    std::string m_realm;
    std::string m_secret;
};

// Which nonce counts each nonce has been answered with: a count seen before, or more than
// kWindow below the highest, is a replay. Counts may arrive out of order within the window (a
// browser's parallel requests). The book is bounded; the least recently used nonce leaves it,
// and its client's next answer starts a new entry.
// Thread contract: NOT thread safe; the caller locks.
class NonceCounts {
public:
    static constexpr int kTracked = 256;
    static constexpr uint32_t kWindow = 64;

    // True, and the count recorded, when `nc` has not been used with `nonce`.
    bool Take(std::string_view nonce, uint32_t nc);

private:
    struct Entry {
        std::string nonce;
        uint32_t highest = 0;
        uint64_t seen = 0;  // bit i: highest - i was used
        uint64_t used_at = 0;
    };
    std::vector<Entry> m_entries;
    uint64_t m_tick = 0;
};

}  // namespace auth
