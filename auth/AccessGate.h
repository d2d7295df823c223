#pragma once

#include <sys/types.h>

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "auth/AddressRules.h"
#include "auth/DigestGate.h"
#include "sync/thread_mutex.h"

namespace auth {

// One request as every protocol has it: RTSP and HTTP ask the same gate.
struct AccessRequest {
    std::string_view method;
    std::string_view uri;              // as the request line names it (Digest's uri field)
    const std::string* authorization;  // the Authorization value, null when there is none
    bool repeated_authorization = false;
    bool exempt = false;   // answered without credentials (RTSP OPTIONS), unless locked out
    uint32_t address = 0;  // the client's, host order
    std::string_view address_text;
};

enum class AccessAnswer {
    kServe,
    kChallenge,    // 401 with `challenge`
    kBadRequest,   // 400
    kUnavailable,  // 503: the credentials cannot be used, nobody gets in
    kLockedOut,    // too many wrong answers from this address: 403 (RTSP) or 429 (HTTP)
};

struct AccessDecision {
    AccessAnswer answer = AccessAnswer::kServe;
    std::string challenge;       // the WWW-Authenticate value of a challenge
    bool close = false;          // end the connection after this answer
    unsigned retry_after_s = 0;  // with kLockedOut: when the address may try again
    std::string reason;          // why it was refused, for the caller's one log line
};

// Who may watch, for every way of watching: the address allow-list (judged at accept), one
// failure lockout, and Digest users (judged for every request). Built from kv.orvex.allow and
// kv.orvex.auth; with neither set it lets everything through untouched. The users file is
// looked at again at most twice a second and re-read when it changed; the nonce secret is kept
// beside it, so nonces outlive a restart.
// Thread contract: thread safe; one instance serves the RTSP listener and the HTTP server.
class AccessGate {
public:
    using Clock = std::function<uint64_t()>;  // milliseconds, monotonic
    static constexpr uint64_t kRecheckMs = 500;

    AccessGate();
    explicit AccessGate(Clock clock);
    AccessGate(const AccessGate&) = delete;
    AccessGate& operator=(const AccessGate&) = delete;

    // Takes the address rules (kv.orvex.allow) and reads the credentials file (kv.orvex.auth),
    // as the start-time settings have them; every problem is one log line and leaves the
    // service closed rather than open.
    void Configure(std::string_view allow, std::string_view auth_file);

    // False when a connection from `address` (host order) must be reset at once: it is not
    // on the allow-list. A locked-out address is let in to be told so.
    bool AdmitConnection(uint32_t address, const std::string& text);
    AccessDecision Judge(const AccessRequest& request);

    bool authenticating() const;
    // Who may watch, in words, for the start-up line.
    std::string Summary() const;

private:
    void ReadUsers(bool first) ORVEX_REQUIRES(m_lock);
    void CheckUsersFile(uint64_t now) ORVEX_REQUIRES(m_lock);

    const Clock m_clock;
    mutable thread_mutex m_lock;
    AllowList m_allow ORVEX_GUARDED_BY(m_lock);
    bool m_allow_set ORVEX_GUARDED_BY(m_lock) = false;
    std::unique_ptr<DigestGate> m_gate ORVEX_GUARDED_BY(m_lock);
    FailureLockout m_lockout ORVEX_GUARDED_BY(m_lock);
    NonceCounts m_counts ORVEX_GUARDED_BY(m_lock);
    uint16_t m_nonce_serial ORVEX_GUARDED_BY(m_lock) = 0;  // no two challenges share a nonce
    std::string m_file ORVEX_GUARDED_BY(m_lock);
    std::string m_secret ORVEX_GUARDED_BY(m_lock);
    // What the users file was when last read: a change in any re-reads it.
    struct FileStamp {
        dev_t dev = 0;
        ino_t ino = 0;
        off_t size = -1;
        int64_t mtime_ns = 0;
        bool operator==(const FileStamp& o) const {
            return dev == o.dev && ino == o.ino && size == o.size && mtime_ns == o.mtime_ns;
        }
    };
    FileStamp m_stamp ORVEX_GUARDED_BY(m_lock);
    uint64_t m_checked_at ORVEX_GUARDED_BY(m_lock) = 0;
    bool m_closed ORVEX_GUARDED_BY(m_lock) = false;  // kv.orvex.auth set but unusable
};

}  // namespace auth
