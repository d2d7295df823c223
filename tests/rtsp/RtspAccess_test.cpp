// What the listener makes of its access properties: files that cannot be used fail closed, and
// the lockout is judged on an injected clock.
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>
#include <string>
#include <vector>

#include "auth/AddressRules.h"
#include "auth/Digest.h"
#include "platform/fake/FakePlatform.h"
#include "rtsp/RtspAccess.h"
#include "rtsp/RtspResponse.h"

namespace {

constexpr const char* kUrl = "rtsp://10.0.0.1/skyvo.0";

class RtspAccessTest : public ::testing::Test {
protected:
    RtspAccessTest() : access([this] { return now; }) {}
    ~RtspAccessTest() override {
        for (const std::string& f : files) unlink(f.c_str());
    }
    std::string File(const std::string& text) {
        std::string path = ::testing::TempDir() + "orvex-access-" + std::to_string(getpid()) + "-" +
                           std::to_string(files.size());
        FILE* f = fopen(path.c_str(), "w");
        fputs(text.c_str(), f);
        fclose(f);
        files.push_back(path);
        return path;
    }
    static uint32_t Ip(const char* text) {
        uint32_t a = 0;
        auth::ParseIpv4(text, &a);
        return a;
    }
    RtspAccess::Decision Describe(const char* from, const std::string& authorization = "") {
        std::vector<std::string> lines = {std::string("DESCRIBE ") + kUrl + " RTSP/1.0", "CSeq: 2"};
        if (!authorization.empty()) lines.push_back(authorization);
        return access.Judge(lines, kRtspDescribe, Ip(from), from);
    }
    // A right or wrong answer to the nonce of a challenge given now.
    std::string Answer(const char* password) {
        RtspAccess::Decision d = Describe("10.0.0.9");
        size_t at = d.header.find("nonce=\"");
        auth::DigestFields f;
        f.username = "orvex";
        f.realm = "orvex";
        f.nonce = d.header.substr(at + 7, 48);
        f.uri = kUrl;
        std::string response = auth::DigestExpectedResponse(
            auth::DigestHa1("orvex", "orvex", password), "DESCRIBE", f);
        return "Authorization: Digest username=\"orvex\", realm=\"orvex\", nonce=\"" + f.nonce +
               "\", uri=\"" + kUrl + "\", response=\"" + response + "\"";
    }

    platform::fake::FakePlatform fake;
    uint64_t now = 1000000;
    RtspAccess access;
    std::vector<std::string> files;
};

TEST_F(RtspAccessTest, UnusableSettingsLetNobodyIn) {
    const std::string good = "orvex:orvex:2f5dc0319c3279451ae1c1d7fd646060\n";
    const struct {
        std::string allow, auth;
        bool admitted;
        RtspAccess::Answer answer;
        std::vector<std::string> log;
    } cases[] = {
        {"", "", true, RtspAccess::Answer::kServe, {}},
        {"10.0.0.0/8", "", true, RtspAccess::Answer::kServe, {}},
        {"192.168.0.0/16",
         "",
         false,
         RtspAccess::Answer::kServe,
         {"10.0.0.1 is not in kv.orvex.allow: connection reset"}},
        {"10.0.0.0/8,10.0.0.300",
         "",
         false,
         RtspAccess::Answer::kServe,
         {"kv.orvex.allow: \"10.0.0.300\" is not an IPv4 address or CIDR; no connection is "
          "accepted",
          "10.0.0.1 is not in kv.orvex.allow: connection reset"}},
        {"",
         "/nonexistent/users",
         true,
         RtspAccess::Answer::kUnavailable,
         {"kv.orvex.auth: cannot read the credentials file /nonexistent/users; every request is "
          "refused"}},
        {"",
         "@" + good + "lion:orvex:xyz\n",
         true,
         RtspAccess::Answer::kUnavailable,
         {"kv.orvex.auth: @ line 2 is not user:realm:md5-hex (htdigest); every request is "
          "refused"}},
        {"",
         "@# nobody yet\n",
         true,
         RtspAccess::Answer::kUnavailable,
         {"kv.orvex.auth: @ line 1 is not user:realm:md5-hex (htdigest); every request is "
          "refused"}},
        {"", "@" + good, true, RtspAccess::Answer::kChallenge, {"Digest authentication on"}},
    };
    for (const auto& c : cases) {
        fake.log.Clear();
        std::string auth = c.auth;
        if (!auth.empty() && auth[0] == '@') auth = File(auth.substr(1));
        access.Configure(c.allow, auth);
        EXPECT_EQ(access.AdmitConnection(Ip("10.0.0.1"), "10.0.0.1"), c.admitted) << c.allow;
        EXPECT_EQ(Describe("10.0.0.1").answer, c.answer) << c.auth;
        std::vector<std::string> texts = fake.log.Texts("orvex:::access");
        ASSERT_EQ(texts.size(), c.log.size()) << c.allow << c.auth;
        for (size_t i = 0; i < texts.size(); ++i) {
            std::string expected = c.log[i];
            size_t at = expected.find('@');
            if (at != std::string::npos) expected.replace(at, 1, auth);
            EXPECT_EQ(texts[i].compare(0, expected.size(), expected), 0) << texts[i];
        }
    }
}

TEST_F(RtspAccessTest, TheLockoutEndsAfterAMinuteAndSparesOtherAddresses) {
    access.Configure("", File("orvex:orvex:2f5dc0319c3279451ae1c1d7fd646060\n"));
    const std::string wrong = Answer("guess");
    for (int i = 1; i < 10; ++i) {
        RtspAccess::Decision d = Describe("10.0.0.2", wrong);
        EXPECT_EQ(d.answer, RtspAccess::Answer::kChallenge);
        EXPECT_FALSE(d.close) << i;
        now += 500;
    }
    fake.log.Clear();
    RtspAccess::Decision tenth = Describe("10.0.0.2", wrong);
    EXPECT_TRUE(tenth.close);
    EXPECT_EQ(tenth.reason, "wrong password (user \"orvex\")");
    EXPECT_EQ(fake.log.Texts("orvex:::access"),
              (std::vector<std::string>{"10.0.0.2: 10 failed answers within a minute; its "
                                        "connections are refused for a minute"}));
    EXPECT_FALSE(access.AdmitConnection(Ip("10.0.0.2"), "10.0.0.2"));
    EXPECT_TRUE(access.AdmitConnection(Ip("10.0.0.3"), "10.0.0.3"));
    EXPECT_EQ(Describe("10.0.0.3", Answer("pw")).answer, RtspAccess::Answer::kServe);
    now += 59999;
    EXPECT_FALSE(access.AdmitConnection(Ip("10.0.0.2"), "10.0.0.2"));
    now += 1;
    EXPECT_TRUE(access.AdmitConnection(Ip("10.0.0.2"), "10.0.0.2"));
    EXPECT_EQ(Describe("10.0.0.2", Answer("pw")).answer, RtspAccess::Answer::kServe);
}

TEST_F(RtspAccessTest, StaleNoncesAreChallengedAgainWithoutCounting) {
    access.Configure("", File("orvex:orvex:2f5dc0319c3279451ae1c1d7fd646060\n"));
    const std::string old = Answer("pw");
    now += auth::DigestGate::kNonceLifetimeMs;
    for (int i = 0; i < 12; ++i) {
        RtspAccess::Decision d = Describe("10.0.0.4", old);
        EXPECT_EQ(d.answer, RtspAccess::Answer::kChallenge);
        EXPECT_NE(d.header.find(", stale=TRUE"), std::string::npos) << d.header;
        EXPECT_FALSE(d.close);
    }
    EXPECT_TRUE(access.AdmitConnection(Ip("10.0.0.4"), "10.0.0.4"));
    // Two Authorization headers are a malformed request.
    std::vector<std::string> twice = {std::string("DESCRIBE ") + kUrl + " RTSP/1.0", old, old};
    EXPECT_EQ(access.Judge(twice, kRtspDescribe, Ip("10.0.0.4"), "10.0.0.4").answer,
              RtspAccess::Answer::kBadRequest);
    EXPECT_EQ(access.Judge(twice, kRtspOptions, Ip("10.0.0.4"), "10.0.0.4").answer,
              RtspAccess::Answer::kServe);
}

}  // namespace
