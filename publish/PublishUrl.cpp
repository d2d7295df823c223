#include "publish/PublishUrl.h"

#include <cctype>

namespace {

constexpr size_t kMaxUrl = 1024;

std::string Lower(std::string s) {
    for (char& c : s) c = static_cast<char>(tolower(static_cast<unsigned char>(c)));
    return s;
}

bool HostCharacter(char c) {
    return isalnum(static_cast<unsigned char>(c)) || c == '.' || c == '-' || c == '_';
}

}  // namespace

std::vector<std::string> SplitPublishList(const std::string& value) {
    std::vector<std::string> words;
    size_t at = 0;
    while (at < value.size()) {
        while (at < value.size() && isspace(static_cast<unsigned char>(value[at]))) ++at;
        size_t end = at;
        while (end < value.size() && !isspace(static_cast<unsigned char>(value[end]))) ++end;
        if (end > at) words.push_back(value.substr(at, end - at));
        at = end;
    }
    return words;
}

bool ParsePublishUrl(const std::string& text, PublishUrl* out, std::string* why) {
    PublishUrl url;
    url.url = text;
    if (text.size() > kMaxUrl) {
        *why = "longer than 1024 characters";
        return false;
    }
    for (char c : text) {
        if (static_cast<unsigned char>(c) <= 0x20 || static_cast<unsigned char>(c) >= 0x7F) {
            *why = "a control, blank or non-ASCII character";
            return false;
        }
    }
    const size_t colon = text.find("://");
    if (colon == std::string::npos) {
        *why = "no scheme (rtmp:// or srt://)";
        return false;
    }
    url.scheme = Lower(text.substr(0, colon));
    if (url.scheme == "rtmp") {
        url.container = "flv";
    } else if (url.scheme == "srt") {
        url.container = "mpegts";
    } else {
        *why = "scheme \"" + url.scheme + "\" is neither rtmp nor srt";
        return false;
    }
    size_t at = colon + 3;
    const size_t authority_end = text.find_first_of("/?#", at);
    const std::string authority =
        text.substr(at, (authority_end == std::string::npos ? text.size() : authority_end) - at);
    if (authority.find('@') != std::string::npos) {
        *why = "user names in the address are not supported";
        return false;
    }
    std::string port_text;
    if (!authority.empty() && authority[0] == '[') {  // an IPv6 address
        const size_t close = authority.find(']');
        if (close == std::string::npos || close == 1) {
            *why = "an unclosed or empty [IPv6] address";
            return false;
        }
        url.host = authority.substr(1, close - 1);
        for (char c : url.host) {
            if (!isxdigit(static_cast<unsigned char>(c)) && c != ':' && c != '.') {
                *why = "not an IPv6 address in the brackets";
                return false;
            }
        }
        if (close + 1 < authority.size()) {
            if (authority[close + 1] != ':') {
                *why = "text after the ]";
                return false;
            }
            port_text = authority.substr(close + 2);
            if (port_text.empty()) {
                *why = "an empty port";
                return false;
            }
        }
    } else {
        const size_t port_colon = authority.find(':');
        url.host = authority.substr(0, port_colon);
        if (port_colon != std::string::npos) {
            port_text = authority.substr(port_colon + 1);
            if (port_text.empty()) {
                *why = "an empty port";
                return false;
            }
        }
        for (char c : url.host) {
            if (!HostCharacter(c)) {
                *why = "a character that no host name has";
                return false;
            }
        }
    }
    if (url.host.empty()) {
        *why = "no host";
        return false;
    }
    if (!port_text.empty()) {
        long port = 0;
        for (char c : port_text) {
            if (!isdigit(static_cast<unsigned char>(c)) || port > 65535) {
                *why = "the port is not a number from 1 to 65535";
                return false;
            }
            port = port * 10 + (c - '0');
        }
        if (port < 1 || port > 65535) {
            *why = "the port is not a number from 1 to 65535";
            return false;
        }
        url.port = static_cast<int>(port);
    }
    const std::string rest = authority_end == std::string::npos ? "" : text.substr(authority_end);
    if (url.scheme == "rtmp") {
        // The server needs an application and a stream name: /app/key.
        const size_t query = rest.find_first_of("?#");
        const std::string path = rest.substr(0, query);
        const size_t second = path.size() > 1 ? path.find('/', 1) : std::string::npos;
        if (path.empty() || path[0] != '/' || second == std::string::npos || second == 1 ||
            second + 1 >= path.size()) {
            *why = "no /application/stream-key path";
            return false;
        }
    } else if (url.port == 0) {
        *why = "SRT needs a port";
        return false;
    }
    *out = url;
    return true;
}
