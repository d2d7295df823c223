#include "auth/AccessGate.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <fstream>
#include <random>
#include <sstream>

#include "base/OrvexLog.h"
#include "platform/LogPort.h"

namespace auth {

namespace {

constexpr const char* kTag = "orvex:::access";
// A credentials file larger than this is not an htdigest file.
constexpr std::streamsize kMaxCredentialsBytes = 1 << 20;
constexpr size_t kSecretHexDigits = 64;

uint64_t SteadyMs() {
    return static_cast<uint64_t>(std::chrono::duration_cast<std::chrono::milliseconds>(
                                     std::chrono::steady_clock::now().time_since_epoch())
                                     .count());
}

// 32 bytes from the system's random source, as hex.
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

bool IsSecret(const std::string& text) {
    if (text.size() != kSecretHexDigits) return false;
    for (char c : text) {
        if (!((c >= '0' && c <= '9') || (c >= 'a' && c <= 'f'))) return false;
    }
    return true;
}

// The nonce secret kept beside the users file (mode 0600), made at the first start: browsers'
// nonces stay good across restarts instead of every viewer being asked again. Where it cannot
// be kept, this run draws its own.
std::string KeptSecret(const std::string& users_file) {
    const std::string path = users_file + ".nonce-key";
    char text[kSecretHexDigits + 1] = {};
    int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd >= 0) {
        ssize_t n = read(fd, text, kSecretHexDigits);
        close(fd);
        if (n == static_cast<ssize_t>(kSecretHexDigits) && IsSecret(text)) return text;
    }
    std::string secret = DrawSecret();
    const std::string temporary = path + ".new";
    fd = open(temporary.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
    bool kept =
        fd >= 0 && write(fd, secret.data(), secret.size()) == static_cast<ssize_t>(secret.size());
    if (fd >= 0) close(fd);
    kept = kept && rename(temporary.c_str(), path.c_str()) == 0;
    if (!kept) {
        unlink(temporary.c_str());
        OrvexLogPriority(platform::kLogDebug, kTag,
                         "cannot keep the nonce key %s; nonces end with this run", path.c_str());
    }
    return secret;
}

bool StampOf(const std::string& path, struct stat* st) { return stat(path.c_str(), st) == 0; }

}  // namespace

AccessGate::AccessGate() : AccessGate(SteadyMs) {}

AccessGate::AccessGate(Clock clock) : m_clock(std::move(clock)) {}

void AccessGate::Configure(std::string_view allow, std::string_view auth_file) {
    thread_mutex::Scoped hold(m_lock);
    m_allow = AllowList();
    m_allow_set = !allow.empty();
    m_gate.reset();
    m_closed = false;
    m_file = std::string(auth_file);
    m_stamp = FileStamp{};
    if (!allow.empty()) {
        std::string bad;
        if (!m_allow.Parse(allow, &bad)) {
            OrvexLogPriority(platform::kLogError, kTag,
                             "kv.orvex.allow: \"%s\" is not an IPv4 address or CIDR; no "
                             "connection is accepted",
                             bad.c_str());
        }
    }
    m_secret.clear();
    if (m_file.empty()) return;
    m_checked_at = m_clock();
    ReadUsers(true);
}

void AccessGate::ReadUsers(bool first) {
    struct stat st {};
    if (StampOf(m_file, &st)) {
        m_stamp = {st.st_dev, st.st_ino, st.st_size,
                   static_cast<int64_t>(st.st_mtim.tv_sec) * 1000000000 + st.st_mtim.tv_nsec};
    } else {
        m_stamp = FileStamp{};
    }
    std::ifstream in(m_file, std::ios::binary);
    std::ostringstream text;
    if (in) text << in.rdbuf();
    if (!in || in.bad() || text.str().size() > static_cast<size_t>(kMaxCredentialsBytes)) {
        OrvexLogPriority(platform::kLogError, kTag,
                         "kv.orvex.auth: cannot read the credentials file %s; every request is "
                         "refused",
                         m_file.c_str());
        m_gate.reset();
        m_closed = true;
        return;
    }
    std::vector<Credential> users;
    int bad_line = 0;
    if (!ParseHtdigest(text.str(), &users, &bad_line) || users.empty()) {
        OrvexLogPriority(platform::kLogError, kTag,
                         "kv.orvex.auth: %s line %d is not user:realm:md5-hex (htdigest); every "
                         "request is refused",
                         m_file.c_str(), users.empty() && bad_line == 0 ? 1 : bad_line);
        m_gate.reset();
        m_closed = true;
        return;
    }
    // Users whose password changed or who were removed keep their last credential as retired:
    // their clients are refused without being counted as guessers.
    std::vector<Credential> retired;
    if (m_gate != nullptr) {
        for (const Credential& old : m_gate->users()) {
            bool same = false;
            for (const Credential& c : users)
                same = same || (c.user == old.user && c.ha1 == old.ha1);
            if (!same) retired.push_back(old);
        }
    }
    if (m_secret.empty()) m_secret = KeptSecret(m_file);
    m_gate = std::make_unique<DigestGate>(std::move(users), m_secret, std::move(retired));
    m_closed = false;
    if (first) {
        OrvexLogPriority(platform::kLogDebug, kTag, "Digest authentication on, realm \"%s\", %s",
                         m_gate->realm().c_str(), m_file.c_str());
    } else {
        OrvexLogPriority(platform::kLogInfo, kTag, "%s changed: %zu user(s) may watch",
                         m_file.c_str(), m_gate->users().size());
    }
}

void AccessGate::CheckUsersFile(uint64_t now) {
    if (m_file.empty() || now - m_checked_at < kRecheckMs) return;
    m_checked_at = now;
    struct stat st {};
    FileStamp seen;
    if (StampOf(m_file, &st)) {
        seen = {st.st_dev, st.st_ino, st.st_size,
                static_cast<int64_t>(st.st_mtim.tv_sec) * 1000000000 + st.st_mtim.tv_nsec};
    }
    if (!(seen == m_stamp)) ReadUsers(false);
}

bool AccessGate::AdmitConnection(uint32_t address, const std::string& text) {
    thread_mutex::Scoped hold(m_lock);
    if (m_allow.Allows(address)) return true;
    OrvexLogPriority(platform::kLogWarn, kTag, "%s is not in kv.orvex.allow: connection reset",
                     text.c_str());
    return false;
}

AccessDecision AccessGate::Judge(const AccessRequest& request) {
    AccessDecision d;
    thread_mutex::Scoped hold(m_lock);
    if (m_file.empty()) return d;
    const uint64_t now = m_clock();
    const uint64_t locked_ms = m_lockout.LockedForMs(request.address, now);
    if (locked_ms > 0) {
        // An answer rather than a reset, so the client can say what happened; it tells nothing
        // of whether the password was right.
        d.answer = AccessAnswer::kLockedOut;
        d.retry_after_s = static_cast<unsigned>((locked_ms + 999) / 1000);
        d.close = true;
        d.reason = "locked out after too many failed answers";
        return d;
    }
    if (request.exempt) return d;
    CheckUsersFile(now);
    if (m_closed || m_gate == nullptr) {
        d.answer = AccessAnswer::kUnavailable;
        d.reason = "the credentials file is unusable";
        return d;
    }
    DigestAnswer answer;
    DigestVerdict verdict = request.repeated_authorization
                                ? DigestVerdict::kMalformed
                                : m_gate->Check(request.authorization, request.method, request.uri,
                                                now, request.address, &answer);
    if (verdict == DigestVerdict::kOk && answer.nc != 0 && !m_counts.Take(answer.nonce, answer.nc))
        verdict = DigestVerdict::kReplayed;
    if (verdict == DigestVerdict::kOk) return d;
    d.reason = VerdictText(verdict);
    if (!answer.user.empty() && answer.user.size() <= 64)
        d.reason += " (user \"" + answer.user + "\")";
    if (verdict == DigestVerdict::kMalformed) {
        d.answer = AccessAnswer::kBadRequest;
    } else {
        d.answer = AccessAnswer::kChallenge;
        d.challenge = m_gate->Challenge(now, m_nonce_serial++, request.address,
                                        verdict == DigestVerdict::kStale);
    }
    if (IsFailedGuess(verdict) && m_lockout.RecordFailure(request.address, now)) {
        OrvexLogPriority(platform::kLogWarn, kTag,
                         "%.*s: %d failed answers within a minute; it is refused for a minute",
                         static_cast<int>(request.address_text.size()), request.address_text.data(),
                         FailureLockout::kMaxFailures);
        d.answer = AccessAnswer::kLockedOut;
        d.challenge.clear();
        d.retry_after_s = static_cast<unsigned>(FailureLockout::kLockMs / 1000);
        d.close = true;
    }
    return d;
}

bool AccessGate::authenticating() const {
    thread_mutex::Scoped hold(m_lock);
    return !m_file.empty();
}

std::string AccessGate::Summary() const {
    thread_mutex::Scoped hold(m_lock);
    std::string text;
    if (m_file.empty()) {
        text = "everyone, no password";
    } else if (m_gate == nullptr) {
        text = "nobody (the users file " + m_file + " is unusable)";
    } else {
        text = std::to_string(m_gate->users().size()) +
               (m_gate->users().size() == 1 ? " user of " : " users of ") + m_file +
               " (Digest passwords)";
    }
    if (m_allow_set) text += m_allow.everyone() ? "" : ", from kv.orvex.allow only";
    return text;
}

}  // namespace auth
