#include "auth/DigestGate.h"

#include <cinttypes>
#include <cstdio>

#include "auth/Md5.h"

namespace auth {

namespace {

constexpr size_t kNonceTimeDigits = 16;

bool IsLowerHex(std::string_view s) {
    for (char c : s) {
        if (!((c >= '0' && c <= '9') || (c >= 'a' && c <= 'f'))) return false;
    }
    return true;
}

}  // namespace

bool ParseHtdigest(std::string_view text, std::vector<Credential>* out, int* bad_line) {
    std::vector<Credential> users;
    int number = 0;
    while (!text.empty()) {
        ++number;
        size_t end = text.find('\n');
        std::string_view line = text.substr(0, end);
        text.remove_prefix(end == std::string_view::npos ? text.size() : end + 1);
        if (!line.empty() && line.back() == '\r') line.remove_suffix(1);
        if (line.empty() || line.front() == '#') continue;
        size_t first = line.find(':');
        size_t second = first == std::string_view::npos ? first : line.find(':', first + 1);
        std::string_view ha1 =
            second == std::string_view::npos ? std::string_view() : line.substr(second + 1);
        if (first == 0 || second == std::string_view::npos || ha1.size() != 32 ||
            !IsLowerHex(ha1)) {
            if (bad_line != nullptr) *bad_line = number;
            return false;
        }
        users.push_back({std::string(line.substr(0, first)),
                         std::string(line.substr(first + 1, second - first - 1)),
                         std::string(ha1)});
    }
    *out = std::move(users);
    return true;
}

const char* VerdictText(DigestVerdict verdict) {
    switch (verdict) {
        case DigestVerdict::kOk:
            return "accepted";
        case DigestVerdict::kMissing:
            return "no credentials";
        case DigestVerdict::kNotDigest:
            return "not a Digest answer";
        case DigestVerdict::kMalformed:
            return "malformed Authorization header";
        case DigestVerdict::kWrongRealm:
            return "wrong realm";
        case DigestVerdict::kStale:
            return "stale nonce";
        case DigestVerdict::kForeignNonce:
            return "nonce not issued by this service";
        case DigestVerdict::kWrongUri:
            return "uri does not match the request";
        case DigestVerdict::kUnknownUser:
            return "unknown user";
        case DigestVerdict::kWrongResponse:
            return "wrong password";
    }
    return "?";
}

bool IsFailedGuess(DigestVerdict verdict) {
    return verdict == DigestVerdict::kUnknownUser || verdict == DigestVerdict::kWrongResponse ||
           verdict == DigestVerdict::kWrongRealm || verdict == DigestVerdict::kNotDigest ||
           verdict == DigestVerdict::kForeignNonce || verdict == DigestVerdict::kMalformed;
}

DigestGate::DigestGate(std::vector<Credential> users, std::string secret)
    : m_users(std::move(users)), m_secret(std::move(secret)) {
    m_realm = m_users.empty() ? "orvex" : m_users.front().realm;
}

std::string DigestGate::MakeNonce(uint64_t now_ms) const {
    char stamp[kNonceTimeDigits + 1];
    snprintf(stamp, sizeof stamp, "%016" PRIx64, now_ms);
    return stamp + HmacMd5Hex(m_secret, stamp);
}

std::string DigestGate::Challenge(uint64_t now_ms, bool stale) const {
    std::string line =
        "WWW-Authenticate: Digest realm=\"" + m_realm + "\", nonce=\"" + MakeNonce(now_ms) + "\"";
    if (stale) line += ", stale=TRUE";
    return line;
}

DigestVerdict DigestGate::Check(const std::string* authorization, std::string_view method,
                                std::string_view uri, uint64_t now_ms, std::string* user) const {
    if (authorization == nullptr) return DigestVerdict::kMissing;
    DigestFields fields;
    switch (ParseDigestAuthorization(*authorization, &fields)) {
        case DigestParse::kOk:
            break;
        case DigestParse::kNotDigest:
            return DigestVerdict::kNotDigest;
        case DigestParse::kMalformed:
            return DigestVerdict::kMalformed;
    }
    if (user != nullptr) *user = fields.username;
    if (fields.realm != m_realm) return DigestVerdict::kWrongRealm;
    const std::string& nonce = fields.nonce;
    if (nonce.size() != kNonceTimeDigits + 32) return DigestVerdict::kForeignNonce;
    std::string stamp = nonce.substr(0, kNonceTimeDigits);
    if (!EqualInConstantTime(nonce.substr(kNonceTimeDigits), HmacMd5Hex(m_secret, stamp))) {
        return DigestVerdict::kForeignNonce;
    }
    uint64_t issued = std::stoull(stamp, nullptr, 16);  // 16 hex digits, checked by the HMAC
    if (issued > now_ms) return DigestVerdict::kForeignNonce;
    if (now_ms - issued >= kNonceLifetimeMs) return DigestVerdict::kStale;
    if (fields.uri != uri) return DigestVerdict::kWrongUri;
    const Credential* found = nullptr;
    for (const Credential& c : m_users) {
        if (c.realm == m_realm && c.user == fields.username) found = &c;
    }
    // The unknown user's answer is still hashed, so timing does not tell users apart.
    std::string expected =
        DigestExpectedResponse(found != nullptr ? found->ha1 : m_secret, method, fields);
    bool match = EqualInConstantTime(expected, fields.response);
    if (found == nullptr) return DigestVerdict::kUnknownUser;
    return match ? DigestVerdict::kOk : DigestVerdict::kWrongResponse;
}

}  // namespace auth
