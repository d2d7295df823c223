#include <gio/gio.h>
#include <gio/gunixfdlist.h>
#include <gtest/gtest.h>

#include <signal.h>
#include <spawn.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <cstdio>
#include <fstream>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "platform/host/capture/GstSource.h"
#include "platform/host/capture/HostSources.h"
#include "platform/host/video/HostCamera.h"
#include "platform/host/video/HostMediaRecorder.h"
#include "tests/platform/HostPortsTest.h"
#include "tests/platform/WaitFor.h"

// GLib's allocations while it is loaded belong to the library. Their stacks pass through
// libraries built without frame pointers, so only the slow unwinder sees far enough.
extern "C" const char* __lsan_default_suppressions() { return "leak:_dl_init\n"; }
extern "C" const char* __asan_default_options() { return "fast_unwind_on_malloc=0"; }

extern char** environ;

namespace {

using platform::host::GstSource;
using platform::host::SourceChoice;
using Clock = std::chrono::steady_clock;

// `command` run by sh in a process group of its own, so that everything it starts ends with it.
pid_t Spawn(const std::string& command) {
    posix_spawnattr_t attr;
    posix_spawnattr_init(&attr);
    posix_spawnattr_setpgroup(&attr, 0);
    posix_spawnattr_setflags(&attr, POSIX_SPAWN_SETPGROUP);
    const char* argv[] = {"sh", "-c", command.c_str(), nullptr};
    pid_t pid = -1;
    int rc = posix_spawnp(&pid, "sh", nullptr, &attr, const_cast<char**>(argv), environ);
    posix_spawnattr_destroy(&attr);
    return rc == 0 ? pid : -1;
}

void End(pid_t* pid) {
    if (*pid <= 0) return;
    kill(-*pid, SIGKILL);
    waitpid(*pid, nullptr, 0);
    *pid = -1;
}

bool Installed(const char* command) {
    return system((std::string("command -v ") + command + " >/dev/null 2>&1").c_str()) == 0;
}

// A session of our own: a session bus, PipeWire and WirePlumber (which links a consumer to the
// node it names) under a private XDG_RUNTIME_DIR, and no compositor. A producer is
// gst-launch-1.0 with pipewiresink offering a node of the given name.
class HostScreenTest : public HostPortsTest {
protected:
    static void SetUpTestSuite() {
        for (const char* tool : {"dbus-daemon", "pipewire", "wireplumber", "gst-launch-1.0"}) {
            if (!Installed(tool)) {
                missing_ = std::string(tool) + " is not installed (tools/install-deps.sh ci)";
                return;
            }
        }
        if (system("gst-inspect-1.0 pipewiresrc >/dev/null 2>&1") != 0) {
            missing_ = "GStreamer's PipeWire elements are not installed (gstreamer1.0-pipewire)";
            return;
        }
        char dir[] = "/tmp/orvex-screen-XXXXXX";
        runtime_ = mkdtemp(dir);
        chmod(runtime_.c_str(), 0700);
        setenv("XDG_RUNTIME_DIR", runtime_.c_str(), 1);
        setenv("DBUS_SESSION_BUS_ADDRESS", ("unix:path=" + runtime_ + "/bus").c_str(), 1);
        unsetenv("WAYLAND_DISPLAY");
        // Where a portal's restore token goes (GLib reads it once, at its first use).
        setenv("XDG_CONFIG_HOME", (runtime_ + "/config").c_str(), 1);
        // A bus that starts no services: a desktop portal started here would mount its
        // document store in the runtime folder.
        const std::string config = runtime_ + "/bus.conf";
        FILE* f = fopen(config.c_str(), "w");
        if (f == nullptr) {
            missing_ = "cannot write " + config;
            return;
        }
        fprintf(f,
                "<busconfig><type>session</type><listen>unix:path=%s/bus</listen>"
                "<auth>EXTERNAL</auth><policy context=\"default\">"
                "<allow send_destination=\"*\"/><allow receive_sender=\"*\"/>"
                "<allow own=\"*\"/></policy></busconfig>\n",
                runtime_.c_str());
        fclose(f);
        session_ = Spawn("dbus-daemon --nofork --config-file=" + config +
                         " & pipewire & sleep 0.3; wireplumber & wait");
        const std::string socket = runtime_ + "/pipewire-0";
        if (!WaitFor([&] { return access(socket.c_str(), F_OK) == 0; })) {
            missing_ = "pipewire did not start";
        }
    }
    static void TearDownTestSuite() {
        End(&session_);
        if (!runtime_.empty()) system(("rm -rf " + runtime_).c_str());
    }
    void SetUp() override {
        if (!missing_.empty()) GTEST_SKIP() << missing_;
        HostPortsTest::SetUp();
    }
    void TearDown() override {
        End(&producer_);
        HostPortsTest::TearDown();
    }

    void Produce(const std::string& name, const char* framerate) {
        End(&producer_);
        producer_ = Spawn(std::string("exec gst-launch-1.0 -q videotestsrc pattern=solid-color "
                                      "foreground-color=0xffff0000 is-live=true ! "
                                      "video/x-raw,format=BGRx,width=320,height=240,framerate=") +
                          framerate +
                          " ! pipewiresink mode=provide stream-properties=\"p,node.name=" + name +
                          "\" >/dev/null 2>&1");
        // pipewiresrc waits long in its start for a node that is not there yet.
        const std::string listed = "pw-cli ls Node | grep -q 'node.name = \"" + name + "\"'";
        ASSERT_TRUE(WaitFor([&] { return system(listed.c_str()) == 0; }));
    }

    static std::string missing_;
    static std::string runtime_;
    static pid_t session_;
    pid_t producer_ = -1;
};

std::string HostScreenTest::missing_;
std::string HostScreenTest::runtime_;
pid_t HostScreenTest::session_ = -1;

// A desktop portal's ScreenCast interface on the test's bus, answering as a desktop would once
// the person has chosen: Start declines, or gives `node` with a new restore token. It keeps the
// restore token each SelectSources brought.
class FakePortal {
public:
    FakePortal(bool decline, uint32_t node) : decline_(decline), node_(node) {
        context_ = g_main_context_new();
        loop_ = g_main_loop_new(context_, FALSE);
        thread_ = std::thread([this] { run(); });
        std::unique_lock<std::mutex> hold(mutex_);
        ready_cv_.wait(hold, [this] { return ready_; });
    }
    ~FakePortal() {
        g_main_loop_quit(loop_);
        thread_.join();
        g_main_loop_unref(loop_);
        g_main_context_unref(context_);
    }
    bool owned() const { return owned_; }
    void setNode(uint32_t node) { node_ = node; }
    std::vector<std::string> tokensSeen() {
        std::lock_guard<std::mutex> hold(mutex_);
        return tokens_seen_;
    }

private:
    static constexpr const char* kXml =
        "<node><interface name='org.freedesktop.portal.ScreenCast'>"
        "<method name='CreateSession'><arg type='a{sv}' direction='in'/>"
        "<arg type='o' direction='out'/></method>"
        "<method name='SelectSources'><arg type='o' direction='in'/>"
        "<arg type='a{sv}' direction='in'/><arg type='o' direction='out'/></method>"
        "<method name='Start'><arg type='o' direction='in'/><arg type='s' direction='in'/>"
        "<arg type='a{sv}' direction='in'/><arg type='o' direction='out'/></method>"
        "<method name='OpenPipeWireRemote'><arg type='o' direction='in'/>"
        "<arg type='a{sv}' direction='in'/><arg type='h' direction='out'/></method>"
        "</interface></node>";

    void run() {
        g_main_context_push_thread_default(context_);
        gchar* address = g_dbus_address_get_for_bus_sync(G_BUS_TYPE_SESSION, nullptr, nullptr);
        bus_ = g_dbus_connection_new_for_address_sync(
            address,
            static_cast<GDBusConnectionFlags>(G_DBUS_CONNECTION_FLAGS_AUTHENTICATION_CLIENT |
                                              G_DBUS_CONNECTION_FLAGS_MESSAGE_BUS_CONNECTION),
            nullptr, nullptr, nullptr);
        g_free(address);
        GDBusNodeInfo* info = g_dbus_node_info_new_for_xml(kXml, nullptr);
        static const GDBusInterfaceVTable vtable = {&FakePortal::OnCall, nullptr, nullptr, {}};
        if (bus_ != nullptr) {
            g_dbus_connection_register_object(bus_, "/org/freedesktop/portal/desktop",
                                              info->interfaces[0], &vtable, this, nullptr, nullptr);
            GVariant* reply = g_dbus_connection_call_sync(
                bus_, "org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus",
                "RequestName", g_variant_new("(su)", "org.freedesktop.portal.Desktop", 4u),
                G_VARIANT_TYPE("(u)"), G_DBUS_CALL_FLAGS_NONE, -1, nullptr, nullptr);
            if (reply != nullptr) {
                owned_ = true;
                g_variant_unref(reply);
            }
        }
        {
            std::lock_guard<std::mutex> hold(mutex_);
            ready_ = true;
        }
        ready_cv_.notify_all();
        g_main_loop_run(loop_);
        if (bus_ != nullptr) {
            g_dbus_connection_close_sync(bus_, nullptr, nullptr);
            g_object_unref(bus_);
        }
        g_dbus_node_info_unref(info);
        g_main_context_pop_thread_default(context_);
    }

    static void OnCall(GDBusConnection* bus, const char* sender, const char*, const char*,
                       const char* method, GVariant* params, GDBusMethodInvocation* call,
                       gpointer data) {
        auto* self = static_cast<FakePortal*>(data);
        std::string who = sender + 1;
        for (char& c : who) c = c == '.' ? '_' : c;
        const std::string name(method);
        GVariant* options = g_variant_get_child_value(params, g_variant_n_children(params) - 1);
        if (name == "OpenPipeWireRemote") {
            g_variant_unref(options);
            int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
            sockaddr_un addr{};
            addr.sun_family = AF_UNIX;
            snprintf(addr.sun_path, sizeof addr.sun_path, "%s/pipewire-0",
                     getenv("XDG_RUNTIME_DIR"));
            connect(fd, reinterpret_cast<sockaddr*>(&addr), sizeof addr);
            GUnixFDList* fds = g_unix_fd_list_new_from_array(&fd, 1);
            g_dbus_method_invocation_return_value_with_unix_fd_list(call, g_variant_new("(h)", 0),
                                                                    fds);
            g_object_unref(fds);
            return;
        }
        const char* token = "";
        g_variant_lookup(options, "handle_token", "&s", &token);
        const std::string request = "/org/freedesktop/portal/desktop/request/" + who + "/" + token;
        g_dbus_method_invocation_return_value(call, g_variant_new("(o)", request.c_str()));
        uint32_t response = 0;
        GVariantBuilder results;
        g_variant_builder_init(&results, G_VARIANT_TYPE_VARDICT);
        if (name == "CreateSession") {
            const std::string session = "/org/freedesktop/portal/desktop/session/" + who + "/s";
            g_variant_builder_add(&results, "{sv}", "session_handle",
                                  g_variant_new_string(session.c_str()));
        } else if (name == "SelectSources") {
            const char* restore = "";
            g_variant_lookup(options, "restore_token", "&s", &restore);
            std::lock_guard<std::mutex> hold(self->mutex_);
            self->tokens_seen_.push_back(restore);
        } else if (self->decline_) {
            response = 1;
        } else {
            GVariantBuilder streams;
            g_variant_builder_init(&streams, G_VARIANT_TYPE("a(ua{sv})"));
            g_variant_builder_add(&streams, "(u@a{sv})", self->node_.load(),
                                  g_variant_new("a{sv}", nullptr));
            g_variant_builder_add(&results, "{sv}", "streams", g_variant_builder_end(&streams));
            const std::string next = "token-" + std::to_string(++self->granted_);
            g_variant_builder_add(&results, "{sv}", "restore_token",
                                  g_variant_new_string(next.c_str()));
        }
        g_variant_unref(options);
        g_dbus_connection_emit_signal(bus, sender, request.c_str(),
                                      "org.freedesktop.portal.Request", "Response",
                                      g_variant_new("(ua{sv})", response, &results), nullptr);
    }

    const bool decline_;
    std::atomic<uint32_t> node_;
    int granted_ = 0;
    GMainContext* context_ = nullptr;
    GMainLoop* loop_ = nullptr;
    GDBusConnection* bus_ = nullptr;
    std::atomic<bool> owned_{false};
    std::thread thread_;
    std::mutex mutex_;
    std::condition_variable ready_cv_;
    bool ready_ = false;
    std::vector<std::string> tokens_seen_;
};

// The number PipeWire gave the node of this name, 0 when there is none.
uint32_t NodeNumber(const std::string& name) {
    const std::string command =
        "pw-cli ls Node | awk '/^\\tid /{id=$2+0} /node.name = \"" + name + "\"/{print id}'";
    FILE* out = popen(command.c_str(), "r");
    if (out == nullptr) return 0;
    unsigned number = 0;
    if (fscanf(out, "%u", &number) != 1) number = 0;
    pclose(out);
    return number;
}

TEST(HostScreenValues, ScreenIsWaylandWhenTheSessionSaysSo) {
    struct Case {
        const char* wayland_display;
        const char* session_type;
        SourceChoice::Kind kind;
    };
    const Case cases[] = {
        {nullptr, nullptr, SourceChoice::kX11},
        {"wayland-0", nullptr, SourceChoice::kWayland},
        {nullptr, "wayland", SourceChoice::kWayland},
        {"", "x11", SourceChoice::kX11},
        {"", "tty", SourceChoice::kX11},
        // A Wayland session whose X applications run on Xwayland still casts through PipeWire.
        {"wayland-1", "x11", SourceChoice::kWayland},
    };
    for (const Case& c : cases) {
        EXPECT_EQ(platform::host::ScreenKind(c.wayland_display, c.session_type), c.kind)
            << (c.wayland_display ? c.wayland_display : "(unset)") << " "
            << (c.session_type ? c.session_type : "(unset)");
    }
}

// A moving picture and a still one (a picture every 5 s, as a screen nobody touches): both
// arrive converted, and the still one is not taken for a lost source, since pipewiresrc sends
// its last picture again while nothing new comes.
TEST_F(HostScreenTest, ANodesPicturesArriveAndAStillNodeIsNotLost) {
    struct Case {
        const char* node;
        const char* framerate;
    };
    const Case cases[] = {{"orvex-still", "1/5"}, {"orvex-moving", "30/1"}};
    for (const Case& c : cases) {
        SCOPED_TRACE(c.node);
        ASSERT_NO_FATAL_FAILURE(Produce(c.node, c.framerate));
        GstSource live;
        std::string error;
        ASSERT_TRUE(
            live.startScreen(c.node, platform::host::VideoConversion(160, 120), &error, false))
            << error;
        std::vector<uint8_t> picture(160 * 120 * 3 / 2, 0);
        ASSERT_TRUE(WaitFor([&] { return live.latestFrame(picture.data(), 160, 120); }, 30));
        // Red, BT.601 limited range: Y 81, U 90, V 240.
        EXPECT_NEAR(picture[80 * 60], 81, 6);
        EXPECT_NEAR(picture[160 * 120 + 40 * 30], 90, 6);
        EXPECT_NEAR(picture[160 * 120 * 5 / 4 + 40 * 30], 240, 6);
        int fresh = 0;
        std::string why;
        for (auto end = Clock::now() + std::chrono::seconds(6); Clock::now() < end;) {
            ASSERT_FALSE(live.ended(&why)) << why;
            fresh += live.latestFrame(picture.data(), 160, 120);
            std::this_thread::sleep_for(std::chrono::milliseconds(33));
        }
        EXPECT_GE(fresh, 5);
    }
}

// The node's producer goes away and comes back: one line naming the source, "no signal" at the
// asked rate meanwhile, and the picture back without a new start.
TEST_F(HostScreenTest, ALostNodeShowsNoSignalAndComesBack) {
    ASSERT_NO_FATAL_FAILURE(Produce("orvex-lost", "30/1"));
    properties_.Set("orvex.host.video", "pipewire:orvex-lost");
    platform::host::HostCamera camera;
    camera.unlock();
    platform::host::HostMediaRecorder r;
    ASSERT_EQ(r.setCamera(camera), 0);
    ASSERT_EQ(r.setVideoSource(1), 0);
    ASSERT_EQ(r.setOutputFormat(101), 0);
    ASSERT_EQ(r.setVideoEncoder(2), 0);
    ASSERT_EQ(r.setVideoSize(320, 240), 0);
    ASSERT_EQ(r.setVideoFrameRate(30), 0);
    ASSERT_EQ(r.prepare(), 0);
    ASSERT_EQ(r.start(), 0);
    ASSERT_TRUE(WaitFor([&] { return binder_.frames.load() >= 30; }));
    End(&producer_);
    ASSERT_TRUE(WaitFor([&] { return !Lines("stopped").empty(); }));
    int after = binder_.frames.load();
    EXPECT_TRUE(WaitFor([&] { return binder_.frames.load() >= after + 30; }, 3));
    Produce("orvex-lost", "30/1");
    EXPECT_TRUE(WaitFor([&] { return !Lines("is back").empty(); }, 20));
    EXPECT_EQ(r.stop(), 0);
    EXPECT_EQ(Lines("stopped"),
              (std::vector<std::string>{"MediaRecorder: video source pipewire:orvex-lost stopped: "
                                        "no picture from PipeWire for 4 s; showing \"no signal\", "
                                        "trying again in 1 s"}));
}

// Without a desktop to ask, a Wayland screen cannot start: one line says why (nobody offers a
// screen cast here; no bus at all), the picture is "no signal", and the desktop is asked again.
TEST_F(HostScreenTest, AWaylandScreenWithoutADesktopSaysWhyInOneLine) {
    struct Case {
        const char* bus;  // null: the session's own
        const char* reason;
    };
    const Case cases[] = {
        {nullptr, "org.gnome.Mutter.ScreenCast was not provided by any .service files"},
        {"unix:path=/nonexistent/orvex-bus", "no session bus"},
    };
    const std::string own = getenv("DBUS_SESSION_BUS_ADDRESS");
    for (const Case& c : cases) {
        SCOPED_TRACE(c.reason);
        log_.Clear();
        setenv("DBUS_SESSION_BUS_ADDRESS", c.bus != nullptr ? c.bus : own.c_str(), 1);
        properties_.Set("orvex.host.video", "wayland");
        platform::host::HostCamera camera;
        camera.unlock();
        platform::host::HostMediaRecorder r;
        ASSERT_EQ(r.setCamera(camera), 0);
        ASSERT_EQ(r.setOutputFormat(101), 0);
        ASSERT_EQ(r.setVideoEncoder(2), 0);
        ASSERT_EQ(r.setVideoSize(320, 240), 0);
        ASSERT_EQ(r.prepare(), 0);
        ASSERT_EQ(r.start(), 0);
        // A slow portal may leave the answer to the recording thread.
        ASSERT_TRUE(WaitFor([&] { return !Lines(c.reason).empty(); }, 15));
        EXPECT_TRUE(WaitFor([&] { return binder_.frames.load() >= 10; }));
        // And it is asked for again, quietly, while the picture goes on.
        EXPECT_TRUE(WaitFor([&] { return !Lines("still failing").empty(); }));
        EXPECT_EQ(r.release(), 0);
        std::vector<std::string> lines;
        for (const std::string& line : Lines(c.reason)) {
            if (line.find("still failing") == std::string::npos) lines.push_back(line);
        }
        ASSERT_EQ(lines.size(), 1u);
        EXPECT_EQ(lines[0].compare(0, 35, "MediaRecorder: video source wayland"), 0) << lines[0];
    }
    setenv("DBUS_SESSION_BUS_ADDRESS", own.c_str(), 1);
}

// The desktop portal's way in: a person who declines is one line saying so and what to click;
// one who shares gives the screen, through the descriptor the portal hands out, and a restore
// token kept for the owner alone, which the next start brings so that nobody is asked again.
TEST_F(HostScreenTest, ThePortalAsksOnceAndItsAnswerIsKept) {
    ASSERT_NO_FATAL_FAILURE(Produce("orvex-desktop", "30/1"));
    const uint32_t node = NodeNumber("orvex-desktop");
    ASSERT_NE(node, 0u);
    {
        FakePortal portal(true, node);
        ASSERT_TRUE(portal.owned());
        properties_.Set("orvex.host.video", "wayland");
        platform::host::HostCamera camera;
        camera.unlock();
        platform::host::HostMediaRecorder r;
        ASSERT_EQ(r.setCamera(camera), 0);
        ASSERT_EQ(r.setOutputFormat(101), 0);
        ASSERT_EQ(r.setVideoEncoder(2), 0);
        ASSERT_EQ(r.setVideoSize(320, 240), 0);
        ASSERT_EQ(r.prepare(), 0);
        EXPECT_EQ(r.release(), 0);
        EXPECT_EQ(Lines("video source"),
                  (std::vector<std::string>{
                      "MediaRecorder: video source wayland cannot start: Start: the person "
                      "declined to share the screen (allow it in the desktop's screen sharing "
                      "dialog); showing \"no signal\", trying again in 1 s"}));
    }
    const std::string token_file =
        std::string(getenv("XDG_CONFIG_HOME")) + "/orvex/screencast-token";
    FakePortal portal(false, node);
    ASSERT_TRUE(portal.owned());
    for (int start = 0; start < 2; ++start) {
        // A screen cast session is a stream of its own each time, as a desktop makes it.
        if (start > 0) {
            ASSERT_NO_FATAL_FAILURE(Produce("orvex-desktop-again", "30/1"));
            portal.setNode(NodeNumber("orvex-desktop-again"));
        }
        GstSource live;
        std::string error;
        ASSERT_TRUE(live.startScreen("", platform::host::VideoConversion(160, 120), &error))
            << error;
        std::vector<uint8_t> picture(160 * 120 * 3 / 2, 0);
        ASSERT_TRUE(WaitFor([&] { return live.latestFrame(picture.data(), 160, 120); }));
        EXPECT_NEAR(picture[80 * 60], 81, 6);  // the producer's red
    }
    struct stat st {};
    ASSERT_EQ(stat(token_file.c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 0777, 0600u);
    std::ifstream saved(token_file);
    std::string token;
    saved >> token;
    EXPECT_EQ(token, "token-2");
    // The first asked with no token (the declined start kept none), the second with the first's.
    EXPECT_EQ(portal.tokensSeen(), (std::vector<std::string>{"", "token-1"}));
}

}  // namespace
