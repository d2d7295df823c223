#include "auth/DigestGate.h"

#include <cctype>
#include <cinttypes>
#include <cstdio>

#include "auth/Md5.h"

namespace auth {

namespace {

constexpr size_t kNonceTimeDigits = 16;
// Below the serial: milliseconds of a monotonic clock, good for some 8,900 years of uptime.
constexpr uint64_t kStampTimeMask = (uint64_t{1} << 48) - 1;

bool IsLowerHex(std::string_view s) {
    for (char c : s) {
        if (!((c >= '0' && c <= '9') || (c >= 'a' && c <= 'f'))) return false;
    }
    return true;
}

bool IsHex(std::string_view s) {
    for (char c : s) {
        if (!isxdigit(static_cast<unsigned char>(c))) return false;
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
        case DigestVerdict::kRetiredPassword:
            return "a password that has been changed";
        case DigestVerdict::kReplayed:
            return "nonce count used before (a replayed answer)";
    }
    return "?";
}

bool IsFailedGuess(DigestVerdict verdict) {
    return verdict == DigestVerdict::kUnknownUser || verdict == DigestVerdict::kWrongResponse ||
           verdict == DigestVerdict::kWrongRealm || verdict == DigestVerdict::kNotDigest ||
           verdict == DigestVerdict::kForeignNonce || verdict == DigestVerdict::kMalformed ||
           verdict == DigestVerdict::kReplayed;
}

DigestGate::DigestGate(std::vector<Credential> users, std::string secret,
                       std::vector<Credential> retired)
    : m_users(std::move(users)), m_retired(std::move(retired)), m_secret(std::move(secret)) {
    m_realm = m_users.empty() ? "orvex" : m_users.front().realm;
}

namespace {

// The HMAC covers the time and the address: a nonce seen on the wire is no use elsewhere.
std::string NonceMac(const std::string& secret, std::string_view stamp, uint32_t address) {
    char text[kNonceTimeDigits + 10];
    snprintf(text, sizeof text, "%.*s/%08" PRIx32, static_cast<int>(stamp.size()), stamp.data(),
             address);
    return HmacMd5Hex(secret, text);
}

}  // namespace

std::string DigestGate::MakeNonce(uint64_t now_ms, uint16_t serial, uint32_t address) const {
    char stamp[kNonceTimeDigits + 1];
    snprintf(stamp, sizeof stamp, "%016" PRIx64,
             (uint64_t{serial} << 48) | (now_ms & kStampTimeMask));
    return stamp + NonceMac(m_secret, stamp, address);
}

std::string DigestGate::Challenge(uint64_t now_ms, uint16_t serial, uint32_t address,
                                  bool stale) const {
    std::string value = "Digest realm=\"" + m_realm + "\", nonce=\"" +
                        MakeNonce(now_ms, serial, address) + "\", qop=\"auth\"";
    if (stale) value += ", stale=TRUE";
    return value;
}

const Credential* DigestGate::Find(const std::vector<Credential>& table,
                                   std::string_view user) const {
    const Credential* found = nullptr;
    for (const Credential& c : table) {
        if (c.realm == m_realm && c.user == user) found = &c;
    }
    return found;
}

DigestVerdict DigestGate::Check(const std::string* authorization, std::string_view method,
                                std::string_view uri, uint64_t now_ms, uint32_t address,
                                DigestAnswer* answer) const {
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
    if (answer != nullptr) answer->user = fields.username;
    if (fields.realm != m_realm) return DigestVerdict::kWrongRealm;
    const std::string& nonce = fields.nonce;
    if (nonce.size() != kNonceTimeDigits + 32 || !IsLowerHex(nonce))
        return DigestVerdict::kForeignNonce;
    uint32_t nc = 0;
    if (!fields.qop.empty()) {
        // Eight hex digits (RFC 2617 §3.2.2); count 0 is never sent.
        if (fields.nc.size() != 8 || !IsHex(fields.nc)) return DigestVerdict::kMalformed;
        nc = static_cast<uint32_t>(std::stoul(fields.nc, nullptr, 16));
        if (nc == 0) return DigestVerdict::kMalformed;
    }
    const std::string_view stamp = std::string_view(nonce).substr(0, kNonceTimeDigits);
    if (!EqualInConstantTime(nonce.substr(kNonceTimeDigits), NonceMac(m_secret, stamp, address)))
        return DigestVerdict::kStale;
    uint64_t issued = std::stoull(std::string(stamp), nullptr, 16) & kStampTimeMask;
    // A time ahead of ours is a nonce of before a reboot: the clock began again.
    if (issued > now_ms || now_ms - issued >= kNonceLifetimeMs) return DigestVerdict::kStale;
    if (fields.uri != uri) return DigestVerdict::kWrongUri;
    if (answer != nullptr) {
        answer->nonce = nonce;
        answer->nc = nc;
    }
    const Credential* found = Find(m_users, fields.username);
    // The unknown user's answer is still hashed, so timing does not tell users apart.
    std::string expected =
        DigestExpectedResponse(found != nullptr ? found->ha1 : m_secret, method, fields);
    if (found != nullptr && EqualInConstantTime(expected, fields.response))
        return DigestVerdict::kOk;
    const Credential* before = Find(m_retired, fields.username);
    if (before != nullptr &&
        EqualInConstantTime(DigestExpectedResponse(before->ha1, method, fields), fields.response))
        return DigestVerdict::kRetiredPassword;
    return found == nullptr ? DigestVerdict::kUnknownUser : DigestVerdict::kWrongResponse;
}

bool NonceCounts::Take(std::string_view nonce, uint32_t nc) {
    ++m_tick;
    Entry* entry = nullptr;
    for (Entry& e : m_entries) {
        if (e.nonce == nonce) entry = &e;
    }
    if (entry == nullptr) {
        if (m_entries.size() < static_cast<size_t>(kTracked)) {
            m_entries.emplace_back();
            entry = &m_entries.back();
        } else {
            entry = &m_entries.front();
            for (Entry& e : m_entries) {
                if (e.used_at < entry->used_at) entry = &e;
            }
            *entry = Entry{};
        }
        entry->nonce = std::string(nonce);
    }
    entry->used_at = m_tick;
    if (nc > entry->highest) {
        const uint32_t shift = nc - entry->highest;
        entry->seen = shift >= kWindow ? 0 : entry->seen << shift;
        entry->seen |= 1;
        entry->highest = nc;
        return true;
    }
    const uint32_t back = entry->highest - nc;
    if (back >= kWindow) return false;
    const uint64_t bit = uint64_t{1} << back;
    if ((entry->seen & bit) != 0) return false;
    entry->seen |= bit;
    return true;
}

}  // namespace auth
