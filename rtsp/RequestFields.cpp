#include "rtsp/RequestFields.h"

#include <climits>

#include "rtsp/RtspResponse.h"

namespace {

bool Blank(char c) {
    return c == ' ' || c == '\t' || c == '\n' || c == '\v' || c == '\f' || c == '\r';
}

std::string Lower(std::string_view s) {
    std::string out(s);
    for (char& c : out) c = to_lower_char(c);
    return out;
}

bool Contains(std::string_view s, std::string_view word) {
    return s.find(word) != std::string_view::npos;
}

}  // namespace

std::optional<int> LeadingInt(std::string_view text) {
    size_t i = 0;
    while (i < text.size() && Blank(text[i])) ++i;
    bool negative = false;
    if (i < text.size() && (text[i] == '-' || text[i] == '+')) negative = text[i++] == '-';
    // Accumulated as a negative number, which reaches INT_MIN.
    long long value = 0;
    for (; i < text.size() && text[i] >= '0' && text[i] <= '9'; ++i) {
        value = value * 10 - (text[i] - '0');
        if (value < INT_MIN) return std::nullopt;
    }
    if (!negative) {
        if (-value > INT_MAX) return std::nullopt;
        return static_cast<int>(-value);
    }
    return static_cast<int>(value);
}

int RequestMethodOf(std::string_view line) {
    static const std::pair<const char*, int> kMethods[] = {
        {"OPTIONS", kRtspOptions},
        {"DESCRIBE", kRtspDescribe},
        {"SETUP", kRtspSetup},
        {"TEARDOWN", kRtspTeardown},
        {"PLAY", kRtspPlay},
        {"PAUSE", kRtspPause},
        {"GET_PARAMETER", kRtspGetParameter},
    };
    for (const auto& m : kMethods) {
        if (Contains(line, m.first)) return m.second;
    }
    return 0;
}

std::optional<std::string> HeaderValueOf(const std::vector<std::string>& lines,
                                         std::string_view key) {
    std::string lower_key = Lower(key);
    for (const std::string& line : lines) {
        size_t at = Lower(line).find(lower_key);
        if (at == std::string::npos) continue;
        std::string_view v(line);
        v.remove_prefix(at + lower_key.size());
        size_t b = v.find_first_not_of(':');
        v = b == std::string_view::npos ? std::string_view() : v.substr(b);
        size_t t = v.find_first_not_of(" \t");
        if (t != std::string_view::npos) v = v.substr(t);  // only blanks left: kept as they are
        return std::string(v);
    }
    return std::nullopt;
}

unsigned CSeqOf(std::string_view value) {
    return static_cast<unsigned>(LeadingInt(value).value_or(0));
}

std::optional<std::string> MrlOf(std::string_view line) {
    size_t start = Lower(line).find("rtsp:/");
    if (start == std::string::npos) return std::nullopt;
    size_t version = line.find("RTSP/1.0", start);
    if (version == std::string_view::npos) return std::nullopt;
    std::string_view url = line.substr(start, version - start);
    size_t end = url.find_last_not_of(' ');
    return std::string(url.substr(0, end == std::string_view::npos ? 0 : end + 1));
}

std::optional<std::string> UrlAfterHostOf(std::string_view url) {
    std::string_view r = url.size() > 6 ? url.substr(6) : std::string_view();
    if (!r.empty() && r[0] == '/') r.remove_prefix(1);
    size_t slash = r.find('/');
    if (slash == std::string_view::npos) return std::nullopt;
    return std::string(r.substr(slash + 1));
}

std::optional<std::string> SessionNameOf(std::string_view url) {
    std::optional<std::string> rest = UrlAfterHostOf(url);
    if (!rest || Contains(*rest, "trackID=")) return std::nullopt;
    return rest->substr(0, rest->find('/'));
}

std::optional<std::string> StreamNameOf(std::string_view url) {
    std::optional<std::string> rest = UrlAfterHostOf(url);
    if (!rest) return std::nullopt;
    size_t slash = rest->find('/');
    if (slash != std::string::npos) return rest->substr(slash + 1);
    if (Contains(*rest, "trackID=")) return rest;
    return std::nullopt;
}

std::optional<int> TrackIndexOf(std::string_view stream) {
    constexpr std::string_view kTrack = "trackID=";
    size_t at = stream.find(kTrack);
    if (at == std::string_view::npos) return std::nullopt;
    std::optional<int> number = LeadingInt(stream.substr(at + kTrack.size()));
    // trackID=1 is the first stream.
    if (!number || *number < 1) return -1;
    return *number - 1;
}

std::optional<PortPair> PortPairOf(std::string_view transport, std::string_view word) {
    size_t at = transport.find(word);
    if (at == std::string_view::npos) return std::nullopt;
    std::string_view value = transport.substr(at + word.size());
    value = value.substr(0, value.find(';'));
    size_t dash = value.find('-');
    PortPair pair;
    pair.first = LeadingInt(value).value_or(0);
    pair.second =
        LeadingInt(dash != std::string_view::npos ? value.substr(dash + 1) : value).value_or(0);
    return pair;
}
