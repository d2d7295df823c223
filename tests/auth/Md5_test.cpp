#include "auth/Md5.h"

#include <gtest/gtest.h>

#include <string>

namespace {

using auth::EqualInConstantTime;
using auth::HmacMd5Hex;
using auth::Md5Hex;

// Bytes (i * 7 + 3) mod 256, so a block that is fed in the wrong order shows.
std::string Pattern(size_t n) {
    std::string s(n, '\0');
    for (size_t i = 0; i < n; ++i) s[i] = static_cast<char>((i * 7 + 3) & 0xff);
    return s;
}

std::string Repeat(const char* s, int n) {
    std::string out;
    for (int i = 0; i < n; ++i) out += s;
    return out;
}

TEST(AuthMd5Test, KnownDigests) {
    struct Case {
        const char* name;
        std::string input;
        const char* hex;
    };
    const Case cases[] = {
        // RFC 1321 appendix A.5.
        {"empty", "", "d41d8cd98f00b204e9800998ecf8427e"},
        {"a", "a", "0cc175b9c0f1b6a831c399e269772661"},
        {"abc", "abc", "900150983cd24fb0d6963f7d28e17f72"},
        {"message digest", "message digest", "f96b697d7cb7938d525a2f31aaf161d0"},
        {"alphabet", "abcdefghijklmnopqrstuvwxyz", "c3fcd3d76192e4007dfb496cca67e13b"},
        {"alphanumerics", "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789",
         "d174ab98d277d9f5a5611c2c9f419d9f"},
        {"eight times 1234567890", Repeat("1234567890", 8), "57edf4a22be3c955ac49da2e2107b67a"},
        // Padding edges (hashlib): 55 is the longest one-block tail, 56 spills the length
        // into a second block, 64 pads a whole block, 119/120 the same one block later.
        {"55 bytes", Pattern(55), "52c0e574e1198de5fe3f8f11440dcb1b"},
        {"56 bytes", Pattern(56), "46c9907fc908ee68b1e7b8e71286a518"},
        {"63 bytes", Pattern(63), "a62f6d59e837867693f042f5b8f5a236"},
        {"64 bytes", Pattern(64), "7160b8fb5e9e4023d549c3971fbaeead"},
        {"65 bytes", Pattern(65), "70bd662e7aefbda85a0f7244167b7897"},
        {"119 bytes", Pattern(119), "e84905d4214f4d1ca56c2cdcc152b143"},
        {"120 bytes", Pattern(120), "e3eb5a6c8669ea01a8c185b8abc8a5dc"},
        {"128 bytes", Pattern(128), "10b2da1a82f16d99a81a7203fe9f02cb"},
        {"a million a", std::string(1000000, 'a'), "7707d6ae4e027c70eea2a935c2296f21"},
    };
    for (const Case& c : cases) EXPECT_EQ(Md5Hex(c.input), c.hex) << c.name;
}

TEST(AuthMd5Test, DigestBytesMatchTheHex) {
    const auth::Md5Digest d = auth::Md5("abc");
    EXPECT_EQ(d[0], 0x90);
    EXPECT_EQ(d[15], 0x72);
}

TEST(AuthHmacMd5Test, Rfc2202Cases) {
    struct Case {
        const char* name;
        std::string key;
        std::string message;
        const char* hex;
    };
    std::string counting_key;
    for (char c = 1; c <= 25; ++c) counting_key.push_back(c);
    const Case cases[] = {
        {"1", std::string(16, '\x0b'), "Hi There", "9294727a3638bb1c13f48ef8158bfc9d"},
        {"2", "Jefe", "what do ya want for nothing?", "750c783e6ab0b503eaa86e310a5db738"},
        {"3", std::string(16, '\xaa'), std::string(50, '\xdd'), "56be34521d144c88dbb8c733f0e8b3f6"},
        {"4", counting_key, std::string(50, '\xcd'), "697eaf0aca3a3aea3a75164746ffaa79"},
        {"5", std::string(16, '\x0c'), "Test With Truncation", "56461ef2342edc00f9bab995690efd4c"},
        {"6: 80-byte key", std::string(80, '\xaa'),
         "Test Using Larger Than Block-Size Key - Hash Key First",
         "6b1ab7fe4bd7bf8f0b62e6ce61b9d0cd"},
        {"7: 80-byte key, long message", std::string(80, '\xaa'),
         "Test Using Larger Than Block-Size Key and Larger Than One Block-Size Data",
         "6f630fad67cda0ee1fb1f562db3aa53e"},
        // Python's hmac: a key of exactly one block is used as it is, one byte more is hashed.
        {"64-byte key", std::string(64, 'k'), "exactly one block of key",
         "29db757a1b1926d3cf3efa7ba5aabb6a"},
        {"65-byte key", std::string(65, 'k'), "one byte over", "10ebd3cf4df28e334eb57ce16692df5e"},
    };
    for (const Case& c : cases) EXPECT_EQ(HmacMd5Hex(c.key, c.message), c.hex) << c.name;
}

TEST(AuthEqualInConstantTimeTest, ComparesContentAndLength) {
    struct Case {
        std::string a, b;
        bool equal;
    };
    const Case cases[] = {
        {"", "", true},
        {"6629fae49393a05397450978507c4ef1", "6629fae49393a05397450978507c4ef1", true},
        {"6629fae49393a05397450978507c4ef1", "7629fae49393a05397450978507c4ef1", false},
        {"6629fae49393a05397450978507c4ef1", "6629fae49393a05397450978507c4ef0", false},
        {"6629fae49393a05397450978507c4ef1", "6629FAE49393A05397450978507C4EF1", false},
        {"abc", "abcd", false},
        {"abcd", "abc", false},
        {"", "a", false},
        {std::string("a\0b", 3), std::string("a\0c", 3), false},
        {std::string("\x80", 1), std::string("\x00", 1), false},
    };
    for (const Case& c : cases) EXPECT_EQ(EqualInConstantTime(c.a, c.b), c.equal) << c.a;
}

}  // namespace
