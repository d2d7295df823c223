#include <dirent.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <mutex>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include "platform/host/BinderWire.h"
#include "platform/host/HostBinder.h"
#include "tools/AccessUnitSplitter.h"

namespace {

using platform::ParcelWriter;
using platform::host::HostBinder;
using Bytes = std::vector<uint8_t>;

struct Received {
    uint32_t code;
    uint32_t flags;
    Bytes data;
    bool operator==(const Received& o) const {
        return code == o.code && flags == o.flags && data == o.data;
    }
};

// Records every transaction; code 2 is one it does not handle.
class RecordingService : public platform::BinderService {
public:
    int onTransact(uint32_t code, platform::ParcelReader& data, uint32_t flags) override {
        size_t n = data.dataAvail();
        const uint8_t* at = data.readInplace(n);
        std::lock_guard<std::mutex> hold(mutex_);
        got_.push_back({code, flags, Bytes(at, at + n)});
        return code == 2 ? platform::kBinderUnknownTransaction : platform::kBinderOk;
    }
    std::vector<Received> Take() {
        std::lock_guard<std::mutex> hold(mutex_);
        return std::move(got_);
    }

private:
    std::mutex mutex_;
    std::vector<Received> got_;
};

Bytes Le32(uint32_t v) { return {uint8_t(v), uint8_t(v >> 8), uint8_t(v >> 16), uint8_t(v >> 24)}; }

Bytes Cat(std::initializer_list<Bytes> parts) {
    Bytes out;
    for (const Bytes& p : parts) out.insert(out.end(), p.begin(), p.end());
    return out;
}

int ConnectRaw(const std::string& path) {
    int fd = socket(AF_UNIX, SOCK_STREAM, 0);
    sockaddr_un addr{};
    addr.sun_family = AF_UNIX;
    snprintf(addr.sun_path, sizeof addr.sun_path, "%s", path.c_str());
    if (connect(fd, reinterpret_cast<sockaddr*>(&addr), sizeof addr) != 0) {
        close(fd);
        return -1;
    }
    timeval tv{30, 0};  // a service that never answers fails the test instead of hanging it
    setsockopt(fd, SOL_SOCKET, SO_RCVTIMEO, &tv, sizeof tv);
    return fd;
}

// Writes `bytes` on a new connection (then hangs up if asked) and reads the statuses until
// the service closes the connection.
std::vector<int32_t> RawExchange(const std::string& path, const Bytes& bytes, bool hang_up) {
    int fd = ConnectRaw(path);
    EXPECT_GE(fd, 0);
    EXPECT_EQ(send(fd, bytes.data(), bytes.size(), MSG_NOSIGNAL), ssize_t(bytes.size()));
    if (hang_up) shutdown(fd, SHUT_WR);
    Bytes in;
    uint8_t buf[64];
    ssize_t n;
    while ((n = recv(fd, buf, sizeof buf, 0)) > 0) in.insert(in.end(), buf, buf + n);
    EXPECT_EQ(n, 0) << "the service neither answered nor closed";
    close(fd);
    std::vector<int32_t> statuses;
    for (size_t i = 0; i + 4 <= in.size(); i += 4) {
        statuses.push_back(int32_t(in[i] | in[i + 1] << 8 | in[i + 2] << 16 | in[i + 3] << 24));
    }
    return statuses;
}

// Each test gets its own ORVEX_BINDER_DIR.
class HostBinderTest : public ::testing::Test {
protected:
    void SetUp() override {
        dir_ = ::testing::TempDir() + "orvex_binder_" + std::to_string(getpid()) + "_" +
               ::testing::UnitTest::GetInstance()->current_test_info()->name();
        setenv("ORVEX_BINDER_DIR", dir_.c_str(), 1);
    }
    void TearDown() override {
        if (DIR* d = opendir(dir_.c_str())) {
            while (dirent* e = readdir(d)) unlink((dir_ + "/" + e->d_name).c_str());
            closedir(d);
        }
        rmdir(dir_.c_str());
        unsetenv("ORVEX_BINDER_DIR");
    }
    std::string Path(const char* name) const { return dir_ + "/" + name; }

    std::string dir_;
};

TEST_F(HostBinderTest, TransactionsArriveWithTheirCodeAndBytes) {
    auto service = std::make_shared<RecordingService>();
    HostBinder server;
    ASSERT_EQ(server.addService("orvex.rtp", service), 0);
    server.startThreadPool();
    HostBinder client;

    ParcelWriter frame;  // as the recorder hands over an encoded frame
    frame.writeInt32(5);
    frame.writeInplace("\x00\x00\x00\x01\x65", 5);
    frame.writeInt32(0);
    ParcelWriter word;
    word.writeInt32(-7);
    struct Case {
        uint32_t code;
        ParcelWriter data;
        int status;
    } cases[] = {{101, frame, 0}, {0, ParcelWriter(), 0}, {2, word, -74}, {101, frame, 0}};
    for (const Case& c : cases) EXPECT_EQ(client.transact("orvex.rtp", c.code, c.data), c.status);
    std::vector<Received> got = service->Take();
    ASSERT_EQ(got.size(), std::size(cases));
    for (size_t i = 0; i < got.size(); ++i) {
        EXPECT_EQ(got[i], (Received{cases[i].code, 0, cases[i].data.data()})) << i;
    }
}

// Within the process that registered the service, a transaction is a call on the caller's own
// thread: no pool thread has to run for it, and after Stop nobody answers.
TEST_F(HostBinderTest, TransactionsInTheServicesOwnProcessAreCallsOnTheCallersThread) {
    auto service = std::make_shared<RecordingService>();
    HostBinder server;
    ASSERT_EQ(server.addService("orvex.rtp", service), 0);  // no thread pool started
    ParcelWriter frame;
    frame.writeInt32(5);
    frame.writeInplace("\x00\x00\x00\x01\x41", 5);
    frame.writeInt32(0);
    EXPECT_EQ(server.transact("orvex.rtp", 101, frame), 0);
    EXPECT_EQ(server.transact("orvex.rtp", 2, frame), platform::kBinderUnknownTransaction);
    std::vector<Received> got = service->Take();
    ASSERT_EQ(got.size(), 2u);
    EXPECT_EQ(got[0], (Received{101, 0, frame.data()}));
    server.Stop();
    EXPECT_EQ(server.transact("orvex.rtp", 101, frame), HostBinder::kDeadObject);
    EXPECT_TRUE(service->Take().empty());
}

TEST_F(HostBinderTest, BadPeersGetAnErrorAndTheServiceGoesOn) {
    auto service = std::make_shared<RecordingService>();
    HostBinder server;
    ASSERT_EQ(server.addService("svc", service), 0);
    server.startThreadPool();
    HostBinder client;
    const Bytes abcd = {'a', 'b', 'c', 'd'};
    struct Case {
        const char* name;
        Bytes in;
        bool hang_up;
        std::vector<int32_t> statuses;
        std::vector<Received> recorded;
    } cases[] = {
        {"two in one write",
         Cat({Le32(101), Le32(0x11), Le32(4), abcd, Le32(0), Le32(0), Le32(0)}),
         true,
         {0, 0},
         {{101, 0x11, abcd}, {0, 0, {}}}},
        {"lying size", Cat({Le32(101), Le32(0), Le32(100), abcd}), true, {}, {}},
        {"truncated header", Cat({Le32(101), {0, 0, 0}}), true, {}, {}},
        {"size over the limit", Cat({Le32(101), Le32(0), Le32((16u << 20) + 1)}), false, {-22}, {}},
        {"garbage",
         Bytes(std::begin("GET / HTTP/1.0\r\n\r\n"), std::end("GET / HTTP/1.0\r\n\r\n")),
         false,
         {-22},
         {}},
        {"unknown code", Cat({Le32(2), Le32(0), Le32(0)}), true, {-74}, {{2, 0, {}}}},
    };
    ParcelWriter probe;
    probe.writeInt32(1);
    for (const Case& c : cases) {
        EXPECT_EQ(RawExchange(Path("svc"), c.in, c.hang_up), c.statuses) << c.name;
        EXPECT_EQ(service->Take(), c.recorded) << c.name;
        EXPECT_EQ(client.transact("svc", 7, probe), 0) << "after " << c.name;
        EXPECT_EQ(service->Take(), (std::vector<Received>{{7, 0, probe.data()}})) << c.name;
    }
}

TEST_F(HostBinderTest, ConcurrentClientsAllGetThrough) {
    auto service = std::make_shared<RecordingService>();
    HostBinder server;
    ASSERT_EQ(server.addService("svc", service), 0);
    server.startThreadPool();
    // More clients than pool threads: the later ones are served as the first ones hang up.
    constexpr int kClients = HostBinder::kPoolThreads + 2, kEach = 50;
    std::vector<std::thread> clients;
    for (int c = 0; c < kClients; ++c) {
        clients.emplace_back([c] {
            HostBinder client;
            for (int i = 0; i < kEach; ++i) {
                ParcelWriter p;
                p.writeInt32(c);
                p.writeInt32(i);
                EXPECT_EQ(client.transact("svc", 101, p), 0);
            }
        });
    }
    for (auto& t : clients) t.join();
    std::vector<int> next(kClients, 0);
    for (const Received& r : service->Take()) {
        ASSERT_EQ(r.data.size(), 8u);
        int c = r.data[0], i = r.data[4];
        EXPECT_EQ(i, next[c]++) << "client " << c << " out of order";
    }
    EXPECT_EQ(next, std::vector<int>(kClients, kEach));
}

TEST_F(HostBinderTest, NobodyListeningIsANegativeStatus) {
    HostBinder client;
    ParcelWriter p;
    EXPECT_LT(client.transact("orvex.rtp", 101, p), 0);  // no directory yet
    {
        HostBinder gone;
        ASSERT_EQ(gone.addService("orvex.rtp", std::make_shared<RecordingService>()), 0);
    }
    EXPECT_NE(access(Path("orvex.rtp").c_str(), F_OK), 0) << "socket file left behind";
    EXPECT_LT(client.transact("orvex.rtp", 101, p), 0);
    // A stale socket file with nobody behind it, as a crashed service leaves.
    int fd = socket(AF_UNIX, SOCK_STREAM, 0);
    sockaddr_un addr{};
    addr.sun_family = AF_UNIX;
    snprintf(addr.sun_path, sizeof addr.sun_path, "%s", Path("stale").c_str());
    ASSERT_EQ(bind(fd, reinterpret_cast<sockaddr*>(&addr), sizeof addr), 0);
    close(fd);
    EXPECT_LT(client.transact("stale", 101, p), 0);
    for (const char* bad : {"", ".", "..", "../x", "a/b", "a b"}) {
        EXPECT_LT(client.transact(bad, 101, p), 0) << bad;
    }
}

// Without ORVEX_BINDER_DIR the sockets are abstract names per user; with it, files in that
// folder. The address covers exactly the name's bytes: an abstract name has no terminator.
TEST(HostBinderNamingTest, AbstractByDefaultFilesInAFolderWhenAsked) {
    unsetenv("ORVEX_BINDER_DIR");
    const std::string uid = std::to_string(getuid());
    const std::string abstract = HostBinder::BinderDir();
    EXPECT_EQ(abstract, std::string("\0orvex-binder-", 14) + uid);
    setenv("ORVEX_BINDER_DIR", "/run/x", 1);
    EXPECT_EQ(HostBinder::BinderDir(), "/run/x");
    unsetenv("ORVEX_BINDER_DIR");
    const size_t header = offsetof(sockaddr_un, sun_path);
    const size_t room = sizeof(sockaddr_un) - header;  // 108 on Linux
    const std::string longest = std::string(1, '\0') + std::string(room - 2, 'a');
    struct Case {
        std::string path;
        std::string shown;
        size_t address_len;  // after sun_family; 0: does not fit
    } const cases[] = {
        {HostBinder::ServicePath(abstract, "orvex.rtp"), "@orvex-binder-" + uid + "/orvex.rtp",
         14 + uid.size() + 10},
        {HostBinder::ServicePath("/run/x", "orvex.rtp"), "/run/x/orvex.rtp", room},
        {longest, "@" + longest.substr(1), room - 1},
        {std::string(room, 'a'), "", 0},
        {"", "", 0},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(platform::host::binder_wire::PrintablePath(c.path));
        sockaddr_un addr;
        const socklen_t len = platform::host::binder_wire::MakeAddress(c.path, &addr);
        if (c.address_len == 0) {
            EXPECT_EQ(len, 0u);
            continue;
        }
        EXPECT_EQ(len, header + c.address_len);
        EXPECT_EQ(std::string(addr.sun_path, c.path.size()), c.path);
        EXPECT_EQ(platform::host::binder_wire::PrintablePath(c.path), c.shown);
    }
}

// One name per network namespace: a second service in the same one is refused (and says how
// to run two); in a namespace of its own it serves, and each side's calls reach its own.
TEST(HostBinderNamingTest, EachNetworkNamespaceHasItsOwnServices) {
    unsetenv("ORVEX_BINDER_DIR");
    const std::string name = "orvex.test." + std::to_string(getpid());
    auto ours = std::make_shared<RecordingService>();
    HostBinder first;
    ASSERT_EQ(first.addService(name.c_str(), ours), 0);
    {
        HostBinder second;
        EXPECT_EQ(second.addService(name.c_str(), std::make_shared<RecordingService>()),
                  -EADDRINUSE);
    }
    const pid_t child = fork();  // before any thread starts, so the child may start its own
    ASSERT_GE(child, 0);
    if (child == 0) {
        // 2: no namespace of our own (not root); 1: wrong; 0: right.
        if (unshare(CLONE_NEWNET) != 0) _exit(2);
        HostBinder client;
        ParcelWriter p;
        p.writeInt32(1);
        if (client.transact(name.c_str(), 101, p) != HostBinder::kDeadObject) _exit(1);
        auto theirs = std::make_shared<RecordingService>();
        HostBinder own;
        if (own.addService(name.c_str(), theirs) != 0) _exit(1);
        own.startThreadPool();
        HostBinder other;
        if (other.transact(name.c_str(), 101, p) != platform::kBinderOk) _exit(1);
        own.Stop();
        _exit(theirs->Take().size() == 1 ? 0 : 1);
    }
    int status = 0;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    ASSERT_TRUE(WIFEXITED(status));
    first.startThreadPool();
    HostBinder client;
    ParcelWriter p;
    p.writeInt32(2);
    EXPECT_EQ(client.transact(name.c_str(), 101, p), platform::kBinderOk);
    first.Stop();
    EXPECT_EQ(ours->Take().size(), 1u) << "a call from the other namespace arrived here";
    if (WEXITSTATUS(status) == 2) GTEST_SKIP() << "unshare -n needs root; only one namespace tried";
    EXPECT_EQ(WEXITSTATUS(status), 0) << "the service in a namespace of its own failed";
}

// An abstract name has no file mode to keep other users out: the service turns away a
// connection from any user but its own and root, with no reply.
TEST(HostBinderNamingTest, OtherUsersAreTurnedAway) {
    if (getuid() != 0) GTEST_SKIP() << "taking another user's id needs root";
    unsetenv("ORVEX_BINDER_DIR");
    const std::string name = "orvex.test.user." + std::to_string(getpid());
    auto service = std::make_shared<RecordingService>();
    HostBinder server;
    ASSERT_EQ(server.addService(name.c_str(), service), 0);
    const pid_t child = fork();  // before any thread starts; it connects into the backlog
    ASSERT_GE(child, 0);
    if (child == 0) {
        if (setgid(65534) != 0 || setuid(65534) != 0) _exit(2);
        HostBinder client;
        ParcelWriter p;
        p.writeInt32(1);
        _exit(client.transact(name.c_str(), 101, p) == HostBinder::kDeadObject ? 0 : 1);
    }
    server.startThreadPool();
    int status = 0;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    ASSERT_TRUE(WIFEXITED(status));
    EXPECT_EQ(WEXITSTATUS(status), 0) << "the other user got an answer";
    HostBinder client;
    ParcelWriter p;
    p.writeInt32(2);
    EXPECT_EQ(client.transact(name.c_str(), 101, p), platform::kBinderOk);
    server.Stop();
    const auto got = service->Take();
    ASSERT_EQ(got.size(), 1u) << "the other user's transaction reached the service";
    EXPECT_EQ(got[0].data, Le32(2));
}

// The units one call gives, and the same input fed in chunks as orvex-feed reads it.
std::vector<Bytes> Split(const Bytes& in, size_t chunk) {
    std::vector<Bytes> units;
    Bytes pending;
    for (size_t at = 0; at <= in.size(); at += chunk) {
        size_t n = std::min(chunk, in.size() - at);
        pending.insert(pending.end(), in.begin() + at, in.begin() + at + n);
        bool at_end = at + chunk > in.size();
        size_t consumed = 0;
        auto split = tools::SplitAccessUnits(pending.data(), pending.size(), at_end, &consumed);
        for (Bytes& u : split) units.push_back(std::move(u));
        pending.erase(pending.begin(), pending.begin() + consumed);
        if (at_end) {
            EXPECT_TRUE(pending.empty());
        }
    }
    return units;
}

TEST(AccessUnitSplitterTest, SplitsAtPictureBoundaries) {
    const Bytes sc4 = {0, 0, 0, 1}, sc3 = {0, 0, 1};
    const Bytes sps = {0x67, 0x42, 0x00, 0x1e}, pps = {0x68, 0xce, 0x3c, 0x80};
    const Bytes idr = {0x65, 0x88, 0x84}, p1 = {0x41, 0x9a, 0x02}, p2 = {0x41, 0x9a, 0x04};
    const Bytes idr_part2 = {0x65, 0x40, 0x11};  // first_mb_in_slice 1: same picture
    const Bytes aud = {0x09, 0xf0}, sei = {0x06, 0x05, 0x01};
    struct Case {
        const char* name;
        Bytes in;
        std::vector<Bytes> units;
    } cases[] = {
        {"sps pps idr p p",
         Cat({sc4, sps, sc4, pps, sc4, idr, sc4, p1, sc4, p2}),
         {Cat({sc4, sps, sc4, pps, sc4, idr}), Cat({sc4, p1}), Cat({sc4, p2})}},
        {"3-byte start codes",
         Cat({sc3, sps, sc3, pps, sc4, idr, sc3, p1}),
         {Cat({sc4, sps, sc4, pps, sc4, idr}), Cat({sc4, p1})}},
        {"aud splits",
         Cat({sc4, aud, sc4, p1, sc4, aud, sc3, sei, sc4, p2}),
         {Cat({sc4, aud, sc4, p1}), Cat({sc4, aud, sc4, sei, sc4, p2})}},
        {"two slices, one picture",
         Cat({sc4, idr, sc4, idr_part2, sc4, p1}),
         {Cat({sc4, idr, sc4, idr_part2}), Cat({sc4, p1})}},
        {"sei after a slice",
         Cat({sc4, p1, sc4, sei, sc4, p2}),
         {Cat({sc4, p1}), Cat({sc4, sei, sc4, p2})}},
        {"garbage and trailing zeros",
         Cat({{0xff, 0x01}, sc3, p1, {0, 0, 0}, sc4, p2, {0, 0}}),
         {Cat({sc4, p1}), Cat({sc4, p2})}},
        {"empty nal units", Cat({sc4, sc3, p1, sc4}), {Cat({sc4, p1})}},
        {"no start code", {0x65, 0x88, 0, 0}, {}},
    };
    for (const Case& c : cases) {
        for (size_t chunk : {c.in.size() + 1, size_t{1}, size_t{2}, size_t{3}, size_t{5}}) {
            EXPECT_EQ(Split(c.in, chunk), c.units) << c.name << ", chunks of " << chunk;
        }
    }
}

TEST(AccessUnitSplitterTest, SampleFileHasOneUnitPerFrame) {
    const char* dir = getenv("ORVEX_MEDIA_DIR");
    std::string path = std::string(dir != nullptr ? dir : "/work/shared/media") +
                       "/testsrc2_640x480_30fps_4s.h264";
    std::ifstream file(path, std::ios::binary);
    if (!file) GTEST_SKIP() << path << " not found";
    Bytes in((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>());
    std::vector<Bytes> units = Split(in, in.size() + 1);
    ASSERT_EQ(units.size(), 120u);  // 4 s at 30 fps
    for (size_t i = 0; i < units.size(); ++i) {
        ASSERT_GE(units[i].size(), 5u);
        EXPECT_EQ(Bytes(units[i].begin(), units[i].begin() + 4), (Bytes{0, 0, 0, 1})) << i;
        EXPECT_EQ(units[i][4] & 0x1f, i % 30 == 0 ? 7 : 1) << i;
    }
    EXPECT_EQ(Split(in, 64 * 1024), units);
}

}  // namespace
