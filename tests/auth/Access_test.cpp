// Address rules, the failure lockout, htdigest files and the Digest gate. Nonces and responses
// were computed independently with Python's hmac and hashlib.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "auth/AddressRules.h"
#include "auth/DigestGate.h"

namespace {

using auth::DigestVerdict;

uint32_t Ip(const char* text) {
    uint32_t a = 0;
    EXPECT_TRUE(auth::ParseIpv4(text, &a)) << text;
    return a;
}

TEST(AddressRulesTest, Ipv4TextsAreFourNumbersUpTo255) {
    const struct {
        const char* text;
        bool ok;
        uint32_t value;
    } cases[] = {
        {"127.0.0.1", true, 0x7F000001}, {"0.0.0.0", true, 0},    {"255.255.255.255", true, ~0u},
        {"10.1.2.3", true, 0x0A010203},  {"256.0.0.1", false, 0}, {"1.2.3", false, 0},
        {"1.2.3.4.5", false, 0},         {"1..2.3", false, 0},    {" 1.2.3.4", false, 0},
        {"1.2.3.4 ", false, 0},          {"-1.2.3.4", false, 0},  {"0001.2.3.4", false, 0},
        {"1.2.3.x", false, 0},           {"", false, 0},          {"99999999999.1.1.1", false, 0},
    };
    for (const auto& c : cases) {
        uint32_t value = 0;
        EXPECT_EQ(auth::ParseIpv4(c.text, &value), c.ok) << c.text;
        if (c.ok) {
            EXPECT_EQ(value, c.value) << c.text;
        }
    }
}

TEST(AddressRulesTest, AllowListsMatchTheirRangesAndFailClosed) {
    const struct {
        const char* list;
        bool ok;
        const char* bad;
        std::vector<const char*> allowed, refused;
    } cases[] = {
        {"127.0.0.1", true, "", {"127.0.0.1"}, {"127.0.0.2", "10.0.0.1"}},
        {"10.0.0.0/8, 192.168.1.0/24",
         true,
         "",
         {"10.9.8.7", "192.168.1.255"},
         {"192.168.2.1", "11.0.0.0"}},
        {"0.0.0.0/0", true, "", {"1.2.3.4", "255.255.255.255"}, {}},
        {"192.168.1.77/24", true, "", {"192.168.1.1"}, {"192.168.0.1"}},  // host bits ignored
        {"10.0.0.1/32,\t10.0.0.3", true, "", {"10.0.0.1", "10.0.0.3"}, {"10.0.0.2"}},
        {"10.0.0.0/33", false, "10.0.0.0/33", {}, {"10.0.0.1"}},
        {"10.0.0.0/", false, "10.0.0.0/", {}, {"10.0.0.0"}},
        {"127.0.0.1,,10.0.0.1", false, "", {}, {"127.0.0.1"}},
        {"127.0.0.1, example.com", false, "example.com", {}, {"127.0.0.1"}},
        {"fe80::1", false, "fe80::1", {}, {"127.0.0.1"}},
    };
    for (const auto& c : cases) {
        auth::AllowList list;
        std::string bad;
        EXPECT_EQ(list.Parse(c.list, &bad), c.ok) << c.list;
        if (!c.ok) {
            EXPECT_EQ(bad, c.bad) << c.list;
        }
        for (const char* a : c.allowed) EXPECT_TRUE(list.Allows(Ip(a))) << c.list << " " << a;
        for (const char* a : c.refused) EXPECT_FALSE(list.Allows(Ip(a))) << c.list << " " << a;
    }
    EXPECT_TRUE(auth::AllowList().Allows(Ip("8.8.8.8")));  // no list: everyone
}

TEST(FailureLockoutTest, TenFailuresInAMinuteLockForAMinute) {
    auth::FailureLockout lockout;
    const uint32_t guesser = Ip("10.0.0.9"), other = Ip("10.0.0.10");
    uint64_t t = 5000;
    for (int i = 1; i < 10; ++i) EXPECT_FALSE(lockout.RecordFailure(guesser, t += 1000));
    EXPECT_FALSE(lockout.IsLocked(guesser, t));
    EXPECT_TRUE(lockout.RecordFailure(guesser, t += 1000));  // the tenth, 10 s after the first
    const uint64_t locked_at = t;
    EXPECT_TRUE(lockout.IsLocked(guesser, t));
    EXPECT_FALSE(lockout.IsLocked(other, t));
    EXPECT_FALSE(lockout.RecordFailure(guesser, t + 1));  // already locked: no second log line
    EXPECT_TRUE(lockout.IsLocked(guesser, locked_at + 59999));
    EXPECT_FALSE(lockout.IsLocked(guesser, locked_at + 60000));
    // Afterwards it takes ten new failures again.
    t = locked_at + 60000;
    for (int i = 1; i < 10; ++i) EXPECT_FALSE(lockout.RecordFailure(guesser, t += 10));
    EXPECT_TRUE(lockout.RecordFailure(guesser, t += 10));
}

TEST(FailureLockoutTest, SlowGuessingAndManyAddressesDoNotLockOrEvictALock) {
    auth::FailureLockout lockout;
    const uint32_t slow = Ip("10.0.0.1");
    uint64_t t = 0;
    // One failure every 6.7 s: never ten within a minute.
    for (int i = 0; i < 30; ++i) EXPECT_FALSE(lockout.RecordFailure(slow, t += 6700)) << i;
    // Nine 7 s apart, then a tenth inside the minute of the first: locked.
    const uint32_t burst = Ip("10.0.0.2");
    for (uint64_t i = 0; i < 9; ++i) EXPECT_FALSE(lockout.RecordFailure(burst, i * 7000));
    EXPECT_TRUE(lockout.RecordFailure(burst, 59999));
    const uint32_t locked = Ip("10.0.1.1");
    for (int i = 0; i < 10; ++i) lockout.RecordFailure(locked, ++t);
    ASSERT_TRUE(lockout.IsLocked(locked, t));
    for (uint32_t a = 1; a < 1000; ++a) lockout.RecordFailure(Ip("10.1.0.0") + a, ++t);
    EXPECT_TRUE(lockout.IsLocked(locked, t));
}

TEST(HtdigestTest, LinesAreUserRealmAndLowercaseHex) {
    const std::string ha1 = "939e7578ed9e3c518a452acee763bce9";
    const struct {
        std::string text;
        bool ok;
        int bad_line;
        size_t users;
    } cases[] = {
        {"Mufasa:testrealm@host.com:" + ha1 + "\n", true, 0, 1},
        {"# users\n\na:orvex:" + ha1 + "\r\nb:orvex:" + ha1, true, 0, 2},
        {"", true, 0, 0},
        {"a:orvex:" + ha1 + "\nb:orvex\n", false, 2, 0},
        {"a:orvex:" + ha1.substr(1) + "\n", false, 1, 0},
        {"a:orvex:" + ha1 + "0\n", false, 1, 0},
        {":orvex:" + ha1 + "\n", false, 1, 0},
        {"a:orvex:939E7578ED9E3C518A452ACEE763BCE9\n", false, 1, 0},
        {"a:orvex:password\n", false, 1, 0},
        {"\n\n a b\n", false, 3, 0},
    };
    for (const auto& c : cases) {
        std::vector<auth::Credential> users;
        int bad = 0;
        EXPECT_EQ(auth::ParseHtdigest(c.text, &users, &bad), c.ok) << c.text;
        if (c.ok) {
            EXPECT_EQ(users.size(), c.users) << c.text;
        } else {
            EXPECT_EQ(bad, c.bad_line) << c.text;
        }
    }
}

class DigestGateTest : public ::testing::Test {
protected:
    // orvex:orvex:pw
    DigestGateTest() : gate({{"orvex", "orvex", "2f5dc0319c3279451ae1c1d7fd646060"}}, "s3cret") {}

    static std::string Header(const std::string& user, const std::string& realm,
                              const std::string& nonce, const std::string& uri,
                              const std::string& response, const std::string& rest = "") {
        return "Digest username=\"" + user + "\", realm=\"" + realm + "\", nonce=\"" + nonce +
               "\", uri=\"" + uri + "\", response=\"" + response + "\"" + rest;
    }
    DigestVerdict Check(const std::string& header, const char* method = "DESCRIBE",
                        uint64_t now = kIssued + 1000) {
        return gate.Check(&header, method, kUri, now, nullptr);
    }

    static constexpr uint64_t kIssued = 1000000;
    static constexpr const char* kNonce = "00000000000f4240cc31c2f6bc099823c931fd3f7cc3310b";
    static constexpr const char* kUri = "rtsp://127.0.0.1/skyvo.0";
    static constexpr const char* kResponse = "2a850fdf8f71e14be9bd37ffd9df344b";
    auth::DigestGate gate;
};

TEST_F(DigestGateTest, NoncesCarryTheirTimeAndAnHmac) {
    EXPECT_EQ(gate.MakeNonce(kIssued), kNonce);
    EXPECT_EQ(gate.Challenge(kIssued, false),
              std::string("WWW-Authenticate: Digest realm=\"orvex\", nonce=\"") + kNonce + "\"");
    EXPECT_EQ(gate.Challenge(kIssued, true),
              std::string("WWW-Authenticate: Digest realm=\"orvex\", nonce=\"") + kNonce +
                  "\", stale=TRUE");
}

TEST_F(DigestGateTest, VerdictsOnAnswers) {
    const std::string other_run = auth::DigestGate({}, "another secret").MakeNonce(kIssued);
    std::string forged = kNonce;
    forged[0] = '1';  // a later time under the old HMAC
    const struct {
        std::string header;
        const char* method;
        uint64_t now;
        DigestVerdict verdict;
    } cases[] = {
        {Header("orvex", "orvex", kNonce, kUri, kResponse), "DESCRIBE", kIssued,
         DigestVerdict::kOk},
        // Replayed within the nonce's life: accepted, as no table of nonces is kept.
        {Header("orvex", "orvex", kNonce, kUri, kResponse), "DESCRIBE", kIssued + 299999,
         DigestVerdict::kOk},
        {Header("orvex", "orvex", kNonce, kUri, kResponse), "DESCRIBE", kIssued + 300000,
         DigestVerdict::kStale},
        {Header("orvex", "orvex", kNonce, kUri, kResponse), "DESCRIBE", kIssued - 1,
         DigestVerdict::kForeignNonce},
        // The method enters the hash.
        {Header("orvex", "orvex", kNonce, kUri, kResponse), "PLAY", kIssued,
         DigestVerdict::kWrongResponse},
        {Header("orvex", "orvex", kNonce, kUri, "2a850fdf8f71e14be9bd37ffd9df344c"), "DESCRIBE",
         kIssued, DigestVerdict::kWrongResponse},
        {Header("orvex", "orvex", kNonce, kUri, ""), "DESCRIBE", kIssued,
         DigestVerdict::kWrongResponse},
        {Header("lion", "orvex", kNonce, kUri, kResponse), "DESCRIBE", kIssued,
         DigestVerdict::kUnknownUser},
        {Header("orvex", "Orvex", kNonce, kUri, kResponse), "DESCRIBE", kIssued,
         DigestVerdict::kWrongRealm},
        {Header("orvex", "orvex", kNonce, "rtsp://127.0.0.1/skyvo.1", kResponse), "DESCRIBE",
         kIssued, DigestVerdict::kWrongUri},
        {Header("orvex", "orvex", other_run, kUri, kResponse), "DESCRIBE", kIssued,
         DigestVerdict::kForeignNonce},
        {Header("orvex", "orvex", forged, kUri, kResponse), "DESCRIBE", kIssued,
         DigestVerdict::kForeignNonce},
        {Header("orvex", "orvex", "dcd98b7102dd2f0e8b11d0f600bfb0c093", kUri, kResponse),
         "DESCRIBE", kIssued, DigestVerdict::kForeignNonce},
        {"Basic b3J2ZXg6cHc=", "DESCRIBE", kIssued, DigestVerdict::kNotDigest},
        {"Digest username=\"orvex\"", "DESCRIBE", kIssued, DigestVerdict::kMalformed},
        // qop=auth as a client sends it after a challenge that offered it.
        {Header("orvex", "orvex", kNonce, std::string(kUri) + "/trackID=1",
                "b00077f8457f27af82d31de6d55c3e5f", ", qop=auth, nc=00000001, cnonce=\"abcdef\""),
         "SETUP", kIssued, DigestVerdict::kWrongUri},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(Check(c.header, c.method, c.now), c.verdict) << c.header << " at " << c.now;
    }
    EXPECT_EQ(gate.Check(nullptr, "DESCRIBE", kUri, kIssued, nullptr), DigestVerdict::kMissing);
    const std::string setup =
        Header("orvex", "orvex", kNonce, std::string(kUri) + "/trackID=1",
               "b00077f8457f27af82d31de6d55c3e5f", ", qop=auth, nc=00000001, cnonce=\"abcdef\"");
    EXPECT_EQ(gate.Check(&setup, "SETUP", std::string(kUri) + "/trackID=1", kIssued, nullptr),
              DigestVerdict::kOk);
}

}  // namespace
