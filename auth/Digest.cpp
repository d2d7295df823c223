#include "auth/Digest.h"

#include <cstddef>

#include "auth/Md5.h"

namespace auth {
namespace {

// Bounds on what a client may send: real headers are a few hundred bytes; these keep a hostile
// one from costing more than a few kilobytes of copies.
constexpr size_t kMaxHeader = 4096;
constexpr size_t kMaxFieldValue = 512;

bool IsBlank(char c) { return c == ' ' || c == '\t'; }

// NUL, CR, LF and the other control bytes would cut or split a value when it reaches a log line
// or a C string; tab is a blank and allowed.
bool IsControl(char c) {
    const unsigned char u = static_cast<unsigned char>(c);
    return (u < 0x20 && c != '\t') || u == 0x7f;
}

char Lower(char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; }

bool EqualIgnoringCase(std::string_view a, std::string_view b) {
    if (a.size() != b.size()) return false;
    for (size_t i = 0; i < a.size(); ++i)
        if (Lower(a[i]) != Lower(b[i])) return false;
    return true;
}

// The known parameters, in the order of DigestFields.
struct Known {
    std::string_view name;
    std::string DigestFields::*field;
};
constexpr Known kKnown[] = {
    {"username", &DigestFields::username}, {"realm", &DigestFields::realm},
    {"nonce", &DigestFields::nonce},       {"uri", &DigestFields::uri},
    {"response", &DigestFields::response}, {"algorithm", &DigestFields::algorithm},
    {"qop", &DigestFields::qop},           {"nc", &DigestFields::nc},
    {"cnonce", &DigestFields::cnonce},     {"opaque", &DigestFields::opaque},
};
constexpr size_t kKnownCount = sizeof(kKnown) / sizeof(kKnown[0]);
constexpr size_t kRequired = 5;  // username through response
constexpr size_t kQop = 6, kNc = 7, kCnonce = 8;
static_assert(kKnown[kQop].name == "qop" && kKnown[kNc].name == "nc" &&
              kKnown[kCnonce].name == "cnonce");

// Reads one value at `*pos` into `*value` (unescaped), leaving `*pos` after it. False when it
// is malformed or too long.
bool ReadValue(std::string_view text, size_t* pos, std::string* value) {
    size_t p = *pos;
    if (p < text.size() && text[p] == '"') {
        ++p;
        for (;;) {
            if (p == text.size()) return false;  // unterminated
            char c = text[p++];
            if (c == '"') break;
            if (c == '\\') {
                if (p == text.size()) return false;
                c = text[p++];
            }
            if (IsControl(c) || value->size() == kMaxFieldValue) return false;
            value->push_back(c);
        }
    } else {
        const size_t start = p;
        while (p < text.size() && !IsBlank(text[p]) && text[p] != ',') {
            const char c = text[p];
            if (c == '"' || IsControl(c)) return false;
            ++p;
        }
        // An empty token is no value at all ("nc=,").
        if (p == start || p - start > kMaxFieldValue) return false;
        value->assign(text.substr(start, p - start));
    }
    *pos = p;
    return true;
}

}  // namespace

DigestParse ParseDigestAuthorization(std::string_view value, DigestFields* out) {
    *out = DigestFields{};
    size_t pos = 0;
    while (pos < value.size() && IsBlank(value[pos])) ++pos;
    constexpr std::string_view kScheme = "Digest";
    if (value.size() - pos <= kScheme.size() ||
        !EqualIgnoringCase(value.substr(pos, kScheme.size()), kScheme) ||
        !IsBlank(value[pos + kScheme.size()]))
        return DigestParse::kNotDigest;
    if (value.size() > kMaxHeader) return DigestParse::kMalformed;
    pos += kScheme.size();

    bool seen[kKnownCount] = {};
    std::string unknown;  // values of parameters we skip, parsed for their shape only
    for (;;) {
        while (pos < value.size() && (IsBlank(value[pos]) || value[pos] == ',')) ++pos;
        if (pos == value.size()) break;

        const size_t name_start = pos;
        while (pos < value.size() && !IsBlank(value[pos]) && value[pos] != '=' &&
               value[pos] != ',' && value[pos] != '"' && !IsControl(value[pos]))
            ++pos;
        const std::string_view name = value.substr(name_start, pos - name_start);
        while (pos < value.size() && IsBlank(value[pos])) ++pos;
        if (name.empty() || pos == value.size() || value[pos] != '=')
            return DigestParse::kMalformed;
        ++pos;
        while (pos < value.size() && IsBlank(value[pos])) ++pos;

        std::string* target = &unknown;
        for (size_t k = 0; k < kKnownCount; ++k) {
            if (!EqualIgnoringCase(name, kKnown[k].name)) continue;
            if (seen[k]) return DigestParse::kMalformed;
            seen[k] = true;
            target = &(out->*kKnown[k].field);
            break;
        }
        target->clear();
        if (!ReadValue(value, &pos, target)) return DigestParse::kMalformed;

        // Only blanks may stand between a value and the next comma.
        while (pos < value.size() && IsBlank(value[pos])) ++pos;
        if (pos < value.size() && value[pos] != ',') return DigestParse::kMalformed;
    }

    for (size_t k = 0; k < kRequired; ++k)
        if (!seen[k]) return DigestParse::kMalformed;
    if (!out->algorithm.empty() && !EqualIgnoringCase(out->algorithm, "MD5"))
        return DigestParse::kMalformed;
    if (seen[kQop]) {
        // auth-int would need the body's digest; RTSP requests here carry no body worth it.
        if (!EqualIgnoringCase(out->qop, "auth")) return DigestParse::kMalformed;
        if (!seen[kNc] || !seen[kCnonce]) return DigestParse::kMalformed;
    }
    return DigestParse::kOk;
}

std::string DigestHa1(std::string_view user, std::string_view realm, std::string_view password) {
    std::string text;
    text.reserve(user.size() + realm.size() + password.size() + 2);
    text.append(user).append(":").append(realm).append(":").append(password);
    return Md5Hex(text);
}

std::string DigestExpectedResponse(std::string_view ha1, std::string_view method,
                                   const DigestFields& fields) {
    std::string text;
    text.reserve(method.size() + fields.uri.size() + 1);
    text.append(method).append(":").append(fields.uri);
    const std::string ha2 = Md5Hex(text);

    text.clear();
    text.append(ha1).append(":").append(fields.nonce).append(":");
    if (!fields.qop.empty()) {
        // The client hashes qop as it spelled it, so it goes in unchanged.
        text.append(fields.nc).append(":").append(fields.cnonce).append(":");
        text.append(fields.qop).append(":");
    }
    text.append(ha2);
    return Md5Hex(text);
}

}  // namespace auth
