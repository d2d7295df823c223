// What the gate makes of its access properties and of RTSP requests: files that cannot be used
// fail closed, the users file is read again when it changes, and the lockout and nonces are
// judged on an injected clock.
#include <gtest/gtest.h>
#include <stdio.h>
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

using auth::AccessAnswer;
using Decision = auth::AccessDecision;
constexpr const char* kUrl = "rtsp://10.0.0.1/skyvo.0";

class RtspAccessTest : public ::testing::Test {
protected:
    RtspAccessTest() : access([this] { return now; }) {}
    ~RtspAccessTest() override {
        for (const std::string& f : files) {
            unlink(f.c_str());
            unlink((f + ".nonce-key").c_str());
        }
    }
    // Replaces a file's text as tools/orvex-passwd does: a new file renamed over the old.
    static void Rewrite(const std::string& path, const std::string& text) {
        const std::string next = path + ".next";
        FILE* f = fopen(next.c_str(), "w");
        fputs(text.c_str(), f);
        fclose(f);
        rename(next.c_str(), path.c_str());
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
    Decision Ask(const char* from, const std::string& authorization = "",
                 const char* method = "DESCRIBE", int code = kRtspDescribe) {
        std::vector<std::string> lines = {std::string(method) + " " + kUrl + " RTSP/1.0",
                                          "CSeq: 2"};
        if (!authorization.empty()) lines.push_back(authorization);
        return JudgeRtspRequest(access, lines, code, Ip(from), from);
    }
    Decision Describe(const char* from, const std::string& authorization = "") {
        return Ask(from, authorization);
    }
    // A right or wrong answer to the nonce of a challenge given now to `from`; with `nc`, in
    // the qop=auth form.
    std::string Answer(const char* password, const char* from = "10.0.0.9", const char* nc = "",
                       const char* user = "orvex") {
        Decision d = Describe(from);
        size_t at = d.challenge.find("nonce=\"");
        auth::DigestFields f;
        f.username = user;
        f.realm = "orvex";
        f.nonce = d.challenge.substr(at + 7, 48);
        f.uri = kUrl;
        std::string qop;
        if (*nc != '\0') {
            f.qop = "auth";
            f.nc = nc;
            f.cnonce = "0a4f113b";
            qop = std::string(", qop=auth, nc=") + nc + ", cnonce=\"0a4f113b\"";
        }
        std::string response =
            auth::DigestExpectedResponse(auth::DigestHa1(user, "orvex", password), "DESCRIBE", f);
        return "Authorization: Digest username=\"" + std::string(user) +
               "\", realm=\"orvex\", nonce=\"" + f.nonce + "\", uri=\"" + kUrl + "\", response=\"" +
               response + "\"" + qop;
    }

    platform::fake::FakePlatform fake;
    uint64_t now = 1000000;
    auth::AccessGate access;
    std::vector<std::string> files;
};

TEST_F(RtspAccessTest, UnusableSettingsLetNobodyIn) {
    const std::string good = "orvex:orvex:2f5dc0319c3279451ae1c1d7fd646060\n";
    const struct {
        std::string allow, auth;
        bool admitted;
        AccessAnswer answer;
        std::vector<std::string> log;
    } cases[] = {
        {"", "", true, AccessAnswer::kServe, {}},
        {"10.0.0.0/8", "", true, AccessAnswer::kServe, {}},
        {"192.168.0.0/16",
         "",
         false,
         AccessAnswer::kServe,
         {"10.0.0.1 is not in kv.orvex.allow: connection reset"}},
        {"10.0.0.0/8,10.0.0.300",
         "",
         false,
         AccessAnswer::kServe,
         {"kv.orvex.allow: \"10.0.0.300\" is not an IPv4 address or CIDR; no connection is "
          "accepted",
          "10.0.0.1 is not in kv.orvex.allow: connection reset"}},
        {"",
         "/nonexistent/users",
         true,
         AccessAnswer::kUnavailable,
         {"kv.orvex.auth: cannot read the credentials file /nonexistent/users; every request is "
          "refused"}},
        {"",
         "@" + good + "lion:orvex:xyz\n",
         true,
         AccessAnswer::kUnavailable,
         {"kv.orvex.auth: @ line 2 is not user:realm:md5-hex (htdigest); every request is "
          "refused"}},
        {"",
         "@# nobody yet\n",
         true,
         AccessAnswer::kUnavailable,
         {"kv.orvex.auth: @ line 1 is not user:realm:md5-hex (htdigest); every request is "
          "refused"}},
        {"", "@" + good, true, AccessAnswer::kChallenge, {"Digest authentication on"}},
        // An allow-list alone asks for no password.
        {"10.0.0.1", "", true, AccessAnswer::kServe, {}},
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

TEST_F(RtspAccessTest, ALockedOutAddressIsToldSoUntilTheMinuteEnds) {
    access.Configure("", File("orvex:orvex:2f5dc0319c3279451ae1c1d7fd646060\n"));
    const std::string wrong = Answer("guess", "10.0.0.2");
    const std::string right = Answer("pw", "10.0.0.2");
    for (int i = 1; i < 10; ++i) {
        Decision d = Describe("10.0.0.2", wrong);
        EXPECT_EQ(d.answer, AccessAnswer::kChallenge);
        EXPECT_FALSE(d.close) << i;
        now += 500;
    }
    fake.log.Clear();
    Decision tenth = Describe("10.0.0.2", wrong);
    EXPECT_EQ(tenth.answer, AccessAnswer::kLockedOut);
    EXPECT_TRUE(tenth.close);
    EXPECT_EQ(tenth.retry_after_s, 60u);
    EXPECT_EQ(tenth.reason, "wrong password (user \"orvex\")");
    EXPECT_EQ(fake.log.Texts("orvex:::access"),
              (std::vector<std::string>{
                  "10.0.0.2: 10 failed answers within a minute; it is refused for a minute"}));
    // Let in to be told, whatever it sends, OPTIONS and the right password too.
    EXPECT_TRUE(access.AdmitConnection(Ip("10.0.0.2"), "10.0.0.2"));
    now += 20500;
    for (const Decision& d :
         {Describe("10.0.0.2", right), Ask("10.0.0.2", "", "OPTIONS", kRtspOptions)}) {
        EXPECT_EQ(d.answer, AccessAnswer::kLockedOut);
        EXPECT_EQ(d.retry_after_s, 40u);
        EXPECT_TRUE(d.challenge.empty()) << "no new challenge: nothing to tell a guesser";
    }
    EXPECT_EQ(Describe("10.0.0.3", Answer("pw", "10.0.0.3")).answer, AccessAnswer::kServe);
    now += 39499;
    EXPECT_EQ(Describe("10.0.0.2").answer, AccessAnswer::kLockedOut);
    EXPECT_EQ(Describe("10.0.0.2").retry_after_s, 1u);
    now += 1;
    EXPECT_EQ(Describe("10.0.0.2", right).answer, AccessAnswer::kServe);
}

TEST_F(RtspAccessTest, NoncesGoStaleWithoutCountingAndCountedAnswersAreNotReplayed) {
    const std::string users = File("orvex:orvex:2f5dc0319c3279451ae1c1d7fd646060\n");
    access.Configure("", users);
    const std::string old = Answer("pw", "10.0.0.4");
    const std::string elsewhere = Answer("pw", "10.0.0.9");
    // One answer seen on the wire is no use from another address: stale, so the real client
    // retries unasked, and nothing counts towards a lockout.
    for (int i = 0; i < 12; ++i) {
        Decision d = Describe("10.0.0.4", elsewhere);
        EXPECT_EQ(d.answer, AccessAnswer::kChallenge);
        EXPECT_NE(d.challenge.find(", stale=TRUE"), std::string::npos) << d.challenge;
    }
    EXPECT_EQ(Describe("10.0.0.4", old).answer, AccessAnswer::kServe);
    // A restart keeps the nonce key beside the users file: the nonce is still good.
    {
        auth::AccessGate restarted([this] { return now; });
        restarted.Configure("", users);
        std::vector<std::string> lines = {std::string("DESCRIBE ") + kUrl + " RTSP/1.0", old};
        EXPECT_EQ(
            JudgeRtspRequest(restarted, lines, kRtspDescribe, Ip("10.0.0.4"), "10.0.0.4").answer,
            AccessAnswer::kServe);
    }
    now += auth::DigestGate::kNonceLifetimeMs;
    for (int i = 0; i < 12; ++i) {
        Decision d = Describe("10.0.0.4", old);
        EXPECT_EQ(d.answer, AccessAnswer::kChallenge);
        EXPECT_NE(d.challenge.find(", stale=TRUE"), std::string::npos) << d.challenge;
        EXPECT_FALSE(d.close);
    }
    // With qop=auth each nonce count is good once.
    const std::string first = Answer("pw", "10.0.0.5", "00000001");
    EXPECT_EQ(Describe("10.0.0.5", first).answer, AccessAnswer::kServe);
    Decision again = Describe("10.0.0.5", first);
    EXPECT_EQ(again.answer, AccessAnswer::kChallenge);
    EXPECT_EQ(again.reason, "nonce count used before (a replayed answer) (user \"orvex\")");
    // Two clients at one address (two tabs, a page's parallel requests, two curls) challenged
    // in the same millisecond each count from 1, on a nonce of their own.
    const std::string tab1 = Answer("pw", "10.0.0.7", "00000001");
    const std::string tab2 = Answer("pw", "10.0.0.7", "00000001");
    EXPECT_EQ(Describe("10.0.0.7", tab1).answer, AccessAnswer::kServe);
    EXPECT_EQ(Describe("10.0.0.7", tab2).answer, AccessAnswer::kServe);
    // Two Authorization headers are a malformed request; OPTIONS needs none.
    std::vector<std::string> twice = {std::string("DESCRIBE ") + kUrl + " RTSP/1.0", old, old};
    EXPECT_EQ(JudgeRtspRequest(access, twice, kRtspDescribe, Ip("10.0.0.4"), "10.0.0.4").answer,
              AccessAnswer::kBadRequest);
    EXPECT_EQ(JudgeRtspRequest(access, twice, kRtspOptions, Ip("10.0.0.4"), "10.0.0.4").answer,
              AccessAnswer::kServe);
}

TEST_F(RtspAccessTest, AChangedUsersFileCountsFromTheNextRequestOn) {
    const std::string users =
        File("orvex:orvex:" + auth::DigestHa1("orvex", "orvex", "pw") +
             "\nlion:orvex:" + auth::DigestHa1("lion", "orvex", "roar") + "\n");
    access.Configure("", users);
    EXPECT_EQ(Describe("10.0.0.6", Answer("pw", "10.0.0.6")).answer, AccessAnswer::kServe);
    EXPECT_EQ(Describe("10.0.0.6", Answer("roar", "10.0.0.6", "", "lion")).answer,
              AccessAnswer::kServe);
    // orvex's password changes and lion goes, as tools/orvex-passwd and an editor would.
    Rewrite(users, "orvex:orvex:" + auth::DigestHa1("orvex", "orvex", "new") + "\n");
    fake.log.Clear();
    now += auth::AccessGate::kRecheckMs;
    struct {
        const char* password;
        const char* user;
        AccessAnswer answer;
        const char* reason;
    } cases[] = {
        {"new", "orvex", AccessAnswer::kServe, ""},
        {"pw", "orvex", AccessAnswer::kChallenge,
         "a password that has been changed (user \"orvex\")"},
        {"roar", "lion", AccessAnswer::kChallenge,
         "a password that has been changed (user \"lion\")"},
    };
    for (const auto& c : cases) {
        Decision d = Describe("10.0.0.6", Answer(c.password, "10.0.0.6", "", c.user));
        EXPECT_EQ(d.answer, c.answer) << c.user;
        EXPECT_EQ(d.reason, c.reason);
    }
    EXPECT_EQ(fake.log.Texts("orvex:::access"),
              (std::vector<std::string>{users + " changed: 1 user(s) may watch"}));
    // The old password is refused but never locks its client out: it was right until now.
    for (int i = 0; i < 12; ++i) {
        EXPECT_EQ(Describe("10.0.0.6", Answer("pw", "10.0.0.6")).answer, AccessAnswer::kChallenge);
    }
    // A file that breaks closes the door until it is mended.
    const std::string right = Answer("new", "10.0.0.6");
    Rewrite(users, "orvex:orvex:not-hex\n");
    now += auth::AccessGate::kRecheckMs;
    EXPECT_EQ(Describe("10.0.0.6", right).answer, AccessAnswer::kUnavailable);
    Rewrite(users, "orvex:orvex:" + auth::DigestHa1("orvex", "orvex", "new") + "\n");
    now += auth::AccessGate::kRecheckMs;
    EXPECT_EQ(Describe("10.0.0.6", right).answer, AccessAnswer::kServe);
}

}  // namespace
