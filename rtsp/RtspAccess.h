#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "auth/AddressRules.h"
#include "auth/DigestGate.h"

// Who may watch: the address allow-list and the failure lockout, judged at accept, and Digest
// authentication, judged for every request but OPTIONS. Built from the properties
// kv.orvex.allow and kv.orvex.auth; with neither set it lets everything through untouched.
// Thread contract: NOT thread safe; the RTSP listener's thread uses it (Load before that thread
// starts).
class RtspAccess {
public:
    using Clock = std::function<uint64_t()>;  // milliseconds, monotonic

    RtspAccess();
    explicit RtspAccess(Clock clock);

    // Reads the properties and the credentials file; every problem is one log line and leaves
    // the service closed rather than open.
    void Load();
    // The same from given values, for callers that already have them.
    void Configure(std::string_view allow, std::string_view auth_file);

    // False when a connection from `address` (host order) must be reset at once.
    bool AdmitConnection(uint32_t address, const std::string& text);

    enum class Answer { kServe, kChallenge, kBadRequest, kUnavailable };
    struct Decision {
        Answer answer = Answer::kServe;
        std::string header;  // the WWW-Authenticate line of a challenge
        bool close = false;  // the address has just been locked out
        std::string reason;  // why it was refused, for the client's one log line
    };
    // The verdict on one request: `lines` are its lines, `method_code` its RtspMethod.
    Decision Judge(const std::vector<std::string>& lines, int method_code, uint32_t address,
                   const std::string& text);

    bool authenticating() const { return m_gate != nullptr || m_closed; }

private:
    Clock m_clock;
    auth::AllowList m_allow;
    std::unique_ptr<auth::DigestGate> m_gate;
    auth::FailureLockout m_lockout;
    bool m_closed = false;  // kv.orvex.auth set but unusable: every request is refused
};

// The value of the one "Authorization:" header of a request, if any; `*repeated` is set when
// there are several.
std::optional<std::string> AuthorizationOf(const std::vector<std::string>& lines, bool* repeated);
