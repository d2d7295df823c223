// The web viewer's stream: the ring its viewers share, the muxer that fills it from NAL units
// and AAC frames, and the HTTP answers.
#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "auth/AccessGate.h"
#include "auth/Digest.h"
#include "platform/fake/FakePlatform.h"
#include "rtsp/RtspAccess.h"
#include "rtsp/RtspResponse.h"
#include "stream/FrameTap.h"
#include "tests/web/HexBytes.h"
#include "web/ConnectionWarden.h"
#include "web/FragmentRing.h"
#include "web/LiveMuxer.h"
#include "web/WebViewer.h"

namespace {

using hexbytes::Bytes;
using hexbytes::Hex;
using hexbytes::Unhex;

Bytes Text(const std::string& s) { return Bytes(s.begin(), s.end()); }

// Everything a reader can take now.
Bytes Drain(FragmentRing& ring, FragmentRing::Reader& reader, const char** why = nullptr) {
    Bytes out;
    uint8_t chunk[7];  // small, so that fragments cross reads
    const char* reason = nullptr;
    for (;;) {
        long n = ring.Read(&reader, chunk, sizeof chunk, 0, &reason);
        if (n <= 0) break;
        out.insert(out.end(), chunk, chunk + n);
    }
    if (why != nullptr) *why = reason;
    return out;
}

TEST(FragmentRingTest, AViewerStartsAtTheLatestKeyFragmentAfterTheInitSegment) {
    FragmentRing ring(1024);
    const Bytes init = Text("INIT");
    ring.Restart(init.data(), init.size(), "video/mp4");
    FragmentRing::Reader reader;
    std::string type;
    EXPECT_FALSE(ring.WaitForStart(&reader, &type, 0)) << "no key fragment yet";
    const Bytes head = Text("h"), key1 = Text("KEY1"), delta = Text("d1"), key2 = Text("KEY2");
    ring.Append(head.data(), 1, key1.data(), key1.size(), true);
    ring.Append(head.data(), 1, delta.data(), delta.size(), false);
    ring.Append(head.data(), 1, key2.data(), key2.size(), true);
    ring.Append(head.data(), 1, delta.data(), delta.size(), false);
    ASSERT_TRUE(ring.WaitForStart(&reader, &type, 0));
    EXPECT_EQ(type, "video/mp4");
    EXPECT_EQ(Drain(ring, reader), Text("INIThKEY2hd1"));
    ring.Append(head.data(), 1, delta.data(), delta.size(), false);
    EXPECT_EQ(Drain(ring, reader), Text("hd1"));
    // Capture stopped: what is left is not a stream to start on.
    usleep(1100 * 1000);
    EXPECT_FALSE(ring.WaitForStart(&reader, &type, 0));
    ring.Append(head.data(), 1, key1.data(), key1.size(), true);
    ASSERT_TRUE(ring.WaitForStart(&reader, &type, 0));
    EXPECT_EQ(Drain(ring, reader), Text("INIThKEY1"));
    // A live stream whose key fragment is old: a newer one is waited for.
    usleep(400 * 1000);
    ring.Append(head.data(), 1, delta.data(), delta.size(), false);
    EXPECT_FALSE(ring.WaitForStart(&reader, &type, 0));
    ring.Append(head.data(), 1, key2.data(), key2.size(), true);
    ASSERT_TRUE(ring.WaitForStart(&reader, &type, 0));
    EXPECT_EQ(Drain(ring, reader), Text("INIThKEY2"));
}

TEST(FragmentRingTest, EndsAndSkipsAsTheWriterMovesOn) {
    const Bytes init = Text("I"), head = Text("h");
    const Bytes key = Bytes(40, 'K'), delta = Bytes(40, 'd'), big = Bytes(200, 'B');
    struct Case {
        const char* name;
        // Fragments written after the reader took its first `taken` bytes (init included).
        size_t taken;
        std::vector<std::pair<const Bytes*, bool>> then;
        bool restart;
        const char* ends;  // null: the reader goes on
        unsigned skips;
    } cases[] = {
        {"a quarter of the ring behind: on to the latest key",
         1 + 1 + 40,
         {{&delta, false},
          {&delta, false},
          {&delta, false},
          {&delta, false},
          {&delta, false},
          {&delta, false},
          {&key, true},
          {&delta, false}},
         false,
         nullptr,
         1},
        {"overtaken inside a fragment",
         1 + 5,
         {{&big, false}, {&big, false}, {&big, false}, {&big, false}, {&big, false}, {&big, false}},
         false,
         "it stopped reading in the middle of a fragment",
         0},
        {"a new stream", 1, {}, true, "the stream changed", 0},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        FragmentRing ring(1024);
        ring.Restart(init.data(), init.size(), "t");
        ring.Append(head.data(), 1, key.data(), key.size(), true);
        FragmentRing::Reader reader;
        std::string type;
        ASSERT_TRUE(ring.WaitForStart(&reader, &type, 0));
        Bytes first(c.taken);
        const char* why = nullptr;
        ASSERT_EQ(ring.Read(&reader, first.data(), 1, 0, &why), 1);  // the init segment
        if (c.taken > 1) {
            ASSERT_GT(ring.Read(&reader, first.data() + 1, c.taken - 1, 0, &why), 0);
        }
        for (const auto& piece : c.then) {
            ring.Append(head.data(), 1, piece.first->data(), piece.first->size(), piece.second);
        }
        if (c.restart) ring.Restart(init.data(), init.size(), "t");
        Bytes rest = Drain(ring, reader, &why);
        if (c.ends != nullptr) {
            EXPECT_STREQ(why, c.ends);
        } else {
            Bytes expected = head;
            expected.insert(expected.end(), key.begin(), key.end());
            expected.insert(expected.end(), head.begin(), head.end());
            expected.insert(expected.end(), delta.begin(), delta.end());
            EXPECT_EQ(rest, expected);
        }
        EXPECT_EQ(reader.skips, c.skips);
    }
}

TEST(FragmentRingTest, RefusesAFragmentOverAQuarterAndEndsEveryReaderOnStop) {
    FragmentRing ring(1024);
    const Bytes init = Text("I"), head = Text("h"), body(300, 'x');
    EXPECT_FALSE(ring.Append(head.data(), 1, body.data(), 100, true)) << "no stream yet";
    ring.Restart(init.data(), init.size(), "t");
    EXPECT_FALSE(ring.Append(head.data(), 1, body.data(), body.size(), true));
    EXPECT_TRUE(ring.Append(head.data(), 1, body.data(), 200, true));
    FragmentRing::Reader reader;
    std::string type;
    ASSERT_TRUE(ring.WaitForStart(&reader, &type, 0));
    ring.Stop();
    const char* why = nullptr;
    uint8_t b[8];
    EXPECT_EQ(ring.Read(&reader, b, sizeof b, 0, &why), -1);
    EXPECT_STREQ(why, "the service stops");
    EXPECT_FALSE(ring.WaitForStart(&reader, &type, 0));
}

// --- the muxer ---------------------------------------------------------------------------

const Bytes kSps = Unhex("6742c01e d900a03d b0110000 03000100 0003003c 0f162e48");      // 640x480
const Bytes kSps2 = Unhex("6742c01f d9005005 bb011000 00030010 000003 03c0f183 2480");  // 1280x720
const Bytes kPps = Unhex("68cb8cb2");

struct Fragment {
    uint32_t track;
    uint64_t decode_time;
    std::string payload;    // hex
    uint32_t duration = 0;  // read, not compared
    bool operator==(const Fragment& o) const {
        return track == o.track && decode_time == o.decode_time && payload == o.payload;
    }
};
std::ostream& operator<<(std::ostream& os, const Fragment& f) {
    return os << "{track " << f.track << ", time " << f.decode_time << ", " << f.payload << "}";
}

uint32_t Be32(const uint8_t* p) { return uint32_t{p[0]} << 24 | p[1] << 16 | p[2] << 8 | p[3]; }

// Box offset of `type` inside [p, p + n), searched in the nesting moof/traf.
const uint8_t* FindBox(const uint8_t* p, size_t n, const char* type) {
    for (size_t at = 0; at + 8 <= n;) {
        const uint32_t size = Be32(p + at);
        if (size < 8 || at + size > n) return nullptr;
        if (memcmp(p + at + 4, type, 4) == 0) return p + at;
        if (memcmp(p + at + 4, "traf", 4) == 0 || memcmp(p + at + 4, "moof", 4) == 0) {
            const uint8_t* inner = FindBox(p + at + 8, size - 8, type);
            if (inner != nullptr) return inner;
        }
        at += size;
    }
    return nullptr;
}

// Splits what a viewer received into its init segment's boxes and its fragments.
std::vector<Fragment> Fragments(const Bytes& bytes, Bytes* init = nullptr) {
    std::vector<Fragment> out;
    size_t at = 0;
    while (at + 8 <= bytes.size()) {
        const uint32_t size = Be32(&bytes[at]);
        if (size < 8 || at + size > bytes.size()) break;
        const std::string type(reinterpret_cast<const char*>(&bytes[at + 4]), 4);
        if (type == "moof") {
            const uint8_t* tfhd = FindBox(&bytes[at], size, "tfhd");
            const uint8_t* tfdt = FindBox(&bytes[at], size, "tfdt");
            const uint8_t* trun = FindBox(&bytes[at], size, "trun");
            const size_t mdat = at + size;
            if (tfhd == nullptr || tfdt == nullptr || trun == nullptr || mdat + 8 > bytes.size())
                break;
            const uint32_t mdat_size = Be32(&bytes[mdat]);
            if (mdat + mdat_size > bytes.size()) break;
            out.push_back({Be32(tfhd + 12), uint64_t{Be32(tfdt + 12)} << 32 | Be32(tfdt + 16),
                           Hex(&bytes[mdat + 8], mdat_size - 8), Be32(trun + 20)});
            at = mdat + mdat_size;
            continue;
        }
        if (init != nullptr)
            init->insert(init->end(), bytes.begin() + at, bytes.begin() + at + size);
        at += size;
    }
    return out;
}

struct Event {
    char kind;  // 'v': NAL unit (start code added), 'a': AAC frame
    const char* hex;
    uint32_t ms;
    std::vector<Fragment> sent;  // what a viewer can read once this event is in
};

void Play(const char* name, const std::vector<Event>& events) {
    SCOPED_TRACE(name);
    FragmentRing ring(1 << 16);
    LiveMuxer muxer(&ring);
    FragmentRing::Reader reader;
    bool started = false;
    Bytes pending;
    for (size_t i = 0; i < events.size(); ++i) {
        const Event& e = events[i];
        SCOPED_TRACE("event " + std::to_string(i));
        Bytes unit = Unhex(e.hex);
        if (e.kind == 'v') {
            unit.insert(unit.begin(), {0, 0, 0, 1});
            muxer.OnVideoFrame(unit.data(), unit.size(), e.ms);
        } else {
            muxer.OnAudioFrame(unit.data(), unit.size(), e.ms);
        }
        std::string type;
        if (!started) started = ring.WaitForStart(&reader, &type, 0);
        Bytes got = started ? Drain(ring, reader) : Bytes();
        std::vector<Fragment> expected = e.sent;
        for (Fragment& f : expected) {
            const Bytes payload = Unhex(f.payload);
            f.payload = Hex(payload.data(), payload.size());
        }
        EXPECT_EQ(Fragments(got), expected);
    }
}

// NAL units: an IDR and a P slice that begin their picture (first_mb_in_slice 0: the first
// bit after the header is 1), a P slice that continues one, SEI, delimiter, filler.
#define IDR "65 88 84 21"
#define IDR_2ND "65 08 84 21"
#define P "41 9a 00 11"
#define P_2ND "41 1a 22"
#define SEI "06 05 01 ff 80"
#define AUD "09 f0"
#define FILL "0c ff ff 80"
#define SPS "67 42 c0 1e d9 00 a0 3d b0 11 00 00 03 00 01 00 00 03 00 3c 0f 16 2e 48"
#define PPS "68 cb 8c b2"

TEST(LiveMuxerTest, PicturesBecomeOneFragmentEachWithTheirTimes) {
    // clang-format off
    Play("one slice a picture: sent at once as soon as that is known", {
        {'a', "21 00", 990, {}},
        {'v', SPS, 1000, {}},
        {'v', PPS, 1000, {}},
        {'v', SEI, 1000, {}},
        {'v', IDR, 1000, {}},
        {'v', AUD, 1033, {{1, 0, "00000005 060501ff80 00000004 65888421"}}},
        {'v', P, 1033, {}},  // the first P picture: its slice count is not known yet
        {'v', FILL, 1033, {}},
        {'a', "21 00 aa", 1040, {{2, 40 * 48, "2100aa"}}},
        {'a', "fff1 4c80 013f fc 21 01", 1061, {{2, 40 * 48 + 1024, "2101"}}},  // ADTS, raw out
        {'a', "fff0 4c80 013f fc 1234 21 05", 1082, {{2, 40 * 48 + 2048, "2105"}}},  // with CRC
        {'a', "21 02", 1500, {{2, 500 * 48, "2102"}}},  // a jump: the stamp again
        {'v', P, 1066, {{1, 33 * 90, "00000004 419a0011"}, {1, 66 * 90, "00000004 419a0011"}}},
        // Capture stops and starts again: the stream's time goes on without a gap.
        {'a', "21 03", 2500, {}},
        {'v', P, 3066, {{1, 99 * 90, "00000004 419a0011"}}},
        {'a', "21 04", 3070, {{2, 103 * 48, "2104"}}}});
    Play("two slices a picture: known from the first of its kind, sent at the second after that", {
        {'v', SPS, 0, {}},
        {'v', PPS, 0, {}},
        {'v', IDR, 0, {}},
        {'v', IDR_2ND, 0, {}},
        {'v', P, 33, {{1, 0, "00000004 65888421 00000004 65088421"}}},
        {'v', P_2ND, 33, {}},
        {'v', P, 66, {{1, 33 * 90, "00000004 419a0011 00000003 411a22"}}},
        {'v', P_2ND, 66, {{1, 66 * 90, "00000004 419a0011 00000003 411a22"}}},
        {'v', P, 100, {}}});
    Play("a key picture of two slices after pictures of one reaches the viewer whole", {
        {'v', SPS, 0, {}},
        {'v', PPS, 0, {}},
        {'v', IDR, 0, {}},
        {'v', IDR_2ND, 0, {}},
        {'v', P, 33, {{1, 0, "00000004 65888421 00000004 65088421"}}},
        {'v', P, 66, {{1, 33 * 90, "00000004 419a0011"}, {1, 66 * 90, "00000004 419a0011"}}},
        {'v', SPS, 100, {}},
        {'v', PPS, 100, {}},
        {'v', IDR, 100, {}},
        {'v', IDR_2ND, 100, {{1, 100 * 90, "00000004 65888421 00000004 65088421"}}},
        {'v', P, 133, {{1, 133 * 90, "00000004 419a0011"}}}});
    Play("a picture sent too soon: its rest is dropped and its kind waits for more slices", {
        {'v', SPS, 0, {}},
        {'v', PPS, 0, {}},
        {'v', IDR, 0, {}},
        {'v', P, 33, {{1, 0, "00000004 65888421"}}},
        {'v', P, 66, {{1, 33 * 90, "00000004 419a0011"}, {1, 66 * 90, "00000004 419a0011"}}},
        {'v', P_2ND, 66, {}},
        {'v', P, 100, {}},
        {'v', P, 133, {{1, 100 * 90, "00000004 419a0011"}}},
        {'v', P_2ND, 133, {{1, 133 * 90, "00000004 419a0011 00000003 411a22"}}}});
    Play("nothing before the first key frame, nor without parameter sets", {
        {'v', P, 0, {}},
        {'v', IDR, 33, {}},
        {'v', SPS, 66, {}},
        {'v', PPS, 66, {}},
        {'v', IDR, 66, {{1, 0, "00000004 65888421"}}},  // one slice a picture, learnt
        {'v', P, 100, {{1, 34 * 90, "00000004 419a0011"}}}});
    // clang-format on
}

// Arrival times as a loaded machine has them. A browser's MSE takes a step between two
// pictures of more than twice the last one's duration for a break, and drops every picture up
// to the next key frame: no step may look like that, and the time held back is made up.
TEST(LiveMuxerTest, JitteredArrivalsNeverLookLikeABreakToABrowser) {
    const struct {
        const char* name;
        std::vector<uint32_t> ms;  // when each one-slice picture arrives, the first a key
        unsigned caught_up_by;     // the picture from which the times are the arrivals again
    } cases[] = {
        {"steady", {0, 33, 66, 100, 133, 166, 200}, 0},
        {"a burst, then steady", {0, 33, 66, 70, 74, 78, 111, 144, 177}, 7},
        {"a stall, its pictures flushed, then steady",
         {0, 33, 66, 300, 301, 302, 303, 304, 333, 366, 400, 433, 466},
         5},
        {"pictures in one millisecond", {0, 33, 33, 33, 66, 100, 133}, 0},
        {"a long stall", {0, 33, 66, 900, 933, 966, 1000, 1033, 1066, 1100}, 6},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        FragmentRing ring(1 << 16);
        LiveMuxer muxer(&ring);
        auto feed = [&](const char* hex, uint32_t ms) {
            Bytes unit = Unhex(hex);
            unit.insert(unit.begin(), {0, 0, 0, 1});
            muxer.OnVideoFrame(unit.data(), unit.size(), ms);
        };
        feed(SPS, c.ms[0]), feed(PPS, c.ms[0]), feed(IDR, c.ms[0]);
        for (size_t i = 1; i < c.ms.size(); ++i) feed(P, c.ms[i]);
        feed(AUD, c.ms.back() + 33);  // the last picture ends
        FragmentRing::Reader reader;
        std::string type;
        ASSERT_TRUE(ring.WaitForStart(&reader, &type, 0));
        const std::vector<Fragment> sent = Fragments(Drain(ring, reader));
        ASSERT_EQ(sent.size(), c.ms.size());
        for (size_t i = 1; i < sent.size(); ++i) {
            SCOPED_TRACE("picture " + std::to_string(i));
            const uint64_t arrived = uint64_t{c.ms[i] - c.ms[0]} * 90;
            EXPECT_GT(sent[i].decode_time, sent[i - 1].decode_time);
            EXPECT_LE(sent[i].decode_time - sent[i - 1].decode_time,
                      2 * uint64_t{sent[i - 1].duration} - 1);
            if (c.ms[i] == c.ms[i - 1]) continue;  // a tick later than its arrival
            EXPECT_LE(sent[i].decode_time, arrived);
            if (i >= c.caught_up_by) {
                EXPECT_EQ(sent[i].decode_time, arrived);
            }
        }
    }
}

TEST(LiveMuxerTest, NewParameterSetsStartANewStreamWithTheirSize) {
    FragmentRing ring(1 << 16);
    LiveMuxer muxer(&ring);
    auto feed = [&](const Bytes& nal, uint32_t ms) {
        Bytes unit = nal;
        unit.insert(unit.begin(), {0, 0, 1});
        muxer.OnVideoFrame(unit.data(), unit.size(), ms);
    };
    const Bytes idr = Unhex(IDR), p = Unhex(P);
    feed(kSps, 0), feed(kPps, 0), feed(idr, 0), feed(p, 33);
    FragmentRing::Reader reader;
    std::string type;
    ASSERT_TRUE(ring.WaitForStart(&reader, &type, 0));
    EXPECT_EQ(type, "video/mp4; codecs=\"avc1.42c01e,mp4a.40.2\"");
    Drain(ring, reader);
    // The new stream's slice counts are learnt anew: its P picture waits for a delimiter.
    feed(kSps2, 66), feed(kPps, 66), feed(idr, 66), feed(p, 100), feed(Unhex(AUD), 133);
    const char* why = nullptr;
    Drain(ring, reader, &why);
    EXPECT_STREQ(why, "the stream changed");
    ASSERT_TRUE(ring.WaitForStart(&reader, &type, 0));
    EXPECT_EQ(type, "video/mp4; codecs=\"avc1.42c01f,mp4a.40.2\"");
    Bytes init;
    std::vector<Fragment> sent = Fragments(Drain(ring, reader), &init);
    ASSERT_EQ(sent.size(), 2u);
    EXPECT_EQ(sent[0].decode_time, 0u) << "the new stream's time begins at its first picture";
    const std::string init_hex = Hex(init.data(), init.size());
    EXPECT_NE(init_hex.find(Hex(kSps2.data(), kSps2.size())), std::string::npos);
    EXPECT_NE(init_hex.find("0500000002d00000"), std::string::npos) << "1280x720 in tkhd";
    EXPECT_EQ(muxer.restarts(), 2u);
}

// --- HTTP ----------------------------------------------------------------------------------

// One request on a new connection; the answer as far as it came within `ms`.
std::string Ask(unsigned port, const std::string& request, int ms = 2000, size_t enough = 1 << 20) {
    int fd = socket(AF_INET, SOCK_STREAM, 0);
    sockaddr_in to{};
    to.sin_family = AF_INET;
    to.sin_port = htons(static_cast<uint16_t>(port));
    to.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    std::string answer;
    if (connect(fd, reinterpret_cast<sockaddr*>(&to), sizeof to) == 0 &&
        send(fd, request.data(), request.size(), MSG_NOSIGNAL) ==
            static_cast<ssize_t>(request.size())) {
        const auto until = std::chrono::steady_clock::now() + std::chrono::milliseconds(ms);
        char buf[4096];
        while (answer.size() < enough) {
            const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(
                until - std::chrono::steady_clock::now());
            pollfd p{fd, POLLIN, 0};
            if (left.count() <= 0 || poll(&p, 1, static_cast<int>(left.count())) != 1) break;
            ssize_t n = recv(fd, buf, sizeof buf, 0);
            if (n <= 0) break;
            answer.append(buf, static_cast<size_t>(n));
        }
    }
    close(fd);
    return answer;
}

std::string Header(const std::string& answer, const std::string& name) {
    const size_t at = answer.find("\r\n" + name + ": ");
    if (at == std::string::npos) return "";
    const size_t from = at + name.size() + 4;
    return answer.substr(from, answer.find("\r\n", from) - from);
}

// Which connections the warden closes, step by step: ids are the fds, addresses one digit.
TEST(ConnectionWardenTest, TheCrowdGivesWayAndLateRequestsEnd) {
    std::vector<int> closed;
    ConnectionWarden warden({3, 1000}, [&closed](int fd) { closed.push_back(fd); });
    auto id = [](int fd) { return reinterpret_cast<const void*>(static_cast<intptr_t>(fd)); };
    enum Op { kOpen, kAnswering, kAnswered, kClose, kSweep };
    const struct {
        Op op;
        int fd;
        uint32_t address;
        uint64_t now;
        std::vector<int> closes;  // what this step closes
    } steps[] = {
        {kOpen, 10, 1, 0, {}},
        {kOpen, 11, 2, 100, {}},
        {kOpen, 12, 2, 200, {}},
        {kAnswering, 10, 0, 0, {}},  // a viewer being answered is out of reach
        {kOpen, 13, 3, 300, {}},
        // One too many waiting: the busiest address (2) loses its oldest.
        {kOpen, 14, 3, 400, {11}},
        {kOpen, 15, 4, 500, {13}},  // now address 3 has the most
        {kClose, 11, 0, 0, {}},
        {kClose, 12, 0, 0, {}},
        {kSweep, 0, 0, 1299, {}},
        // Waited a second for a request: 14 goes (13 is already closing); the viewer stays.
        {kSweep, 0, 0, 1400, {14}},
        {kAnswered, 10, 0, 1400, {}},  // keep-alive: waits for its next request from now
        {kSweep, 0, 0, 2399, {15}},
        {kSweep, 0, 0, 2400, {10}},
        {kClose, 10, 0, 0, {}},
        {kClose, 13, 0, 0, {}},
        {kClose, 14, 0, 0, {}},
        {kClose, 15, 0, 0, {}},
        // Within one millisecond: an address's answered connection still waiting beside its
        // next one goes first, never the one that just came.
        {kOpen, 20, 5, 3000, {}},
        {kOpen, 21, 6, 3000, {}},
        {kOpen, 22, 7, 3000, {}},
        {kOpen, 23, 7, 3000, {22}},
        {kOpen, 24, 7, 3000, {23}},
    };
    for (const auto& s : steps) {
        closed.clear();
        switch (s.op) {
            case kOpen:
                EXPECT_EQ(warden.Opened(id(s.fd), s.fd, s.address, s.now), !s.closes.empty());
                break;
            case kAnswering:
                warden.Answering(id(s.fd));
                break;
            case kAnswered:
                warden.Answered(id(s.fd), s.now);
                break;
            case kClose:
                warden.Closed(id(s.fd));
                break;
            case kSweep:
                EXPECT_EQ(warden.Sweep(s.now), static_cast<int>(s.closes.size()));
                break;
        }
        EXPECT_EQ(closed, s.closes) << "step with fd " << s.fd << " at " << s.now;
    }
}

class WebViewerTest : public ::testing::Test {
protected:
    void StartViewer(int max_viewers = 16, auth::AccessGate* gate = nullptr,
                     WebViewer::Options options = {}) {
        options.port = 0;
        options.max_viewers = max_viewers;
        options.start_wait_ms = 300;
        options.ring_bytes = 1 << 20;
        viewer_ = std::make_unique<WebViewer>(nullptr, gate, options);
        ASSERT_TRUE(viewer_->Start());
    }
    void FeedPictures(int count) {
        const Bytes idr = Unhex(IDR), p = Unhex(P);
        for (const Bytes* nal : {&kSps, &kPps}) {
            Bytes unit = *nal;
            unit.insert(unit.begin(), {0, 0, 0, 1});
            TapVideoFrame(unit.data(), unit.size());
        }
        for (int i = 0; i < count; ++i) {
            Bytes unit = i == 0 ? idr : p;
            unit.insert(unit.begin(), {0, 0, 0, 1});
            TapVideoFrame(unit.data(), unit.size());
            const uint8_t aac[] = {0x21, 0x00};
            TapAudioFrame(aac, sizeof aac, 0);
        }
    }
    platform::fake::FakePlatform fake_;
    std::unique_ptr<WebViewer> viewer_;
};

TEST_F(WebViewerTest, AnswersByPathAndMethod) {
    StartViewer();
    struct Case {
        const char* request;
        const char* status;
        const char* content_type;
        const char* says = "";
    } cases[] = {
        {"GET / HTTP/1.1\r\nHost: t\r\n\r\n", "HTTP/1.1 200", "text/html; charset=utf-8"},
        {"GET /index.html?x=1 HTTP/1.1\r\nHost: t\r\n\r\n", "HTTP/1.1 200",
         "text/html; charset=utf-8"},
        {"HEAD / HTTP/1.1\r\nHost: t\r\n\r\n", "HTTP/1.1 200", "text/html; charset=utf-8"},
        {"GET /nope HTTP/1.1\r\nHost: t\r\n\r\n", "HTTP/1.1 404", "text/plain; charset=utf-8"},
        {"POST / HTTP/1.1\r\nHost: t\r\nContent-Length: 3\r\n\r\nabc", "HTTP/1.1 405",
         "text/plain; charset=utf-8"},
        {"GET /stream.mp4 HTTP/1.1\r\nHost: t\r\n\r\n", "HTTP/1.1 503", "text/plain; charset=utf-8",
         "No picture within 0 s"},
        // A size the capture refuses is named at once, with the sizes it takes.
        {"GET /stream.mp4?width=1000&height=700 HTTP/1.1\r\nHost: t\r\n\r\n", "HTTP/1.1 400",
         "text/plain; charset=utf-8",
         "The capture does not take 1000x700; accepted sizes (width= and height= in the "
         "address): 640x480, 720x576, 320x240, 480x320, 1280x720, 720x480, 720x400, 320x176, "
         "640x368, 1920x1080.\n"},
        {"GARBAGE\r\n\r\n", nullptr, nullptr},  // 400, or just the connection closed
        // RFC 9112 §3.2: an HTTP/1.1 request names one host, before anything else is judged.
        {"GET / HTTP/1.1\r\n\r\n", "HTTP/1.1 400", "text/plain; charset=utf-8", "Host"},
        {"GET / HTTP/1.1\r\nHost: t\r\nhost: u\r\n\r\n", "HTTP/1.1 400",
         "text/plain; charset=utf-8", "Host"},
        {"GET / HTTP/1.0\r\n\r\n", "HTTP/1.1 200", "text/html; charset=utf-8"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.request);
        std::string answer = Ask(viewer_->port(), c.request);
        if (c.status == nullptr) {
            EXPECT_TRUE(answer.empty() || answer.compare(0, 10, "HTTP/1.1 4") == 0) << answer;
            continue;
        }
        EXPECT_EQ(answer.compare(0, strlen(c.status), c.status), 0) << answer.substr(0, 80);
        if (c.content_type != nullptr) {
            EXPECT_EQ(Header(answer, "Content-Type"), c.content_type);
        }
        EXPECT_NE(answer.find(c.says), std::string::npos) << answer;
    }
}

TEST_F(WebViewerTest, StreamsTheInitSegmentThenFragmentsAndRefusesOneViewerTooMany) {
    StartViewer(1);
    FeedPictures(3);
    const std::string request = "GET /stream.mp4?width=640&height=480 HTTP/1.1\r\nHost: t\r\n\r\n";
    std::string first = Ask(viewer_->port(), request, 500);
    ASSERT_EQ(first.compare(0, 12, "HTTP/1.1 200"), 0) << first.substr(0, 80);
    EXPECT_EQ(Header(first, "Content-Type"), "video/mp4; codecs=\"avc1.42c01e,mp4a.40.2\"");
    EXPECT_EQ(Header(first, "Transfer-Encoding"), "chunked");
    EXPECT_NE(first.find("ftypisom"), std::string::npos);
    EXPECT_NE(first.find("moof"), std::string::npos);
    // The connection above is closed; hold one open and ask again.
    int fd = socket(AF_INET, SOCK_STREAM, 0);
    sockaddr_in to{};
    to.sin_family = AF_INET;
    to.sin_port = htons(static_cast<uint16_t>(viewer_->port()));
    to.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    ASSERT_EQ(connect(fd, reinterpret_cast<sockaddr*>(&to), sizeof to), 0);
    ASSERT_GT(send(fd, request.data(), request.size(), MSG_NOSIGNAL), 0);
    for (int i = 0; i < 200 && viewer_->viewers() < 1; ++i) usleep(10000);
    EXPECT_EQ(viewer_->viewers(), 1);
    std::string second = Ask(viewer_->port(), request, 1000);
    EXPECT_EQ(second.compare(0, 12, "HTTP/1.1 503"), 0) << second.substr(0, 80);
    close(fd);
    // Its thread finds the connection gone when it next sends: pictures keep coming.
    for (int i = 0; i < 300 && viewer_->viewers() > 0; ++i) {
        FeedPictures(1);
        usleep(10000);
    }
    EXPECT_EQ(viewer_->viewers(), 0) << "a viewer that left gives its place back";
}

TEST_F(WebViewerTest, WithUsersEveryPathNeedsADigestAnswer) {
    char path[] = "/tmp/orvex-web-users-XXXXXX";
    int fd = mkstemp(path);
    ASSERT_GE(fd, 0);
    const std::string line = "orvex:orvex:" + auth::DigestHa1("orvex", "orvex", "secret") + "\n";
    ASSERT_EQ(write(fd, line.data(), line.size()), static_cast<ssize_t>(line.size()));
    close(fd);
    fake_.properties.Set("kv.orvex.auth", path);
    WebViewer::Options options;
    options.auth_file = config::ReadSettings(fake_.properties).auth_file;
    StartViewer(16, nullptr, options);
    std::string challenge = Ask(viewer_->port(), "GET /?a=1 HTTP/1.1\r\nHost: t\r\n\r\n");
    ASSERT_EQ(challenge.compare(0, 12, "HTTP/1.1 401"), 0) << challenge.substr(0, 80);
    const std::string www = Header(challenge, "WWW-Authenticate");
    const size_t n = www.find("nonce=\"");
    ASSERT_NE(n, std::string::npos) << www;
    auth::DigestFields fields;
    fields.username = "orvex";
    fields.realm = "orvex";
    fields.nonce = www.substr(n + 7, www.find('"', n + 7) - n - 7);
    fields.uri = "/?a=1";
    struct Case {
        const char* password;
        const char* uri;
        const char* status;
    } cases[] = {
        {"secret", "/?a=1", "HTTP/1.1 200"},
        {"wrong", "/?a=1", "HTTP/1.1 401"},
        {"secret", "/other", "HTTP/1.1 401"},  // an answer for another URL
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(std::string(c.password) + " " + c.uri);
        fields.uri = c.uri;
        const std::string ha1 = auth::DigestHa1("orvex", "orvex", c.password);
        const std::string response = auth::DigestExpectedResponse(ha1, "GET", fields);
        const std::string request =
            "GET /?a=1 HTTP/1.1\r\nHost: t\r\nAuthorization: Digest username=\"orvex\", "
            "realm=\"orvex\", "
            "nonce=\"" +
            fields.nonce + "\", uri=\"" + c.uri + "\", response=\"" + response + "\"\r\n\r\n";
        std::string answer = Ask(viewer_->port(), request);
        EXPECT_EQ(answer.compare(0, 12, c.status), 0) << answer.substr(0, 80);
    }
    unlink(path);
    unlink((std::string(path) + ".nonce-key").c_str());
}

// A connection from `source` (a loopback address) to the viewer, or -1.
int ConnectFrom(const char* source, unsigned port) {
    int fd = socket(AF_INET, SOCK_STREAM, 0);
    sockaddr_in from{};
    from.sin_family = AF_INET;
    inet_pton(AF_INET, source, &from.sin_addr);
    sockaddr_in to{};
    to.sin_family = AF_INET;
    to.sin_port = htons(static_cast<uint16_t>(port));
    to.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    if (bind(fd, reinterpret_cast<sockaddr*>(&from), sizeof from) != 0 ||
        connect(fd, reinterpret_cast<sockaddr*>(&to), sizeof to) != 0) {
        close(fd);
        return -1;
    }
    return fd;
}

TEST_F(WebViewerTest, IdleAndTricklingConnectionsGiveWayToAViewer) {
    WebViewer::Options options;
    options.waiting_max = 4;
    options.request_deadline_ms = 400;
    StartViewer(16, nullptr, options);
    std::vector<int> crowd;
    for (const char* source : {"127.0.0.2", "127.0.0.3", "127.0.0.4", "127.0.0.5"}) {
        for (int i = 0; i < 3; ++i) crowd.push_back(ConnectFrom(source, viewer_->port()));
    }
    std::string answer =
        Ask(viewer_->port(), "GET / HTTP/1.1\r\nHost: t\r\nConnection: close\r\n\r\n", 1000);
    EXPECT_EQ(answer.compare(0, 12, "HTTP/1.1 200"), 0)
        << "a crowd of idle connections kept the page away";
    // A byte every 50 ms keeps each under any idle timeout, never finishing its request. The
    // head whole and the body late is as unfinished as a late head: a POST is judged only once
    // its body is in, so without the deadline it holds a connection with no credentials.
    const struct {
        const char* name;
        std::string head;  // sent at once
        char trickled;     // then one of these every 50 ms
    } slow[] = {
        {"headers trickled", "GET / HTTP/1.1\r\nHost: t\r\nX-Slow: ", 's'},
        {"a promised body trickled",
         "POST /whep HTTP/1.1\r\nHost: t\r\nContent-Type: application/sdp\r\n"
         "Content-Length: 60000\r\n\r\nv=0\r\n",
         'o'},
    };
    for (const auto& c : slow) {
        const int trickler = ConnectFrom("127.0.0.6", viewer_->port());
        ASSERT_GE(trickler, 0);
        const auto began = std::chrono::steady_clock::now();
        bool ended = send(trickler, c.head.data(), c.head.size(), MSG_NOSIGNAL) !=
                     static_cast<ssize_t>(c.head.size());
        for (int i = 0; i < 40 && !ended; ++i) {
            ended = send(trickler, &c.trickled, 1, MSG_NOSIGNAL) != 1;
            pollfd p{trickler, POLLIN, 0};
            char byte;
            if (!ended && poll(&p, 1, 50) == 1) ended = recv(trickler, &byte, 1, 0) <= 0;
        }
        const auto took = std::chrono::duration_cast<std::chrono::milliseconds>(
            std::chrono::steady_clock::now() - began);
        EXPECT_TRUE(ended) << c.name << ": kept open for " << took.count() << " ms";
        close(trickler);
    }
    for (int fd : crowd) close(fd);
}

// An HTTP request with a Digest answer for `password` to the nonce of `challenge`.
std::string AnsweredGet(const std::string& challenge, const char* password) {
    const std::string www = Header(challenge, "WWW-Authenticate");
    const size_t n = www.find("nonce=\"");
    auth::DigestFields fields;
    fields.username = "orvex";
    fields.realm = "orvex";
    fields.nonce = n == std::string::npos ? "" : www.substr(n + 7, 48);
    fields.uri = "/";
    const std::string response =
        auth::DigestExpectedResponse(auth::DigestHa1("orvex", "orvex", password), "GET", fields);
    return "GET / HTTP/1.1\r\nHost: t\r\nConnection: close\r\nAuthorization: Digest "
           "username=\"orvex\", realm=\"orvex\", nonce=\"" +
           fields.nonce + "\", uri=\"/\", response=\"" + response + "\"\r\n\r\n";
}

TEST_F(WebViewerTest, OneLockoutForRtspAndHttpAnsweredWithRetryAfter) {
    char path[] = "/tmp/orvex-web-users-XXXXXX";
    int fd = mkstemp(path);
    ASSERT_GE(fd, 0);
    const std::string line = "orvex:orvex:" + auth::DigestHa1("orvex", "orvex", "secret") + "\n";
    ASSERT_EQ(write(fd, line.data(), line.size()), static_cast<ssize_t>(line.size()));
    close(fd);
    const uint32_t loopback = 0x7f000001;
    const std::string bare = "GET / HTTP/1.1\r\nHost: t\r\nConnection: close\r\n\r\n";
    for (bool rtsp_first : {true, false}) {
        SCOPED_TRACE(rtsp_first ? "RTSP guesses, then HTTP" : "HTTP guesses, then RTSP");
        auth::AccessGate gate;  // the listener's, shared with the web viewer
        gate.Configure("", path);
        StartViewer(16, &gate);
        const std::string challenge = Ask(viewer_->port(), bare);
        ASSERT_EQ(challenge.compare(0, 12, "HTTP/1.1 401"), 0) << challenge.substr(0, 80);
        EXPECT_NE(challenge.find("~/.config/orvex/play-url"), std::string::npos)
            << "the 401 page says where the password is";
        const std::vector<std::string> wrong_rtsp = {
            "DESCRIBE rtsp://127.0.0.1/skyvo.0 RTSP/1.0", "CSeq: 2",
            "Authorization: Digest username=\"orvex\", realm=\"orvex\", nonce=\"" +
                gate.Judge({"DESCRIBE", "x", nullptr, false, false, loopback, "127.0.0.1"})
                    .challenge.substr(29, 48) +
                "\", uri=\"rtsp://127.0.0.1/skyvo.0\", "
                "response=\"0123456789abcdef0123456789abcdef\""};
        for (int i = 0; i < 10; ++i) {
            if (rtsp_first) {
                JudgeRtspRequest(gate, wrong_rtsp, kRtspDescribe, loopback, "127.0.0.1");
            } else {
                const std::string answer = Ask(viewer_->port(), AnsweredGet(challenge, "guess"));
                EXPECT_EQ(answer.compare(0, 12, i < 9 ? "HTTP/1.1 401" : "HTTP/1.1 429"), 0)
                    << i << answer.substr(0, 80);
            }
        }
        if (rtsp_first) {
            // Even the right password gets the same answer while the lock lasts.
            const std::string answer = Ask(viewer_->port(), AnsweredGet(challenge, "secret"));
            ASSERT_EQ(answer.compare(0, 12, "HTTP/1.1 429"), 0) << answer.substr(0, 80);
            EXPECT_EQ(Header(answer, "Retry-After"), "60");
            EXPECT_EQ(Header(answer, "WWW-Authenticate"), "");
        } else {
            const auth::AccessDecision d =
                JudgeRtspRequest(gate, wrong_rtsp, kRtspOptions, loopback, "127.0.0.1");
            EXPECT_EQ(d.answer, auth::AccessAnswer::kLockedOut);
            EXPECT_EQ(d.retry_after_s, 60u);
        }
        viewer_.reset();
    }
    unlink(path);
    unlink((std::string(path) + ".nonce-key").c_str());
}

}  // namespace

// --- WHEP ----------------------------------------------------------------------------------

// Records the offers it is given; answers 201 unless the offer says "refuse".
class RecordingWhep final : public WhepEndpoint {
public:
    Reply Offer(OfferRequest request) override {
        offers.push_back(request.sdp + "|" + request.query);
        if (request.sdp == "refuse") return {400, "The offer cannot be answered: no H.264\n", ""};
        ends.push_back(std::move(request.end));
        return {201, "v=0 answer", "/whep/s" + std::to_string(ends.size())};
    }
    bool End(const std::string& id) override { return id == "s1"; }
    std::vector<std::string> offers;
    std::vector<std::function<void()>> ends;
};

std::string Post(const char* path, const char* type, const std::string& body) {
    return std::string("POST ") + path +
           " HTTP/1.1\r\nHost: t\r\nConnection: close\r\nContent-Type: " + type +
           "\r\nContent-Length: " + std::to_string(body.size()) + "\r\n\r\n" + body;
}

TEST_F(WebViewerTest, OffersWebRtcAtWhepAndCountsItsSessionsAmongTheViewers) {
    RecordingWhep whep;
    WebViewer::Options options;
    options.port = 0;
    options.max_viewers = 2;
    viewer_ = std::make_unique<WebViewer>(nullptr, nullptr, options, &whep);
    ASSERT_TRUE(viewer_->Start());
    struct Case {
        std::string request;
        const char* status;
        const char* header;  // "Name: value" that the answer carries
        const char* says;
    } cases[] = {
        {Post("/whep?width=1280&height=720", "application/sdp", "v=0 offer"), "HTTP/1.1 201",
         "Location: /whep/s1", "v=0 answer"},
        {Post("/whep", "application/sdp", "refuse"), "HTTP/1.1 400", "", "no H.264"},
        {Post("/whep", "text/plain", "v=0"), "HTTP/1.1 415", "", "application/sdp"},
        {"GET /whep HTTP/1.1\r\nHost: t\r\nConnection: close\r\n\r\n", "HTTP/1.1 405",
         "Allow: POST", ""},
        {"PATCH /whep/s1 HTTP/1.1\r\nHost: t\r\nConnection: close\r\nContent-Length: 0\r\n\r\n",
         "HTTP/1.1 405", "Allow: DELETE", ""},
        {"DELETE /whep/s1 HTTP/1.1\r\nHost: t\r\nConnection: close\r\n\r\n", "HTTP/1.1 200", "",
         ""},
        {"DELETE /whep/s9 HTTP/1.1\r\nHost: t\r\nConnection: close\r\n\r\n", "HTTP/1.1 404", "",
         "No such session"},
        {"DELETE /whepx HTTP/1.1\r\nHost: t\r\nConnection: close\r\n\r\n", "HTTP/1.1 405",
         "Allow: GET, HEAD", ""},
        {Post("/whep", "application/sdp", std::string(70 * 1024, 'v')), "HTTP/1.1 413", "", ""},
        // The session answered first still counts, so one more fits and the next does not.
        {Post("/whep", "application/sdp", "v=0 second"), "HTTP/1.1 201", "Location: /whep/s2", ""},
        {Post("/whep", "application/sdp", "v=0 third"), "HTTP/1.1 503", "", "Too many viewers"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.request.substr(0, 40));
        const std::string answer = Ask(viewer_->port(), c.request);
        EXPECT_EQ(answer.compare(0, strlen(c.status), c.status), 0) << answer.substr(0, 80);
        if (c.header[0] != '\0') {
            const std::string header = c.header;
            const size_t colon = header.find(": ");
            EXPECT_EQ(Header(answer, header.substr(0, colon)), header.substr(colon + 2));
        }
        EXPECT_NE(answer.find(c.says), std::string::npos) << answer;
    }
    EXPECT_EQ(whep.offers, (std::vector<std::string>{"v=0 offer|?width=1280&height=720", "refuse|",
                                                     "v=0 second|"}))
        << "the third is refused before it reaches the endpoint";
    EXPECT_EQ(viewer_->viewers(), 2);
    for (auto& end : whep.ends) end();  // the sessions end: their places are free again
    EXPECT_EQ(viewer_->viewers(), 0);
}
