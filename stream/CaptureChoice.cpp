#include "stream/CaptureChoice.h"

#include <cctype>
#include <cstdlib>

namespace stream {

namespace {

// The value after "key=" at the query's start or after '?' or '&': letters, digits and '_', at
// most 16 of them; empty when there is none.
std::string ValueOf(const std::string& query, const char* key) {
    const std::string name = std::string(key) + "=";
    for (size_t at = query.find(name); at != std::string::npos; at = query.find(name, at + 1)) {
        if (at != 0 && query[at - 1] != '?' && query[at - 1] != '&') continue;
        size_t end = at + name.size();
        while (end < query.size() && end - at - name.size() < 16 &&
               (isalnum(static_cast<unsigned char>(query[end])) || query[end] == '_')) {
            ++end;
        }
        return query.substr(at + name.size(), end - at - name.size());
    }
    return std::string();
}

// A value's leading digits as a number; 0 when there are none or more than nine.
unsigned Number(const std::string& v) {
    size_t digits = 0;
    while (digits < v.size() && isdigit(static_cast<unsigned char>(v[digits]))) ++digits;
    return digits == 0 || digits > 9
               ? 0u
               : static_cast<unsigned>(strtoul(v.substr(0, digits).c_str(), nullptr, 10));
}

}  // namespace

std::string CaptureQueryFor(const std::string& query) {
    static const char* const kKeys[][2] = {
        {"width", "1280"},  {"height", "720"},  {"cameraid", "hd0"}, {"win", "main"},
        {"sub", "0"},       {"dumpvideo", "0"}, {"dumpaudio", "0"},  {"specialcase", "none"},
        {"framerate", "30"}};
    std::string out = "?";
    for (const auto& key : kKeys) {
        std::string value = ValueOf(query, key[0]);
        if (value.empty()) value = key[1];
        if (out.size() > 1) out += "&";
        out += std::string(key[0]) + "=" + value;
    }
    return out;
}

void CaptureQuerySize(const std::string& query, unsigned* width, unsigned* height) {
    *width = Number(ValueOf(query, "width"));
    *height = Number(ValueOf(query, "height"));
}

}  // namespace stream
