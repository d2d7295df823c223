#include "rtsp/RtspAccess.h"

#include <chrono>
#include <fstream>
#include <random>
#include <sstream>

#include "platform/LogPort.h"
#include "platform/Ports.h"
#include "platform/PropertyPort.h"
#include "rtsp/RtspResponse.h"
#include "service/OrvexLog.h"

namespace {

constexpr const char* kTag = "orvex:::access";
// A credentials file larger than this is not an htdigest file.
constexpr std::streamsize kMaxCredentialsBytes = 1 << 20;

uint64_t SteadyMs() {
    return static_cast<uint64_t>(std::chrono::duration_cast<std::chrono::milliseconds>(
                                     std::chrono::steady_clock::now().time_since_epoch())
                                     .count());
}

// 32 bytes from the system's random source, as hex: the nonce secret of this run.
std::string DrawSecret() {
    std::random_device source;
    std::string secret;
    for (int i = 0; i < 8; ++i) {
        char word[9];
        snprintf(word, sizeof word, "%08x", static_cast<unsigned>(source()));
        secret += word;
    }
    return secret;
}

std::string_view Word(std::string_view line, int index) {
    for (;;) {
        while (!line.empty() && (line.front() == ' ' || line.front() == '\t'))
            line.remove_prefix(1);
        size_t end = line.find_first_of(" \t");
        if (index-- == 0) return line.substr(0, end);
        if (end == std::string_view::npos) return {};
        line.remove_prefix(end);
    }
}

bool IsBlank(char c) { return c == ' ' || c == '\t'; }

}  // namespace

std::optional<std::string> AuthorizationOf(const std::vector<std::string>& lines, bool* repeated) {
    static constexpr std::string_view kName = "authorization";
    std::optional<std::string> value;
    *repeated = false;
    for (size_t i = 1; i < lines.size(); ++i) {
        std::string_view line = lines[i];
        if (line.size() <= kName.size() || line[kName.size()] != ':') continue;
        bool same = true;
        for (size_t k = 0; k < kName.size() && same; ++k) {
            same = static_cast<char>(tolower(static_cast<unsigned char>(line[k]))) == kName[k];
        }
        if (!same) continue;
        if (value) *repeated = true;
        line.remove_prefix(kName.size() + 1);
        while (!line.empty() && IsBlank(line.front())) line.remove_prefix(1);
        while (!line.empty() && (IsBlank(line.back()) || line.back() == '\r'))
            line.remove_suffix(1);
        value = std::string(line);
    }
    return value;
}

RtspAccess::RtspAccess() : RtspAccess(SteadyMs) {}

RtspAccess::RtspAccess(Clock clock) : m_clock(std::move(clock)) {}

void RtspAccess::Load() {
    char allow[platform::kPropertyValueMax] = {};
    char file[platform::kPropertyValueMax] = {};
    platform::Properties().Get("kv.orvex.allow", allow, "");
    platform::Properties().Get("kv.orvex.auth", file, "");
    Configure(allow, file);
}

void RtspAccess::Configure(std::string_view allow, std::string_view auth_file) {
    m_allow = auth::AllowList();
    m_gate.reset();
    m_closed = false;
    if (!allow.empty()) {
        std::string bad;
        if (!m_allow.Parse(allow, &bad)) {
            OrvexLogPriority(platform::kLogError, kTag,
                             "kv.orvex.allow: \"%s\" is not an IPv4 address or CIDR; no "
                             "connection is accepted",
                             bad.c_str());
        }
    }
    if (auth_file.empty()) return;
    const std::string path(auth_file);
    std::ifstream in(path, std::ios::binary);
    std::ostringstream text;
    if (in) text << in.rdbuf();
    if (!in || in.bad() || text.str().size() > static_cast<size_t>(kMaxCredentialsBytes)) {
        OrvexLogPriority(platform::kLogError, kTag,
                         "kv.orvex.auth: cannot read the credentials file %s; every request is "
                         "refused",
                         path.c_str());
        m_closed = true;
        return;
    }
    std::vector<auth::Credential> users;
    int bad_line = 0;
    if (!auth::ParseHtdigest(text.str(), &users, &bad_line) || users.empty()) {
        OrvexLogPriority(platform::kLogError, kTag,
                         "kv.orvex.auth: %s line %d is not user:realm:md5-hex (htdigest); every "
                         "request is refused",
                         path.c_str(), users.empty() && bad_line == 0 ? 1 : bad_line);
        m_closed = true;
        return;
    }
    m_gate = std::make_unique<auth::DigestGate>(std::move(users), DrawSecret());
    OrvexLogPriority(platform::kLogInfo, kTag, "Digest authentication on, realm \"%s\", %s",
                     m_gate->realm().c_str(), path.c_str());
}

bool RtspAccess::AdmitConnection(uint32_t address, const std::string& text) {
    if (!m_allow.Allows(address)) {
        OrvexLogPriority(platform::kLogWarn, kTag, "%s is not in kv.orvex.allow: connection reset",
                         text.c_str());
        return false;
    }
    return !m_lockout.IsLocked(address, m_clock());
}

RtspAccess::Decision RtspAccess::Judge(const std::vector<std::string>& lines, int method_code,
                                       uint32_t address, const std::string& text) {
    Decision d;
    if (!authenticating() || method_code == kRtspOptions) return d;
    if (m_closed) {
        d.answer = Answer::kUnavailable;
        d.reason = "the credentials file is unusable";
        return d;
    }
    const uint64_t now = m_clock();
    bool repeated = false;
    std::optional<std::string> header = AuthorizationOf(lines, &repeated);
    std::string_view request_line = lines.empty() ? std::string_view() : lines[0];
    std::string user;
    auth::DigestVerdict verdict =
        repeated ? auth::DigestVerdict::kMalformed
                 : m_gate->Check(header ? &*header : nullptr, Word(request_line, 0),
                                 Word(request_line, 1), now, &user);
    if (verdict == auth::DigestVerdict::kOk) return d;
    d.reason = auth::VerdictText(verdict);
    if (!user.empty() && user.size() <= 64) d.reason += " (user \"" + user + "\")";
    if (verdict == auth::DigestVerdict::kMalformed) {
        d.answer = Answer::kBadRequest;
    } else {
        d.answer = Answer::kChallenge;
        d.header = m_gate->Challenge(now, verdict == auth::DigestVerdict::kStale);
    }
    if (auth::IsFailedGuess(verdict) && m_lockout.RecordFailure(address, now)) {
        OrvexLogPriority(platform::kLogWarn, kTag,
                         "%s: %d failed answers within a minute; its connections are refused "
                         "for a minute",
                         text.c_str(), auth::FailureLockout::kMaxFailures);
        d.close = true;
    }
    return d;
}
