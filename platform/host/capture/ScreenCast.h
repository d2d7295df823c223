#pragma once

#include <gio/gio.h>

#include <atomic>
#include <cstdint>
#include <string>
#include <thread>

#include "sync/thread_mutex.h"

namespace platform {
namespace host {

// A screen cast session asked of the desktop over the session bus: the desktop portal's
// ScreenCast interface (the monitor, the cursor drawn in, permission kept with a restore token
// under the user's config folder), else GNOME's own org.gnome.Mutter.ScreenCast where no portal
// answers (headless and kiosk sessions). The session lives as long as this object: it is asked
// for on a thread of its own, which then watches for the desktop ending it, and it is closed
// when the object goes. Part of the GStreamer module (GLib's D-Bus).
// Thread contract: construct and destroy on one thread; poll() from any one thread.
class ScreenCast {
public:
    enum class State { kPending, kReady, kFailed };

    ScreenCast();
    ~ScreenCast();
    ScreenCast(const ScreenCast&) = delete;
    ScreenCast& operator=(const ScreenCast&) = delete;

    // kPending while the desktop has not answered (it may be asking the person); kReady with
    // the PipeWire node and the descriptor to reach PipeWire through (-1: the session's own
    // PipeWire; it stays owned here); kFailed with the reason, for good, when the session
    // could not be had or has since ended (the compositor or portal gone, the cast revoked).
    State poll(int* fd, uint32_t* node, std::string* why);

    // Where the portal's restore token is kept.
    static std::string TokenPath();

private:
    void run();
    bool viaPortal(std::string* why, bool* absent);
    bool viaMutter(std::string* why);
    // Calls `method` and returns its reply, or null with the error's text in *why.
    GVariant* call(const char* name, const char* path, const char* interface, const char* method,
                   GVariant* args, const GVariantType* reply, int timeout_ms, std::string* why,
                   GUnixFDList** fds = nullptr);
    // Runs this thread's loop until `done` or the timeout; false on timeout or stop.
    bool waitFor(const std::atomic<bool>& done, int timeout_ms);
    void watch(const char* name, const char* session_path, const char* session_interface);
    void fail(const std::string& why);

    static void OnSignal(GDBusConnection*, const char*, const char*, const char*, const char*,
                         GVariant*, gpointer);

    GMainContext* context_ = nullptr;
    GCancellable* cancel_ = nullptr;
    GDBusConnection* bus_ = nullptr;
    std::thread thread_;
    std::atomic<bool> stop_{false};

    // Filled by signals on this object's thread.
    std::atomic<bool> answered_{false};
    uint32_t response_ = 0;
    GVariant* results_ = nullptr;
    std::string request_path_;
    std::atomic<bool> node_seen_{false};
    uint32_t added_node_ = 0;
    guint subscriptions_[4] = {0, 0, 0, 0};

    thread_mutex mutex_;
    State state_ ORVEX_GUARDED_BY(mutex_) = State::kPending;
    int fd_ ORVEX_GUARDED_BY(mutex_) = -1;
    uint32_t node_ ORVEX_GUARDED_BY(mutex_) = 0;
    std::string why_ ORVEX_GUARDED_BY(mutex_);
};

}  // namespace host
}  // namespace platform
