#pragma once

#include <string>
#include <string_view>

namespace auth {

// The fields of an `Authorization: Digest ...` header value. Unknown parameters are skipped.
struct DigestFields {
    std::string username;
    std::string realm;
    std::string nonce;
    std::string uri;
    std::string response;
    std::string algorithm;  // empty, or "MD5" in any case
    std::string qop;        // empty, or "auth"
    std::string nc;
    std::string cnonce;
    std::string opaque;
};

enum class DigestParse {
    kOk,
    kNotDigest,  // another scheme (Basic, ...) or an empty value
    kMalformed,  // unterminated or unquoted where quoting is required, a repeated or missing
                 // field, an algorithm or qop we do not speak, a value over the length bound
};

// `value` is what follows "Authorization:" with any leading blanks, without the line end.
// The scheme is matched in any case and must be followed by a blank. Parameter values are
// tokens or quoted strings (backslash escapes); names are matched in any case. A control byte
// (NUL, CR, LF, ...; tab excepted) anywhere in a value is refused as kMalformed rather than
// kept: values reach log lines and C strings, where it would cut or split them. Values are
// bounded to 512 bytes and the whole header to 4096; the work is linear in its length.
// Thread contract: pure functions, any thread.
DigestParse ParseDigestAuthorization(std::string_view value, DigestFields* out);

// HA1 = MD5(user:realm:password), the line format of an htdigest file.
std::string DigestHa1(std::string_view user, std::string_view realm, std::string_view password);
// The response a client must send: MD5(HA1:nonce:HA2), or with qop=auth
// MD5(HA1:nonce:nc:cnonce:qop:HA2), where HA2 = MD5(method:uri).
std::string DigestExpectedResponse(std::string_view ha1, std::string_view method,
                                   const DigestFields& fields);

}  // namespace auth
