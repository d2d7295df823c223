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
    kStale,         // our nonce, but too old: the client may simply retry
    kForeignNonce,  // not a nonce of this run of the service
    kWrongUri,      // the uri field does not name the request's URL
    kUnknownUser,
    kWrongResponse,  // the password is wrong
};
const char* VerdictText(DigestVerdict verdict);
// Whether the verdict counts towards a lockout: a wrong guess, not a protocol step.
bool IsFailedGuess(DigestVerdict verdict);

// Checks Digest answers against a credentials table. Nonces carry their time and an HMAC of
// it under a secret drawn at start, so they need no table: one from another run, or forged,
// fails its HMAC; one older than kNonceLifetimeMs is stale.
// Thread contract: const after construction; any thread.
class DigestGate {
public:
    static constexpr uint64_t kNonceLifetimeMs = 5 * 60 * 1000;

    // The realm is that of the first credential ("orvex" when there is none).
    DigestGate(std::vector<Credential> users, std::string secret);

    const std::string& realm() const { return m_realm; }
    std::string MakeNonce(uint64_t now_ms) const;
    // The WWW-Authenticate header line of a 401 answer. No qop is offered: GStreamer answers
    // without it anyway; answers with qop=auth are accepted all the same.
    std::string Challenge(uint64_t now_ms, bool stale) const;
    // `authorization`: the header's value, or null when the request has none; `method` and
    // `uri`: the request line's first two words.
    DigestVerdict Check(const std::string* authorization, std::string_view method,
                        std::string_view uri, uint64_t now_ms, std::string* user) const;

private:
    std::vector<Credential> m_users;
    std::string m_realm;
    std::string m_secret;
};

}  // namespace auth
