// Arbitrary bytes as an Authorization value: parsed; an accepted one is hashed the way the
// server checks it, written back out with every value quoted and parsed again, which must give
// the same fields.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>
#include <string_view>

#include "auth/Digest.h"
#include "auth/DigestGate.h"
#include "auth/Md5.h"

namespace {

void AppendQuoted(std::string* out, std::string_view name, const std::string& value) {
    out->append(", ").append(name).append("=\"");
    for (char c : value) {
        if (c == '"' || c == '\\') out->push_back('\\');
        out->push_back(c);
    }
    out->push_back('"');
}

bool Same(const auth::DigestFields& a, const auth::DigestFields& b) {
    return a.username == b.username && a.realm == b.realm && a.nonce == b.nonce && a.uri == b.uri &&
           a.response == b.response && a.algorithm == b.algorithm && a.qop == b.qop &&
           a.nc == b.nc && a.cnonce == b.cnonce && a.opaque == b.opaque;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    const std::string_view value(reinterpret_cast<const char*>(data), size);
    auth::DigestFields fields;
    if (auth::ParseDigestAuthorization(value, &fields) != auth::DigestParse::kOk) return 0;

    const std::string ha1 = auth::DigestHa1(fields.username, fields.realm, "password");
    const std::string expected = auth::DigestExpectedResponse(ha1, "DESCRIBE", fields);
    if (expected.size() != 32) abort();
    auth::EqualInConstantTime(expected, fields.response);

    // The gate's whole check of it, nonce and count included: a verdict, never a crash.
    static const auth::DigestGate gate({{"orvex", "orvex", "2f5dc0319c3279451ae1c1d7fd646060"}},
                                       "s3cret");
    static auth::NonceCounts counts;
    const std::string header(value);
    auth::DigestAnswer answer;
    if (gate.Check(&header, "DESCRIBE", fields.uri, 1000000, 0x7f000001, &answer) ==
            auth::DigestVerdict::kOk &&
        answer.nc != 0) {
        counts.Take(answer.nonce, answer.nc);
    }

    // An unknown pair first, so every field can follow ", " (and unknown pairs are skipped).
    std::string again = "Digest stale=false";
    AppendQuoted(&again, "username", fields.username);
    AppendQuoted(&again, "realm", fields.realm);
    AppendQuoted(&again, "nonce", fields.nonce);
    AppendQuoted(&again, "uri", fields.uri);
    AppendQuoted(&again, "response", fields.response);
    if (!fields.algorithm.empty()) AppendQuoted(&again, "algorithm", fields.algorithm);
    if (!fields.opaque.empty()) AppendQuoted(&again, "opaque", fields.opaque);
    if (!fields.qop.empty()) {
        AppendQuoted(&again, "qop", fields.qop);
        AppendQuoted(&again, "nc", fields.nc);
        AppendQuoted(&again, "cnonce", fields.cnonce);
    } else {
        if (!fields.nc.empty()) AppendQuoted(&again, "nc", fields.nc);
        if (!fields.cnonce.empty()) AppendQuoted(&again, "cnonce", fields.cnonce);
    }
    // Quoting a token, or escaping its backslashes, can push the header over its bound.
    if (again.size() > 4096) return 0;
    auth::DigestFields reparsed;
    if (auth::ParseDigestAuthorization(again, &reparsed) != auth::DigestParse::kOk) abort();
    if (!Same(fields, reparsed)) abort();
    return 0;
}
