#pragma once

#include <cctype>
#include <cstdint>
#include <cstdio>
#include <string>
#include <vector>

// Bytes written as hex in the tables of the web tests.
namespace hexbytes {

using Bytes = std::vector<uint8_t>;

// "0000 6d6f" -> bytes; blanks are for the reader only.
inline Bytes Unhex(const std::string& hex) {
    Bytes out;
    std::string digits;
    for (char c : hex) {
        if (isxdigit(static_cast<unsigned char>(c))) digits += c;
    }
    for (size_t i = 0; i + 1 < digits.size(); i += 2) {
        out.push_back(static_cast<uint8_t>(std::stoul(digits.substr(i, 2), nullptr, 16)));
    }
    return out;
}

inline std::string Hex(const uint8_t* p, size_t n) {
    std::string out;
    char b[3];
    for (size_t i = 0; i < n; ++i) {
        snprintf(b, sizeof b, "%02x", p[i]);
        out += b;
    }
    return out;
}
inline std::string Hex(const Bytes& b) { return Hex(b.data(), b.size()); }

}  // namespace hexbytes
