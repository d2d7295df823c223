// The publisher: which URLs it takes, what reaches a media server's session (access units,
// sound, times), what its queue drops when a server is slow, and how it reconnects and stops.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "platform/fake/FakePlatform.h"
#include "publish/PublishQueue.h"
#include "publish/PublishUrl.h"
#include "publish/Publisher.h"

namespace {

using Bytes = std::vector<uint8_t>;
using platform::fake::FakePublish;

Bytes Unhex(const std::string& hex) {
    Bytes out;
    for (size_t i = 0; i + 1 < hex.size(); i += 2)
        out.push_back(static_cast<uint8_t>(std::stoi(hex.substr(i, 2), nullptr, 16)));
    return out;
}

// What the host's encoder gives at 1280x720 (taken from its stream).
const Bytes kSps = Unhex("6742c01f8c8d402802dd3506060607844235");
const Bytes kPps = Unhex("68ce3c80");
// Slices: an IDR and a P picture's first slice (first_mb_in_slice 0), a P picture's second
// slice (first_mb_in_slice 1: bits 010).
const Bytes kIdr = Unhex("6588841100aa");
const Bytes kP = Unhex("419a2233");
const Bytes kPSecond = Unhex("41402244");
const Bytes kIdrSecond = Unhex("65422011aa");  // first_mb_in_slice 1
const Bytes kAac = Unhex("21100540");

Bytes AnnexB(std::initializer_list<Bytes> nals) {
    Bytes out;
    for (const Bytes& nal : nals) {
        out.insert(out.end(), {0, 0, 0, 1});
        out.insert(out.end(), nal.begin(), nal.end());
    }
    return out;
}

Bytes Adts(const Bytes& raw) {
    Bytes out = {0xFF, 0xF1, 0x4C, 0x80, 0x00, 0x1F, 0xFC};
    out.insert(out.end(), raw.begin(), raw.end());
    return out;
}

void Video(Publisher& p, const Bytes& unit, uint32_t ms) {
    p.OnVideoFrame(unit.data(), unit.size(), ms);
}
void Audio(Publisher& p, const Bytes& frame, uint32_t ms) {
    p.OnAudioFrame(frame.data(), frame.size(), ms);
}
// A key picture as the recorder hands it over: one NAL unit per call.
void KeyPicture(Publisher& p, uint32_t ms) {
    Video(p, AnnexB({kSps}), ms);
    Video(p, AnnexB({kPps}), ms);
    Video(p, AnnexB({kIdr}), ms);
}

Publisher::Options Fast() {
    Publisher::Options o;
    o.first_backoff_ms = 10;
    o.max_backoff_ms = 40;
    return o;
}

std::vector<PublishUrl> One(const std::string& text = "rtmp://127.0.0.1/live/tv") {
    PublishUrl url;
    std::string why;
    EXPECT_TRUE(ParsePublishUrl(text, &url, &why)) << why;
    return {url};
}

int Count(const std::vector<std::string>& lines, const std::string& part) {
    int n = 0;
    for (const std::string& line : lines) n += line.find(part) != std::string::npos;
    return n;
}

TEST(PublishUrl, AcceptsServersAndNamesWhatIsWrong) {
    struct Case {
        const char* text;
        const char* scheme;  // null: refused
        const char* host;
        int port;
        const char* container;
    };
    const Case cases[] = {
        {"rtmp://127.0.0.1/live/tv", "rtmp", "127.0.0.1", 0, "flv"},
        {"RTMP://media.example/app/key?token=1", "rtmp", "media.example", 0, "flv"},
        {"rtmp://127.0.0.1:1936/live/a/b", "rtmp", "127.0.0.1", 1936, "flv"},
        {"rtmp://[::1]:1935/live/tv", "rtmp", "::1", 1935, "flv"},
        {"srt://127.0.0.1:9000", "srt", "127.0.0.1", 9000, "mpegts"},
        {"srt://127.0.0.1:9000?streamid=publish:tv&latency=200000", "srt", "127.0.0.1", 9000,
         "mpegts"},
        {"http://127.0.0.1/live/tv", nullptr, nullptr, 0, nullptr},
        {"rtmp:/127.0.0.1/live/tv", nullptr, nullptr, 0, nullptr},
        {"127.0.0.1:1935", nullptr, nullptr, 0, nullptr},
        {"rtmp:///live/tv", nullptr, nullptr, 0, nullptr},
        {"rtmp://127.0.0.1", nullptr, nullptr, 0, nullptr},
        {"rtmp://127.0.0.1/live", nullptr, nullptr, 0, nullptr},
        {"rtmp://127.0.0.1/live/", nullptr, nullptr, 0, nullptr},
        {"rtmp://127.0.0.1//tv", nullptr, nullptr, 0, nullptr},
        {"rtmp://127.0.0.1:/live/tv", nullptr, nullptr, 0, nullptr},
        {"rtmp://127.0.0.1:0/live/tv", nullptr, nullptr, 0, nullptr},
        {"rtmp://127.0.0.1:65536/live/tv", nullptr, nullptr, 0, nullptr},
        {"rtmp://127.0.0.1:99999999999/live/tv", nullptr, nullptr, 0, nullptr},
        {"rtmp://user:pw@127.0.0.1/live/tv", nullptr, nullptr, 0, nullptr},
        {"rtmp://[::1/live/tv", nullptr, nullptr, 0, nullptr},
        {"rtmp://a b/live/tv", nullptr, nullptr, 0, nullptr},
        {"rtmp://h\x01/live/tv", nullptr, nullptr, 0, nullptr},
        {"srt://127.0.0.1", nullptr, nullptr, 0, nullptr},
        {"srt://:9000", nullptr, nullptr, 0, nullptr},
    };
    for (const Case& c : cases) {
        PublishUrl url;
        std::string why;
        const bool ok = ParsePublishUrl(c.text, &url, &why);
        EXPECT_EQ(ok, c.scheme != nullptr) << c.text << ": " << why;
        if (!ok) {
            EXPECT_FALSE(why.empty()) << c.text;
            continue;
        }
        EXPECT_EQ(url.url, c.text);
        EXPECT_EQ(url.scheme, c.scheme) << c.text;
        EXPECT_EQ(url.host, c.host) << c.text;
        EXPECT_EQ(url.port, c.port) << c.text;
        EXPECT_EQ(url.container, c.container) << c.text;
    }
    PublishUrl url;
    std::string why;
    EXPECT_FALSE(ParsePublishUrl("rtmp://h/a/" + std::string(1100, 'k'), &url, &why));
    EXPECT_EQ(SplitPublishList("  rtmp://a/b/c \t srt://h:1  "),
              (std::vector<std::string>{"rtmp://a/b/c", "srt://h:1"}));
    EXPECT_TRUE(SplitPublishList(" \t ").empty());
}

TEST(PublishBackoff, DoublesFromOneSecondUpToThirty) {
    const int expected[] = {1000, 2000, 4000, 8000, 16000, 30000, 30000};
    int backoff = 0;
    for (int e : expected) {
        backoff = NextBackoffMs(backoff, 1000, 30000);
        EXPECT_EQ(backoff, e);
    }
}

// The queue keeps what fits in its bytes and its time span; after a frame it could not keep,
// nothing but a key frame is taken.
TEST(PublishQueue, DropsUpToTheNextKeyFrame) {
    using Kind = PublishQueue::Kind;
    struct Push {
        Kind kind;
        bool key;
        uint32_t ms;
        size_t len;
        bool kept;
    };
    // 12-byte headers: 400 bytes hold 200 + 12 and 100 + 12, not another 100 + 12.
    const Push pushes[] = {
        {Kind::kVideo, true, 0, 200, true},    {Kind::kVideo, false, 33, 100, true},
        {Kind::kVideo, false, 66, 100, false},  // full
        {Kind::kAudio, false, 70, 4, false},    // would fit, but the pictures are broken
        {Kind::kVideo, false, 99, 4, false},    // likewise
        {Kind::kVideo, true, 132, 40, true},    // a key frame that fits ends the dropping
        {Kind::kVideo, false, 3000, 4, false},  // more than 2 s after the oldest
        {Kind::kVideo, true, 3033, 4, false},   // still: the oldest has not gone
    };
    PublishQueue queue(400, 2000);
    Bytes payload(400, 7);
    for (const Push& p : pushes) {
        EXPECT_EQ(queue.Push(p.kind, p.key, p.ms, payload.data(), p.len), p.kept) << p.ms;
    }
    Bytes out;
    PublishQueue::Frame frame;
    unsigned dropped = 0, dropped_total = 0;
    std::vector<uint32_t> times;
    std::vector<size_t> sizes;
    while (queue.Pop(&frame, &out, 0, &dropped)) {
        times.push_back(frame.time_ms);
        sizes.push_back(frame.len);
        dropped_total += dropped;
    }
    EXPECT_EQ(times, (std::vector<uint32_t>{0, 33, 132}));
    EXPECT_EQ(sizes, (std::vector<size_t>{200, 100, 40}));
    EXPECT_EQ(dropped_total, 5u);
    // Emptied, it takes frames again until stopped.
    EXPECT_TRUE(queue.Push(Kind::kVideo, true, 4000, payload.data(), 8));
    queue.Stop();
    EXPECT_FALSE(queue.Pop(&frame, &out, 1000, &dropped));
    EXPECT_FALSE(queue.Push(Kind::kVideo, true, 4033, payload.data(), 8));
}

class PublisherTest : public ::testing::Test {
protected:
    platform::fake::FakePlatform fake;
    FakePublish& server = fake.publish;

    std::vector<FakePublish::Write> WaitForWrites(size_t n) {
        EXPECT_TRUE(server.WaitFor(5000, [n](FakePublish& s) { return s.writes_locked() >= n; }))
            << "only " << server.writes().size() << " of " << n << " writes";
        return server.writes();
    }
};

// Access units as the session gets them: parameter sets travel with their picture, a picture
// of two slices is one unit (however the recorder split its calls), sound loses its ADTS
// header, and all times count from the first key picture.
TEST_F(PublisherTest, SessionGetsAccessUnitsAndTimesFromTheFirstKeyPicture) {
    Publisher publisher(nullptr, One(), Fast());
    publisher.Start();
    // Before any parameter sets: never sent, but they teach the gatherer that key and P
    // pictures have one slice, so the key picture at 1000 goes without waiting for the next.
    Video(publisher, AnnexB({kIdr}), 870);
    Video(publisher, AnnexB({kP}), 900);  // before any key picture: never sent
    Audio(publisher, Adts(kAac), 950);
    KeyPicture(publisher, 1000);
    Audio(publisher, Adts(kAac), 990);  // before the origin
    Audio(publisher, Adts(kAac), 1010);
    Video(publisher, AnnexB({kP, kPSecond}), 1033);  // one call, two slices
    Video(publisher, AnnexB({kP}), 1066);
    Video(publisher, AnnexB({kPSecond}), 1066);
    Video(publisher, AnnexB({Unhex("0910"), kSps}), 1100);  // AUD: the last picture is done
    KeyPicture(publisher, 1100);
    Video(publisher, AnnexB({kP}), 1133);  // a later picture ends the key picture
    // Capture restarts at another size: a new stream, its times from its own first picture.
    const Bytes other_sps = Unhex("6742c01e8c8d40501e");
    Video(publisher, AnnexB({other_sps, kPps, kIdr}), 1200);
    Video(publisher, AnnexB({kP}), 1233);
    ASSERT_TRUE(server.WaitFor(5000, [](FakePublish& s) { return s.sessions_locked() == 2; }));
    const auto writes = WaitForWrites(7);
    publisher.Stop();

    const auto opened = server.opened();
    ASSERT_EQ(opened.size(), 2u);
    EXPECT_EQ(opened[1].sps, other_sps);
    EXPECT_EQ(writes[6].session, 2);
    EXPECT_EQ(writes[6].pts_ms, 0);
    EXPECT_TRUE(writes[6].key);
    EXPECT_EQ(opened[0].url, "rtmp://127.0.0.1/live/tv");
    EXPECT_EQ(opened[0].container, "flv");
    EXPECT_EQ(opened[0].sps, kSps);
    EXPECT_EQ(opened[0].pps, kPps);
    EXPECT_EQ(opened[0].width, 1280);
    EXPECT_EQ(opened[0].height, 720);
    EXPECT_EQ(opened[0].audio_config, (Bytes{0x11, 0x90}));

    struct Expected {
        bool video;
        bool key;
        int64_t pts;
        Bytes data;
    };
    const Expected expected[] = {
        {true, true, 0, AnnexB({kSps, kPps, kIdr})},
        {false, false, 10, kAac},
        {true, false, 33, AnnexB({kP, kPSecond})},
        {true, false, 66, AnnexB({kP, kPSecond})},
        {true, true, 100, AnnexB({Unhex("0910"), kSps, kSps, kPps, kIdr})},
    };
    ASSERT_GE(writes.size(), 5u);
    for (size_t i = 0; i < 5; ++i) {
        SCOPED_TRACE(i);
        EXPECT_EQ(writes[i].video, expected[i].video);
        EXPECT_EQ(writes[i].key, expected[i].key);
        EXPECT_EQ(writes[i].pts_ms, expected[i].pts);
        EXPECT_EQ(writes[i].data, expected[i].data);
    }
}

// An encoder may cut its key pictures into more slices than the others: each reaches the
// session whole, and none of the pictures after it is dropped.
TEST_F(PublisherTest, KeyPicturesOfMoreSlicesThanTheOthersGoWhole) {
    Publisher publisher(nullptr, One(), Fast());
    publisher.Start();
    uint32_t ms = 1000;
    for (int group = 0; group < 3; ++group) {
        Video(publisher, AnnexB({kSps}), ms);
        Video(publisher, AnnexB({kPps}), ms);
        Video(publisher, AnnexB({kIdr}), ms);
        Video(publisher, AnnexB({kIdrSecond}), ms);
        for (int i = 0; i < 5; ++i) Video(publisher, AnnexB({kP}), ms += 33);
        ms += 33;
    }
    const auto writes = WaitForWrites(18);
    publisher.Stop();
    ASSERT_EQ(writes.size(), 18u);
    for (size_t i = 0; i < writes.size(); ++i) {
        SCOPED_TRACE(i);
        EXPECT_EQ(writes[i].key, i % 6 == 0);
        EXPECT_EQ(writes[i].pts_ms, static_cast<int64_t>(i * 33));
        EXPECT_EQ(writes[i].data,
                  i % 6 == 0 ? AnnexB({kSps, kPps, kIdr, kIdrSecond}) : AnnexB({kP}));
    }
}

// A stalled server fills the queue; what follows is dropped up to a key frame, said once, and
// the session goes on from that key frame.
TEST_F(PublisherTest, SlowServerLosesFramesUpToAKeyFrame) {
    Publisher::Options options = Fast();
    options.queue_bytes = 4096;
    Publisher publisher(nullptr, One(), options);
    publisher.Start();
    KeyPicture(publisher, 1000);
    Video(publisher, AnnexB({kP}), 1033);
    WaitForWrites(1);  // the session is open
    server.SetStall(true);
    const Bytes big(600, 0x41);
    Bytes picture = AnnexB({kP});
    picture.insert(picture.end(), big.begin(), big.end());
    for (uint32_t i = 2; i <= 21; ++i) Video(publisher, picture, 1000 + 33 * i);
    KeyPicture(publisher, 1700);
    Video(publisher, AnnexB({kP}), 1733);
    server.SetStall(false);
    EXPECT_TRUE(server.WaitFor(
        5000, [](FakePublish& s) { return s.writes_locked() > 0 && s.last_pts_locked() == 733; }));
    publisher.Stop();
    const auto all = server.writes();
    std::vector<int64_t> times;
    bool key_after_gap = false;
    for (size_t i = 1; i < all.size(); ++i) {
        times.push_back(all[i].pts_ms);
        if (all[i].pts_ms - all[i - 1].pts_ms > 33) key_after_gap = all[i].key;
    }
    EXPECT_LT(all.size(), 22u) << "nothing was dropped";
    EXPECT_TRUE(key_after_gap) << "after the gap the stream must go on from a key frame";
    EXPECT_EQ(Count(fake.log.Texts("orvex:::publish"), "too slowly"), 1);
}

// Refused connections are retried with growing pauses, said once; the first success after
// them is said once too; a lost connection starts a new session whose times begin at 0.
TEST_F(PublisherTest, ReconnectsAfterRefusalsAndALostConnection) {
    server.SetRefuse(true);
    Publisher publisher(nullptr, One(), Fast());
    publisher.Start();
    uint32_t ms = 1000;
    auto feed_until = [&](auto done) {
        for (int i = 0; i < 2000 && !done(); ++i) {
            KeyPicture(publisher, ms);
            ms += 33;
            server.WaitFor(2, [](FakePublish&) { return false; });
        }
    };
    feed_until([&] { return server.attempts() >= 4; });
    EXPECT_GE(server.attempts(), 4);
    server.SetRefuse(false);
    feed_until([&] { return server.writes().size() >= 2; });
    server.DropConnection();
    feed_until([&] {
        for (const auto& w : server.writes()) {
            if (w.session == 2) return true;
        }
        return false;
    });
    publisher.Stop();

    const auto log = fake.log.Texts("orvex:::publish");
    EXPECT_EQ(Count(log, "connection refused; trying again in 10 ms"), 1);
    EXPECT_EQ(Count(log, "the connection was lost; trying again in 10 ms"), 1);
    EXPECT_EQ(Count(log, "publishing again after"), 2);
    const auto writes = server.writes();
    int64_t first_of_second = -1;
    for (const auto& w : writes) {
        if (w.session == 2 && first_of_second < 0) first_of_second = w.pts_ms;
    }
    EXPECT_EQ(first_of_second, 0);
}

// Stop ends a thread that waits on a stalled server and lets go of the tap.
TEST_F(PublisherTest, StopEndsAStalledWrite) {
    Publisher publisher(nullptr, One("srt://127.0.0.1:9000"), Fast());
    publisher.Start();
    server.SetStall(true);
    KeyPicture(publisher, 1000);
    Video(publisher, AnnexB({kP}), 1033);
    ASSERT_TRUE(server.WaitFor(5000, [](FakePublish& s) { return s.sessions_locked() == 1; }));
    publisher.Stop();
    EXPECT_EQ(server.opened()[0].container, "mpegts");
    EXPECT_TRUE(AddFrameSink(&publisher));  // the tap no longer holds it
    RemoveFrameSink(&publisher);
}

// The property: unset, nothing happens; a malformed URL is named once and the rest still run.
TEST_F(PublisherTest, PropertyNamesTheServers) {
    StartPublishing(config::ReadSettings(fake.properties), nullptr);
    StopPublishing();
    EXPECT_EQ(server.attempts(), 0);
    EXPECT_TRUE(fake.log.Texts("orvex:::publish").empty());

    fake.properties.Set("kv.orvex.publish", "ftp://127.0.0.1/x rtmp://127.0.0.1/live/tv");
    StartPublishing(config::ReadSettings(fake.properties), nullptr);
    const Bytes sps = AnnexB({kSps}), pps = AnnexB({kPps}), idr = AnnexB({kIdr});
    for (int i = 0; i < 3; ++i) {
        TapVideoFrame(sps.data(), sps.size());
        TapVideoFrame(pps.data(), pps.size());
        TapVideoFrame(idr.data(), idr.size());
    }
    EXPECT_TRUE(server.WaitFor(5000, [](FakePublish& s) { return s.sessions_locked() == 1; }));
    StopPublishing();
    const auto log = fake.log.Texts("orvex:::publish");
    EXPECT_EQ(Count(log, "\"ftp://127.0.0.1/x\" is not an rtmp:// or srt:// URL"), 1);
    EXPECT_EQ(server.opened().at(0).url, "rtmp://127.0.0.1/live/tv");
}

}  // namespace
