#pragma once

#include <array>
#include <cstdint>
#include <string>
#include <string_view>

namespace auth {

// MD5 as RTSP Digest authentication uses it: digests are written as 32 lowercase hex digits.
using Md5Digest = std::array<uint8_t, 16>;

Md5Digest Md5(std::string_view bytes);
std::string Md5Hex(std::string_view bytes);
// HMAC (RFC 2104) over MD5, as lowercase hex.
std::string HmacMd5Hex(std::string_view key, std::string_view message);
// Equal strings, in a time that depends on their lengths only.
bool EqualInConstantTime(std::string_view a, std::string_view b);

}  // namespace auth
