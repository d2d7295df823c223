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
    DigestGateTest()
        : gate({{"orvex", "orvex", "2f5dc0319c3279451ae1c1d7fd646060"}}, "s3cret",
               {{"orvex", "orvex", "1b7a6d0b4b1d0a2e4c37f2a1e9a2b3c4"}}) {}

    static std::string Header(const std::string& user, const std::string& realm,
                              const std::string& nonce, const std::string& uri,
                              const std::string& response, const std::string& rest = "") {
        return "Digest username=\"" + user + "\", realm=\"" + realm + "\", nonce=\"" + nonce +
               "\", uri=\"" + uri + "\", response=\"" + response + "\"" + rest;
    }

    static constexpr uint64_t kIssued = 1000000;
    static constexpr uint32_t kHere = 0x7f000001;  // 127.0.0.1, whom the nonce was given to
    // "00000000000f4240" + HMAC-MD5("s3cret", "00000000000f4240/7f000001"), from Python's hmac.
    static constexpr const char* kNonce = "00000000000f42404e1adb9f17dfa435cbc3513ebe487133";
    static constexpr const char* kUri = "rtsp://127.0.0.1/skyvo.0";
    static constexpr const char* kResponse = "5f3ba233d45b5ceb3e0c24c5d890b4b5";
    static constexpr const char* kQopResponse = "b1e47ab389c04f06a6c9f3325d476e25";
    auth::DigestGate gate;
};

TEST_F(DigestGateTest, NoncesCarryTheirTimeAndAnHmacOfTimeAndAddress) {
    EXPECT_EQ(gate.MakeNonce(kIssued, 0, kHere), kNonce);
    EXPECT_NE(gate.MakeNonce(kIssued, 0, kHere + 1), kNonce);
    // The serial sits above the time: the same millisecond, another nonce.
    EXPECT_EQ(gate.MakeNonce(kIssued, 0xbeef, kHere).substr(0, 16), "beef0000000f4240");
    EXPECT_EQ(gate.Challenge(kIssued, 0, kHere, false),
              std::string("Digest realm=\"orvex\", nonce=\"") + kNonce + "\", qop=\"auth\"");
    EXPECT_EQ(
        gate.Challenge(kIssued, 0, kHere, true),
        std::string("Digest realm=\"orvex\", nonce=\"") + kNonce + "\", qop=\"auth\", stale=TRUE");
}

TEST_F(DigestGateTest, VerdictsOnAnswers) {
    const std::string other_secret =
        auth::DigestGate({}, "another secret").MakeNonce(kIssued, 0, kHere);
    std::string forged = kNonce;
    forged[0] = '1';  // a later time under the old HMAC
    std::string shouting = kNonce;
    shouting[20] = 'E';
    const std::string qop = ", qop=auth, nc=00000001, cnonce=\"abcdef\"";
    const std::string setup_uri = std::string(kUri) + "/trackID=1";
    // An answer with the password before its change.
    auth::DigestFields before{"orvex", "orvex", kNonce, kUri, "", "", "", "", "", ""};
    const std::string retired =
        auth::DigestExpectedResponse("1b7a6d0b4b1d0a2e4c37f2a1e9a2b3c4", "DESCRIBE", before);
    // An answer to a nonce with a serial: its time is read below the serial.
    auth::DigestFields serial_fields = before;
    serial_fields.nonce = gate.MakeNonce(kIssued, 0xffff, kHere);
    const std::string serial_response =
        auth::DigestExpectedResponse("2f5dc0319c3279451ae1c1d7fd646060", "DESCRIBE", serial_fields);
    const struct {
        std::string header;
        const char* method;
        std::string uri;
        uint64_t now;
        uint32_t from;
        DigestVerdict verdict;
    } cases[] = {
        {Header("orvex", "orvex", kNonce, kUri, kResponse), "DESCRIBE", kUri, kIssued, kHere,
         DigestVerdict::kOk},
        // Without qop nothing counts the answers: the same one is good while the nonce lives,
        // but only from the address the nonce was given to.
        {Header("orvex", "orvex", kNonce, kUri, kResponse), "DESCRIBE", kUri, kIssued + 299999,
         kHere, DigestVerdict::kOk},
        {Header("orvex", "orvex", kNonce, kUri, kResponse), "DESCRIBE", kUri, kIssued, 0x0a000005,
         DigestVerdict::kStale},
        {Header("orvex", "orvex", kNonce, kUri, kResponse), "DESCRIBE", kUri, kIssued + 300000,
         kHere, DigestVerdict::kStale},
        // Issued "later" than now: the clock began again, as after a reboot.
        {Header("orvex", "orvex", kNonce, kUri, kResponse), "DESCRIBE", kUri, kIssued - 1, kHere,
         DigestVerdict::kStale},
        {Header("orvex", "orvex", other_secret, kUri, kResponse), "DESCRIBE", kUri, kIssued, kHere,
         DigestVerdict::kStale},
        {Header("orvex", "orvex", serial_fields.nonce, kUri, serial_response), "DESCRIBE", kUri,
         kIssued + 299999, kHere, DigestVerdict::kOk},
        {Header("orvex", "orvex", serial_fields.nonce, kUri, serial_response), "DESCRIBE", kUri,
         kIssued + 300000, kHere, DigestVerdict::kStale},
        {Header("orvex", "orvex", serial_fields.nonce, kUri, serial_response), "DESCRIBE", kUri,
         kIssued - 1, kHere, DigestVerdict::kStale},
        {Header("orvex", "orvex", forged, kUri, kResponse), "DESCRIBE", kUri, kIssued, kHere,
         DigestVerdict::kStale},
        {Header("orvex", "orvex", shouting, kUri, kResponse), "DESCRIBE", kUri, kIssued, kHere,
         DigestVerdict::kForeignNonce},
        {Header("orvex", "orvex", "dcd98b7102dd2f0e8b11d0f600bfb0c093", kUri, kResponse),
         "DESCRIBE", kUri, kIssued, kHere, DigestVerdict::kForeignNonce},
        // The method enters the hash.
        {Header("orvex", "orvex", kNonce, kUri, kResponse), "PLAY", kUri, kIssued, kHere,
         DigestVerdict::kWrongResponse},
        {Header("orvex", "orvex", kNonce, kUri, "5f3ba233d45b5ceb3e0c24c5d890b4b6"), "DESCRIBE",
         kUri, kIssued, kHere, DigestVerdict::kWrongResponse},
        {Header("orvex", "orvex", kNonce, kUri, ""), "DESCRIBE", kUri, kIssued, kHere,
         DigestVerdict::kWrongResponse},
        {Header("orvex", "orvex", kNonce, kUri, retired), "DESCRIBE", kUri, kIssued, kHere,
         DigestVerdict::kRetiredPassword},
        {Header("lion", "orvex", kNonce, kUri, kResponse), "DESCRIBE", kUri, kIssued, kHere,
         DigestVerdict::kUnknownUser},
        {Header("orvex", "Orvex", kNonce, kUri, kResponse), "DESCRIBE", kUri, kIssued, kHere,
         DigestVerdict::kWrongRealm},
        {Header("orvex", "orvex", kNonce, "rtsp://127.0.0.1/skyvo.1", kResponse), "DESCRIBE", kUri,
         kIssued, kHere, DigestVerdict::kWrongUri},
        {"Basic b3J2ZXg6cHc=", "DESCRIBE", kUri, kIssued, kHere, DigestVerdict::kNotDigest},
        {"Digest username=\"orvex\"", "DESCRIBE", kUri, kIssued, kHere, DigestVerdict::kMalformed},
        // qop=auth as a client sends it after our challenge, and nonce counts that are not
        // eight hex digits or are zero.
        {Header("orvex", "orvex", kNonce, setup_uri, kQopResponse, qop), "SETUP", setup_uri,
         kIssued, kHere, DigestVerdict::kOk},
        {Header("orvex", "orvex", kNonce, setup_uri, kQopResponse, qop), "SETUP", kUri, kIssued,
         kHere, DigestVerdict::kWrongUri},
        {Header("orvex", "orvex", kNonce, setup_uri, kQopResponse,
                ", qop=auth, nc=1, cnonce=\"abcdef\""),
         "SETUP", setup_uri, kIssued, kHere, DigestVerdict::kMalformed},
        {Header("orvex", "orvex", kNonce, setup_uri, kQopResponse,
                ", qop=auth, nc=00000000, cnonce=\"abcdef\""),
         "SETUP", setup_uri, kIssued, kHere, DigestVerdict::kMalformed},
        {Header("orvex", "orvex", kNonce, setup_uri, kQopResponse,
                ", qop=auth, nc=0000000g, cnonce=\"abcdef\""),
         "SETUP", setup_uri, kIssued, kHere, DigestVerdict::kMalformed},
    };
    for (const auto& c : cases) {
        auth::DigestAnswer answer;
        EXPECT_EQ(gate.Check(&c.header, c.method, c.uri, c.now, c.from, &answer), c.verdict)
            << c.header << " at " << c.now;
    }
    EXPECT_EQ(gate.Check(nullptr, "DESCRIBE", kUri, kIssued, kHere, nullptr),
              DigestVerdict::kMissing);
    const std::string counted = Header("orvex", "orvex", kNonce, setup_uri, kQopResponse, qop);
    auth::DigestAnswer answer;
    ASSERT_EQ(gate.Check(&counted, "SETUP", setup_uri, kIssued, kHere, &answer),
              DigestVerdict::kOk);
    EXPECT_EQ(answer.user, "orvex");
    EXPECT_EQ(answer.nonce, kNonce);
    EXPECT_EQ(answer.nc, 1u);
}

TEST(NonceCountsTest, EachCountOnceWithinAWindowBelowTheHighest) {
    auth::NonceCounts counts;
    const struct {
        const char* nonce;
        uint32_t nc;
        bool taken;
    } steps[] = {
        {"a", 1, true},   {"a", 1, false},  // the same answer again: a replay
        {"a", 3, true},   {"a", 2, true},   // a browser's parallel requests, out of order
        {"a", 2, false},  {"a", 3, false},  {"b", 1, true},  // counts are per nonce
        {"a", 100, true}, {"a", 37, true},  // 63 below the highest: still in the window
        {"a", 36, false},                   // 64 below: too old to tell, refused
        {"a", 37, false}, {"a", 101, true},
    };
    for (const auto& s : steps) {
        EXPECT_EQ(counts.Take(s.nonce, s.nc), s.taken) << s.nonce << " " << s.nc;
    }
    // The book is bounded: the least recently used nonce makes room, the busy one stays.
    for (int i = 0; i < auth::NonceCounts::kTracked; ++i) {
        EXPECT_TRUE(counts.Take("n" + std::to_string(i), 1));
        EXPECT_FALSE(counts.Take("a", 101));
    }
    EXPECT_TRUE(counts.Take("b", 1)) << "evicted: its client starts a new entry";
}

}  // namespace
