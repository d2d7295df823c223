#include "auth/Digest.h"

#include "auth/Md5.h"

namespace auth {

namespace {

constexpr size_t kMaxHeader = 4096;
constexpr size_t kMaxValue = 512;

bool IsBlank(char c) { return c == ' ' || c == '\t'; }

char Lower(char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; }

bool SameWord(std::string_view a, std::string_view b) {
    if (a.size() != b.size()) return false;
    for (size_t i = 0; i < a.size(); ++i) {
        if (Lower(a[i]) != Lower(b[i])) return false;
    }
    return true;
}

// Reads the auth-params one by one; every step moves forward, so the work is linear.
class ParamReader {
public:
    explicit ParamReader(std::string_view text) : m_text(text) {}

    enum Step { kParam, kEnd, kBad };

    Step Next(std::string_view* name, std::string* value) {
        // Separators: blanks and empty list elements.
        while (m_at < m_text.size() && (IsBlank(m_text[m_at]) || m_text[m_at] == ',')) ++m_at;
        if (m_at == m_text.size()) return kEnd;
        size_t start = m_at;
        while (m_at < m_text.size() && m_text[m_at] != '=' && m_text[m_at] != ',' &&
               !IsBlank(m_text[m_at]) && m_text[m_at] != '"') {
            ++m_at;
        }
        *name = m_text.substr(start, m_at - start);
        SkipBlanks();
        if (name->empty() || m_at == m_text.size() || m_text[m_at] != '=') return kBad;
        ++m_at;
        SkipBlanks();
        value->clear();
        if (m_at < m_text.size() && m_text[m_at] == '"') {
            if (!Quoted(value)) return kBad;
        } else {
            while (m_at < m_text.size() && m_text[m_at] != ',' && !IsBlank(m_text[m_at])) {
                if (m_text[m_at] == '"') return kBad;  // a quote inside a token
                value->push_back(m_text[m_at++]);
            }
        }
        if (value->size() > kMaxValue) return kBad;
        // After a value: blanks, then a comma or the end.
        SkipBlanks();
        if (m_at < m_text.size() && m_text[m_at] != ',') return kBad;
        return kParam;
    }

private:
    void SkipBlanks() {
        while (m_at < m_text.size() && IsBlank(m_text[m_at])) ++m_at;
    }
    bool Quoted(std::string* value) {
        ++m_at;  // the opening quote
        while (m_at < m_text.size()) {
            char c = m_text[m_at++];
            if (c == '"') return true;
            if (c == '\\') {
                if (m_at == m_text.size()) return false;
                c = m_text[m_at++];
            }
            if (value->size() <= kMaxValue) value->push_back(c);  // one past the bound is enough
        }
        return false;  // unterminated
    }

    std::string_view m_text;
    size_t m_at = 0;
};

}  // namespace

DigestParse ParseDigestAuthorization(std::string_view value, DigestFields* out) {
    static constexpr std::string_view kScheme = "digest";
    if (value.size() <= kScheme.size() || !SameWord(value.substr(0, kScheme.size()), kScheme) ||
        !IsBlank(value[kScheme.size()])) {
        return value.size() == kScheme.size() && SameWord(value, kScheme) ? DigestParse::kMalformed
                                                                          : DigestParse::kNotDigest;
    }
    if (value.size() > kMaxHeader) return DigestParse::kMalformed;
    *out = DigestFields{};
    struct Known {
        std::string_view name;
        std::string* field;
        bool seen;
    } known[] = {
        {"username", &out->username, false}, {"realm", &out->realm, false},
        {"nonce", &out->nonce, false},       {"uri", &out->uri, false},
        {"response", &out->response, false}, {"algorithm", &out->algorithm, false},
        {"qop", &out->qop, false},           {"nc", &out->nc, false},
        {"cnonce", &out->cnonce, false},     {"opaque", &out->opaque, false},
    };
    ParamReader reader(value.substr(kScheme.size()));
    std::string_view name;
    std::string text;
    for (;;) {
        ParamReader::Step step = reader.Next(&name, &text);
        if (step == ParamReader::kBad) return DigestParse::kMalformed;
        if (step == ParamReader::kEnd) break;
        for (Known& k : known) {
            if (!SameWord(name, k.name)) continue;
            if (k.seen) return DigestParse::kMalformed;  // repeated
            k.seen = true;
            *k.field = text;
        }
    }
    for (int i = 0; i < 5; ++i) {  // username, realm, nonce, uri, response
        if (!known[i].seen) return DigestParse::kMalformed;
    }
    if (known[5].seen && !SameWord(out->algorithm, "MD5")) return DigestParse::kMalformed;
    if (known[6].seen) {
        if (!SameWord(out->qop, "auth") || !known[7].seen || !known[8].seen) {
            return DigestParse::kMalformed;
        }
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
    std::string a2;
    a2.append(method).append(":").append(fields.uri);
    std::string text;
    text.append(ha1).append(":").append(fields.nonce).append(":");
    if (!fields.qop.empty()) {
        text.append(fields.nc).append(":").append(fields.cnonce).append(":").append(fields.qop);
        text.append(":");
    }
    text.append(Md5Hex(a2));
    return Md5Hex(text);
}

}  // namespace auth
