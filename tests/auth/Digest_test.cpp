#include "auth/Digest.h"

#include <gtest/gtest.h>

#include <string>

#include "auth/Md5.h"

namespace {

using auth::DigestFields;
using auth::DigestParse;
using auth::ParseDigestAuthorization;

struct DigestVector {
    const char* user;
    const char* realm;
    const char* password;
    const char* method;
    const char* uri;
    const char* nonce;
    const char* qop;
    const char* nc;
    const char* cnonce;
    const char* ha1;
    const char* response;
};
#include "digest_vectors.inc"  // beside this file

bool operator==(const DigestFields& a, const DigestFields& b) {
    return a.username == b.username && a.realm == b.realm && a.nonce == b.nonce && a.uri == b.uri &&
           a.response == b.response && a.algorithm == b.algorithm && a.qop == b.qop &&
           a.nc == b.nc && a.cnonce == b.cnonce && a.opaque == b.opaque;
}

std::string Describe(const DigestFields& f) {
    return "username=" + f.username + " realm=" + f.realm + " nonce=" + f.nonce + " uri=" + f.uri +
           " response=" + f.response + " algorithm=" + f.algorithm + " qop=" + f.qop +
           " nc=" + f.nc + " cnonce=" + f.cnonce + " opaque=" + f.opaque;
}

const char kMinimal[] = R"(username="u", realm="r", nonce="n", uri="/", response="x")";
const DigestFields kMinimalFields{"u", "r", "n", "/", "x", "", "", "", "", ""};

std::string Minimal() { return std::string("Digest ") + kMinimal; }

// A header `size` bytes long, padded with trailing blanks.
std::string PaddedTo(size_t size) {
    std::string h = Minimal();
    h.append(size - h.size(), ' ');
    return h;
}

TEST(AuthDigestParseTest, HeaderShapes) {
    struct Case {
        const char* name;
        std::string header;
        DigestParse result;
        DigestFields fields;  // checked when kOk
    };
    const Case cases[] = {
        // What ffmpeg sends: no blanks after the commas, algorithm unquoted, qop quoted.
        {"ffmpeg, no qop",
         R"(Digest username="admin",realm="orvex",nonce="5f2c",uri="rtsp://192.168.1.5:554/skyvo.1?w=1280",response="9c1a4d9570ebebc9199a283191e1e836")",
         DigestParse::kOk,
         {"admin", "orvex", "5f2c", "rtsp://192.168.1.5:554/skyvo.1?w=1280",
          "9c1a4d9570ebebc9199a283191e1e836", "", "", "", "", ""}},
        {"ffmpeg, qop auth",
         R"(Digest username="admin",realm="orvex",nonce="5f2c",uri="rtsp://h/skyvo/trackID=1",response="6ecc",algorithm=MD5,opaque="op",qop="auth",cnonce="a3b1c2d4e5f60718",nc=00000002)",
         DigestParse::kOk,
         {"admin", "orvex", "5f2c", "rtsp://h/skyvo/trackID=1", "6ecc", "MD5", "auth", "00000002",
          "a3b1c2d4e5f60718", "op"}},
        // What GStreamer sends: ", " between parameters, opaque appended when it was offered.
        {"GStreamer",
         R"(Digest username="admin", realm="orvex", nonce="5f2c", uri="rtsp://h/skyvo/trackID=1", response="1357")",
         DigestParse::kOk,
         {"admin", "orvex", "5f2c", "rtsp://h/skyvo/trackID=1", "1357", "", "", "", "", ""}},
        {"GStreamer with opaque",
         R"(Digest username="admin", realm="orvex", nonce="5f2c", uri="rtsp://h/skyvo/", response="1357", opaque="0a1b")",
         DigestParse::kOk,
         {"admin", "orvex", "5f2c", "rtsp://h/skyvo/", "1357", "", "", "", "", "0a1b"}},
        {"folded example, tabs, qop unquoted",
         "Digest username=\"Mufasa\",\trealm=\"testrealm@host.com\",\tnonce=\"dcd98b\",\t"
         "uri=\"/dir/index.html\",\tqop=auth,\tnc=00000001,\tcnonce=\"0a4f113b\",\t"
         "response=\"6629\",\topaque=\"5ccc\"",
         DigestParse::kOk,
         {"Mufasa", "testrealm@host.com", "dcd98b", "/dir/index.html", "6629", "", "auth",
          "00000001", "0a4f113b", "5ccc"}},
        {"scheme in lower case", std::string("digest ") + kMinimal, DigestParse::kOk,
         kMinimalFields},
        {"scheme in capitals, tab after it", std::string("DIGEST\t") + kMinimal, DigestParse::kOk,
         kMinimalFields},
        {"leading blanks", std::string(" \tDigest ") + kMinimal, DigestParse::kOk, kMinimalFields},
        {"names in any case",
         R"(Digest UserName="u", REALM="r", Nonce="n", URI="/", Response="x", QOP=AUTH, NC=1, CNonce=c, Algorithm=md5)",
         DigestParse::kOk,
         {"u", "r", "n", "/", "x", "md5", "AUTH", "1", "c", ""}},
        {"blanks around = and ,",
         "Digest  username = \"u\" ,realm= \"r\"\t, nonce =n ,  uri=\"/\"  , response=\"x\"  ",
         DigestParse::kOk, kMinimalFields},
        {"empty list elements",
         R"(Digest ,,username="u",, realm="r", ,nonce="n",uri="/",response="x",)", DigestParse::kOk,
         kMinimalFields},
        {"tokens throughout", "Digest username=u,realm=r,nonce=n,uri=/,response=x",
         DigestParse::kOk, kMinimalFields},
        {"escapes unescaped",
         R"(Digest username="Mu\"fa\\sa", realm="a\bc", nonce="n", uri="/", response="x")",
         DigestParse::kOk,
         {"Mu\"fa\\sa", "abc", "n", "/", "x", "", "", "", "", ""}},
        {"comma, equals and tab inside quotes",
         "Digest username=\"u\", realm=\"r\", nonce=\"n\", uri=\"rtsp://h/a?x=1,y=2\tz\", "
         "response=\"x\"",
         DigestParse::kOk,
         {"u", "r", "n", "rtsp://h/a?x=1,y=2\tz", "x", "", "", "", "", ""}},
        {"unknown parameters skipped",
         R"(Digest stale=false, username="u", x-foo="a, b=\"c\"", realm="r", nonce="n", uri="/", response="x", userhash=false)",
         DigestParse::kOk, kMinimalFields},
        {"empty quoted values kept",
         R"(Digest username="", realm="", nonce="", uri="", response="", algorithm="")",
         DigestParse::kOk,
         {"", "", "", "", "", "", "", "", "", ""}},
        {"backslash in a token kept",
         R"(Digest username=a\b, realm="r", nonce="n", uri="/", response="x")",
         DigestParse::kOk,
         {"a\\b", "r", "n", "/", "x", "", "", "", "", ""}},
        {"512-byte value",
         "Digest username=\"u\", realm=\"r\", nonce=\"" + std::string(512, 'n') +
             "\", uri=\"/\", response=\"x\"",
         DigestParse::kOk,
         {"u", "r", std::string(512, 'n'), "/", "x", "", "", "", "", ""}},
        {"4096-byte header", PaddedTo(4096), DigestParse::kOk, kMinimalFields},

        {"Basic", "Basic YWRtaW46c2VjcmV0", DigestParse::kNotDigest, {}},
        {"empty", "", DigestParse::kNotDigest, {}},
        {"blanks only", " \t ", DigestParse::kNotDigest, {}},
        {"Digest alone", "Digest", DigestParse::kNotDigest, {}},
        {"no blank after the scheme",
         std::string("Digest,") + kMinimal,
         DigestParse::kNotDigest,
         {}},
        {"a longer scheme", std::string("Digestive ") + kMinimal, DigestParse::kNotDigest, {}},
        {"comma only", ",", DigestParse::kNotDigest, {}},

        {"Digest and a blank", "Digest ", DigestParse::kMalformed, {}},
        {"commas only after the scheme", "Digest , ,,", DigestParse::kMalformed, {}},
        {"unterminated quote",
         R"(Digest username="u", realm="r", nonce="n", uri="/", response="x)",
         DigestParse::kMalformed,
         {}},
        {"backslash ends the header",
         R"(Digest username="u", realm="r", nonce="n", uri="/", response="x\)",
         DigestParse::kMalformed,
         {}},
        {"repeated username",
         std::string("Digest username=\"v\", ") + kMinimal,
         DigestParse::kMalformed,
         {}},
        {"repeated in another case",
         std::string("Digest ") + kMinimal + ", USERNAME=\"v\"",
         DigestParse::kMalformed,
         {}},
        {"missing response",
         R"(Digest username="u", realm="r", nonce="n", uri="/")",
         DigestParse::kMalformed,
         {}},
        {"missing uri",
         R"(Digest username="u", realm="r", nonce="n", response="x")",
         DigestParse::kMalformed,
         {}},
        {"qop auth-int",
         Minimal() + ", qop=auth-int, nc=00000001, cnonce=\"c\"",
         DigestParse::kMalformed,
         {}},
        {"qop empty",
         Minimal() + ", qop=\"\", nc=00000001, cnonce=\"c\"",
         DigestParse::kMalformed,
         {}},
        {"qop without nc", Minimal() + ", qop=auth, cnonce=\"c\"", DigestParse::kMalformed, {}},
        {"qop without cnonce", Minimal() + ", qop=auth, nc=00000001", DigestParse::kMalformed, {}},
        {"algorithm SHA-256", Minimal() + ", algorithm=SHA-256", DigestParse::kMalformed, {}},
        {"algorithm MD5-sess", Minimal() + ", algorithm=MD5-sess", DigestParse::kMalformed, {}},
        {"513-byte value",
         "Digest username=\"u\", realm=\"r\", nonce=\"" + std::string(513, 'n') +
             "\", uri=\"/\", response=\"x\"",
         DigestParse::kMalformed,
         {}},
        {"513-byte unknown token",
         Minimal() + ", x=" + std::string(513, 'y'),
         DigestParse::kMalformed,
         {}},
        {"4097-byte header", PaddedTo(4097), DigestParse::kMalformed, {}},
        {"username with no =",
         R"(Digest username, realm="r", nonce="n", uri="/", response="x")",
         DigestParse::kMalformed,
         {}},
        {"name at the end", Minimal() + ", stale", DigestParse::kMalformed, {}},
        {"no name", Minimal() + ", =\"x\"", DigestParse::kMalformed, {}},
        {"quoted name", Minimal() + ", \"stale\"=false", DigestParse::kMalformed, {}},
        {"garbage after a quoted value",
         R"(Digest username="u"x, realm="r", nonce="n", uri="/", response="x")",
         DigestParse::kMalformed,
         {}},
        {"a second word after a quoted value",
         R"(Digest username="u" "v", realm="r", nonce="n", uri="/", response="x")",
         DigestParse::kMalformed,
         {}},
        {"quote inside a token",
         R"(Digest username=u"v", realm="r", nonce="n", uri="/", response="x")",
         DigestParse::kMalformed,
         {}},
        {"blank inside a token",
         R"(Digest username=u v, realm="r", nonce="n", uri="/", response="x")",
         DigestParse::kMalformed,
         {}},
        {"empty token", Minimal() + ", nc=, qop=auth, cnonce=c", DigestParse::kMalformed, {}},
        {"NUL inside a quoted value",
         std::string("Digest username=\"a") + '\0' +
             "b\", realm=\"r\", nonce=\"n\", uri=\"/\", response=\"x\"",
         DigestParse::kMalformed,
         {}},
        {"NUL inside a token", Minimal() + ", x=a" + '\0' + "b", DigestParse::kMalformed, {}},
        {"CR LF inside a quoted value",
         Minimal() + ", opaque=\"a\r\nCSeq: 9\"",
         DigestParse::kMalformed,
         {}},
        {"CR LF at the end", Minimal() + "\r\n", DigestParse::kMalformed, {}},
    };
    for (const Case& c : cases) {
        DigestFields fields;
        fields.opaque = "left over";
        EXPECT_EQ(ParseDigestAuthorization(c.header, &fields), c.result) << c.name;
        if (c.result == DigestParse::kOk) {
            EXPECT_TRUE(fields == c.fields) << c.name << ": " << Describe(fields);
        }
    }
}

// The worked example of RFC 2617 §3.5, end to end from the client's header.
TEST(AuthDigestResponseTest, Rfc2617Example) {
    const char header[] =
        "Digest username=\"Mufasa\", realm=\"testrealm@host.com\", "
        "nonce=\"dcd98b7102dd2f0e8b11d0f600bfb0c093\", uri=\"/dir/index.html\", qop=auth, "
        "nc=00000001, cnonce=\"0a4f113b\", response=\"6629fae49393a05397450978507c4ef1\", "
        "opaque=\"5ccc069c403ebaf9f0171e9517f40e41\"";
    DigestFields fields;
    ASSERT_EQ(ParseDigestAuthorization(header, &fields), DigestParse::kOk);
    const std::string ha1 = auth::DigestHa1("Mufasa", "testrealm@host.com", "Circle Of Life");
    EXPECT_EQ(ha1, "939e7578ed9e3c518a452acee763bce9");
    const std::string expected = auth::DigestExpectedResponse(ha1, "GET", fields);
    EXPECT_EQ(expected, "6629fae49393a05397450978507c4ef1");
    EXPECT_TRUE(auth::EqualInConstantTime(expected, fields.response));
    EXPECT_NE(auth::DigestExpectedResponse(ha1, "PLAY", fields), expected);
}

// RTSP shapes, computed by tools/digest-vectors.py with hashlib.
TEST(AuthDigestResponseTest, RtspVectors) {
    for (const DigestVector& v : kDigestVectors) {
        const std::string ha1 = auth::DigestHa1(v.user, v.realm, v.password);
        EXPECT_EQ(ha1, v.ha1) << v.method << " " << v.uri;
        DigestFields fields;
        fields.username = v.user;
        fields.realm = v.realm;
        fields.nonce = v.nonce;
        fields.uri = v.uri;
        fields.qop = v.qop;
        fields.nc = v.nc;
        fields.cnonce = v.cnonce;
        EXPECT_EQ(auth::DigestExpectedResponse(ha1, v.method, fields), v.response)
            << v.method << " " << v.uri << " qop=" << v.qop;
    }
}

}  // namespace
