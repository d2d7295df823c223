#include "platform/host/capture/ScreenCast.h"

#include <fcntl.h>
#include <gio/gunixfdlist.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>

#include "sync/thread_mutex.h"

namespace platform {
namespace host {
namespace {

constexpr char kPortalName[] = "org.freedesktop.portal.Desktop";
constexpr char kPortalPath[] = "/org/freedesktop/portal/desktop";
constexpr char kPortalCast[] = "org.freedesktop.portal.ScreenCast";
constexpr char kPortalRequest[] = "org.freedesktop.portal.Request";
constexpr char kPortalSession[] = "org.freedesktop.portal.Session";
constexpr char kMutterName[] = "org.gnome.Mutter.ScreenCast";
constexpr char kMutterPath[] = "/org/gnome/Mutter/ScreenCast";
constexpr char kMutterSession[] = "org.gnome.Mutter.ScreenCast.Session";
constexpr char kMutterStream[] = "org.gnome.Mutter.ScreenCast.Stream";

// A plain call, or a portal step that needs nobody: a GNOME portal in a headless session may
// never answer, and the fallback must come before the recorder gives up on the source.
constexpr int kCallMs = 3000;
// The person reading the portal's dialog.
constexpr int kConsentMs = 60000;
// Portal values: a monitor, the cursor drawn into the picture, permission kept until revoked.
constexpr uint32_t kSourceMonitor = 1;
constexpr uint32_t kCursorEmbedded = 2;
constexpr uint32_t kPersistUntilRevoked = 2;
// Mutter's cursor-mode for a cursor drawn into the picture.
constexpr uint32_t kMutterCursorEmbedded = 1;

std::string ReadToken(const std::string& path) {
    gchar* text = nullptr;
    if (!g_file_get_contents(path.c_str(), &text, nullptr, nullptr)) return std::string();
    std::string token(text);
    g_free(text);
    token.erase(token.find_last_not_of(" \r\n\t") + 1);
    return token;
}

// The token is a standing permission to watch the screen: only its owner may read it.
void WriteToken(const std::string& path, const std::string& token) {
    gchar* dir = g_path_get_dirname(path.c_str());
    g_mkdir_with_parents(dir, 0700);
    g_free(dir);
    int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
    if (fd < 0) return;  // the next start asks again; nothing worse
    fchmod(fd, 0600);
    std::string line = token + "\n";
    ssize_t n = write(fd, line.data(), line.size());
    (void)n;
    close(fd);
}

GVariant* EmptyOptions() { return g_variant_new("a{sv}", nullptr); }

}  // namespace

std::string ScreenCast::TokenPath() {
    return std::string(g_get_user_config_dir()) + "/orvex/screencast-token";
}

ScreenCast::ScreenCast() {
    context_ = g_main_context_new();
    cancel_ = g_cancellable_new();
    thread_ = std::thread(&ScreenCast::run, this);
}

ScreenCast::~ScreenCast() {
    stop_ = true;
    g_cancellable_cancel(cancel_);
    g_main_context_wakeup(context_);
    thread_.join();
    if (fd_ >= 0) close(fd_);
    if (results_ != nullptr) g_variant_unref(results_);
    g_object_unref(cancel_);
    g_main_context_unref(context_);
}

ScreenCast::State ScreenCast::poll(int* fd, uint32_t* node, std::string* why) {
    thread_mutex::Scoped hold(mutex_);
    *fd = fd_;
    *node = node_;
    *why = why_;
    return state_;
}

void ScreenCast::fail(const std::string& why) {
    thread_mutex::Scoped hold(mutex_);
    if (state_ == State::kFailed) return;  // the first cause is the one to report
    state_ = State::kFailed;
    why_ = why;
}

void ScreenCast::run() {
    g_main_context_push_thread_default(context_);
    GError* err = nullptr;
    gchar* address = g_dbus_address_get_for_bus_sync(G_BUS_TYPE_SESSION, cancel_, &err);
    // A connection of its own: the desktop ends a session whose connection closes, so the
    // session cannot outlive this object even when a call was cut short.
    if (address != nullptr) {
        bus_ = g_dbus_connection_new_for_address_sync(
            address,
            static_cast<GDBusConnectionFlags>(G_DBUS_CONNECTION_FLAGS_AUTHENTICATION_CLIENT |
                                              G_DBUS_CONNECTION_FLAGS_MESSAGE_BUS_CONNECTION),
            nullptr, cancel_, &err);
        g_free(address);
    }
    if (bus_ == nullptr) {
        fail(std::string("no session bus: ") + (err != nullptr ? err->message : "unknown"));
        g_clear_error(&err);
    } else {
        std::string why;
        bool absent = false;
        if (!viaPortal(&why, &absent) && absent) {
            std::string portal = why;
            if (!viaMutter(&why)) fail("no screen cast: portal: " + portal + "; GNOME: " + why);
        } else if (!why.empty()) {
            fail(why);
        }
        // Dispatches the signals that say the session has ended, until this object goes.
        while (!stop_) g_main_context_iteration(context_, TRUE);
        for (guint& id : subscriptions_) {
            if (id != 0) g_dbus_connection_signal_unsubscribe(bus_, id);
            id = 0;
        }
        g_dbus_connection_close_sync(bus_, nullptr, nullptr);
        g_object_unref(bus_);
        bus_ = nullptr;
    }
    // Pending dispatches of the unsubscribed signals still hold this context.
    while (g_main_context_iteration(context_, FALSE)) {
    }
    g_main_context_pop_thread_default(context_);
}

GVariant* ScreenCast::call(const char* name, const char* path, const char* interface,
                           const char* method, GVariant* args, const GVariantType* reply,
                           int timeout_ms, std::string* why, GUnixFDList** fds) {
    GError* err = nullptr;
    GVariant* out = g_dbus_connection_call_with_unix_fd_list_sync(
        bus_, name, path, interface, method, args, reply, G_DBUS_CALL_FLAGS_NONE, timeout_ms,
        nullptr, fds, cancel_, &err);
    if (out == nullptr) {
        if (err != nullptr) g_dbus_error_strip_remote_error(err);
        *why = std::string(method) + ": " + (err != nullptr ? err->message : "no reply");
        g_clear_error(&err);
    }
    return out;
}

bool ScreenCast::waitFor(const std::atomic<bool>& done, int timeout_ms) {
    const gint64 until = g_get_monotonic_time() + static_cast<gint64>(timeout_ms) * 1000;
    while (!done && !stop_) {
        gint64 left_ms = (until - g_get_monotonic_time()) / 1000;
        if (left_ms <= 0) return false;
        // A timer bounds each wait, so that the deadline is seen without a signal.
        GSource* timer = g_timeout_source_new(static_cast<guint>(std::min<gint64>(left_ms, 100)));
        g_source_set_callback(
            timer, [](gpointer) { return G_SOURCE_REMOVE; }, nullptr, nullptr);
        g_source_attach(timer, context_);
        g_main_context_iteration(context_, TRUE);
        g_source_destroy(timer);
        g_source_unref(timer);
    }
    return done;
}

void ScreenCast::OnSignal(GDBusConnection*, const char*, const char* path, const char*,
                          const char* member, GVariant* params, gpointer data) {
    auto* self = static_cast<ScreenCast*>(data);
    const std::string signal(member);
    // Whatever else is on the bus may send a signal of the same name: only the expected shape
    // is read.
    auto shaped = [params](const char* type) {
        return g_variant_is_of_type(params, G_VARIANT_TYPE(type));
    };
    if (signal == "Response" && self->request_path_ == path && shaped("(ua{sv})")) {
        if (self->results_ != nullptr) g_variant_unref(self->results_);
        g_variant_get(params, "(u@a{sv})", &self->response_, &self->results_);
        self->answered_ = true;
    } else if (signal == "PipeWireStreamAdded" && shaped("(u)")) {
        g_variant_get(params, "(u)", &self->added_node_);
        self->node_seen_ = true;
    } else if (signal == "Closed") {
        self->fail(
            "the desktop closed the screen cast (the compositor stopping, or the cast revoked)");
    } else if (signal == "NameOwnerChanged" && shaped("(sss)")) {
        const char *name = nullptr, *old_owner = nullptr, *new_owner = nullptr;
        g_variant_get(params, "(&s&s&s)", &name, &old_owner, &new_owner);
        if (new_owner[0] == '\0') {
            self->fail(std::string(name) + " left the session bus (the compositor went away)");
        }
    }
}

void ScreenCast::watch(const char* name, const char* session_path, const char* session_interface) {
    // A portal given up on half way is watched no more once GNOME's service is.
    for (guint* id : {&subscriptions_[2], &subscriptions_[3]}) {
        if (*id != 0) g_dbus_connection_signal_unsubscribe(bus_, *id);
    }
    subscriptions_[2] = g_dbus_connection_signal_subscribe(
        bus_, name, session_interface, "Closed", session_path, nullptr, G_DBUS_SIGNAL_FLAGS_NONE,
        &ScreenCast::OnSignal, this, nullptr);
    subscriptions_[3] = g_dbus_connection_signal_subscribe(
        bus_, "org.freedesktop.DBus", "org.freedesktop.DBus", "NameOwnerChanged",
        "/org/freedesktop/DBus", name, G_DBUS_SIGNAL_FLAGS_NONE, &ScreenCast::OnSignal, this,
        nullptr);
}

bool ScreenCast::viaPortal(std::string* why, bool* absent) {
    *absent = true;
    // Requests answer on an object whose path the caller predicts from its own bus name.
    std::string sender = g_dbus_connection_get_unique_name(bus_) + 1;
    std::replace(sender.begin(), sender.end(), '.', '_');
    subscriptions_[0] = g_dbus_connection_signal_subscribe(
        bus_, kPortalName, kPortalRequest, "Response", nullptr, nullptr, G_DBUS_SIGNAL_FLAGS_NONE,
        &ScreenCast::OnSignal, this, nullptr);
    int serial = 0;
    // One portal request: true with its results in results_ when it succeeded.
    auto request = [&](const char* method, const char* session, GVariantBuilder* options,
                       int timeout_ms) {
        std::string token = "orvex" + std::to_string(++serial);
        g_variant_builder_add(options, "{sv}", "handle_token", g_variant_new_string(token.c_str()));
        request_path_ = std::string(kPortalPath) + "/request/" + sender + "/" + token;
        answered_ = false;
        GVariant* dict = g_variant_builder_end(options);
        // Start alone takes a parent window, which a service has none of.
        GVariant* args = session == nullptr ? g_variant_new("(@a{sv})", dict)
                         : std::string(method) == "Start"
                             ? g_variant_new("(os@a{sv})", session, "", dict)
                             : g_variant_new("(o@a{sv})", session, dict);
        GVariant* reply = call(kPortalName, kPortalPath, kPortalCast, method, args,
                               G_VARIANT_TYPE("(o)"), kCallMs, why);
        if (reply == nullptr) return false;
        g_variant_unref(reply);
        if (!waitFor(answered_, timeout_ms)) {
            *why = std::string(method) + ": no answer within " + std::to_string(timeout_ms / 1000) +
                   " s";
            return false;
        }
        if (response_ == 1) {
            *why = std::string(method) + ": the person declined to share the screen";
        } else if (response_ != 0) {
            *why = std::string(method) + ": the portal refused (response " +
                   std::to_string(response_) + ")";
        }
        return response_ == 0;
    };

    GVariantBuilder options;
    g_variant_builder_init(&options, G_VARIANT_TYPE_VARDICT);
    g_variant_builder_add(&options, "{sv}", "session_handle_token", g_variant_new_string("orvex"));
    if (!request("CreateSession", nullptr, &options, kCallMs)) return false;
    const char* handle = nullptr;
    std::string session;
    if (g_variant_lookup(results_, "session_handle", "&s", &handle)) session = handle;
    if (session.empty()) {
        *why = "CreateSession: no session handle";
        return false;
    }
    watch(kPortalName, session.c_str(), kPortalSession);

    const std::string token_path = TokenPath();
    const std::string saved = ReadToken(token_path);
    g_variant_builder_init(&options, G_VARIANT_TYPE_VARDICT);
    g_variant_builder_add(&options, "{sv}", "types", g_variant_new_uint32(kSourceMonitor));
    g_variant_builder_add(&options, "{sv}", "multiple", g_variant_new_boolean(FALSE));
    g_variant_builder_add(&options, "{sv}", "cursor_mode", g_variant_new_uint32(kCursorEmbedded));
    g_variant_builder_add(&options, "{sv}", "persist_mode",
                          g_variant_new_uint32(kPersistUntilRevoked));
    if (!saved.empty()) {
        g_variant_builder_add(&options, "{sv}", "restore_token",
                              g_variant_new_string(saved.c_str()));
    }
    if (!request("SelectSources", session.c_str(), &options, kCallMs)) return false;
    // From here on the portal is there: its refusals are answers, not a reason to go around it.
    *absent = false;

    g_variant_builder_init(&options, G_VARIANT_TYPE_VARDICT);
    if (!request("Start", session.c_str(), &options, kConsentMs)) {
        if (response_ == 1 || !answered_) {
            *why += " (allow it in the desktop's screen sharing dialog)";
        }
        return false;
    }
    GVariant* streams = g_variant_lookup_value(results_, "streams", G_VARIANT_TYPE("a(ua{sv})"));
    uint32_t node = 0;
    bool have_node = streams != nullptr && g_variant_n_children(streams) > 0;
    if (have_node) g_variant_get_child(streams, 0, "(u@a{sv})", &node, nullptr);
    if (streams != nullptr) g_variant_unref(streams);
    if (!have_node) {
        *why = "Start: the portal gave no stream";
        return false;
    }
    const char* token = nullptr;
    if (g_variant_lookup(results_, "restore_token", "&s", &token) && token[0] != '\0') {
        WriteToken(token_path, token);
    }

    GUnixFDList* fds = nullptr;
    GVariant* reply = call(kPortalName, kPortalPath, kPortalCast, "OpenPipeWireRemote",
                           g_variant_new("(o@a{sv})", session.c_str(), EmptyOptions()),
                           G_VARIANT_TYPE("(h)"), kCallMs, why, &fds);
    if (reply == nullptr) return false;
    gint32 index = -1;
    g_variant_get(reply, "(h)", &index);
    g_variant_unref(reply);
    int fd = fds != nullptr ? g_unix_fd_list_get(fds, index, nullptr) : -1;
    if (fds != nullptr) g_object_unref(fds);
    if (fd < 0) {
        *why = "OpenPipeWireRemote: no descriptor";
        return false;
    }
    thread_mutex::Scoped hold(mutex_);
    fd_ = fd;
    node_ = node;
    if (state_ == State::kPending) state_ = State::kReady;
    return true;
}

bool ScreenCast::viaMutter(std::string* why) {
    GVariant* reply =
        call(kMutterName, kMutterPath, kMutterName, "CreateSession",
             g_variant_new("(@a{sv})", EmptyOptions()), G_VARIANT_TYPE("(o)"), kCallMs, why);
    if (reply == nullptr) return false;
    std::string session;
    const char* path = nullptr;
    g_variant_get(reply, "(&o)", &path);
    session = path;
    g_variant_unref(reply);
    watch(kMutterName, session.c_str(), kMutterSession);

    GVariantBuilder options;
    g_variant_builder_init(&options, G_VARIANT_TYPE_VARDICT);
    g_variant_builder_add(&options, "{sv}", "cursor-mode",
                          g_variant_new_uint32(kMutterCursorEmbedded));
    // An empty connector is the primary monitor.
    reply = call(kMutterName, session.c_str(), kMutterSession, "RecordMonitor",
                 g_variant_new("(sa{sv})", "", &options), G_VARIANT_TYPE("(o)"), kCallMs, why);
    if (reply == nullptr) return false;
    g_variant_get(reply, "(&o)", &path);
    std::string stream = path;
    g_variant_unref(reply);
    subscriptions_[1] = g_dbus_connection_signal_subscribe(
        bus_, kMutterName, kMutterStream, "PipeWireStreamAdded", stream.c_str(), nullptr,
        G_DBUS_SIGNAL_FLAGS_NONE, &ScreenCast::OnSignal, this, nullptr);

    reply =
        call(kMutterName, session.c_str(), kMutterSession, "Start", nullptr, nullptr, kCallMs, why);
    if (reply == nullptr) return false;
    g_variant_unref(reply);
    if (!waitFor(node_seen_, kCallMs)) {
        *why = "Start: no PipeWire stream within 3 s";
        return false;
    }
    thread_mutex::Scoped hold(mutex_);
    node_ = added_node_;
    if (state_ == State::kPending) state_ = State::kReady;
    return true;
}

}  // namespace host
}  // namespace platform
