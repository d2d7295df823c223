#include "config/livepipmanager.h"

#include <memory>

#include "sync/thread_mutex.h"

#include "base/OrvexLog.h"
#include "platform/Ports.h"

std::atomic<unsigned> g_pip_stop_flag{0};
std::atomic<unsigned> g_follow_main_flag{0};

namespace {

constexpr const char* kTag = "orvex:::livepipmanager";

thread_mutex g_client_mutex;
std::shared_ptr<platform::PipManagerClient> g_client ORVEX_GUARDED_BY(g_client_mutex);

}  // namespace

int openPipManager() {
    OrvexLog(kTag, "openPipManager");
    thread_mutex::Scoped hold(g_client_mutex);
    g_client = platform::PipManager().connect();
    if (!g_client) {
        OrvexLog(kTag, "can't get pip manager");
        return -1;
    }
    return 0;
}

void closePipManager() {
    OrvexLog(kTag, "closePipManager begin");
    std::shared_ptr<platform::PipManagerClient> client;
    {
        thread_mutex::Scoped hold(g_client_mutex);
        client.swap(g_client);
    }
    if (client) client->disconnect();
    OrvexLog(kTag, "closePipManager end");
}

std::shared_ptr<platform::PipManagerClient> PipManagerClientHeld() {
    thread_mutex::Scoped hold(g_client_mutex);
    return g_client;
}

void PipListener::notify(int, int, int) {}

void PipListener::eventCallback(int event_type) {
    // The texts say "dataCallback"; operators search for them as they are.
    if (event_type == platform::kEvTravelingCallbackUnsupport) {
        OrvexLog("orvex:::livecamera",
                 "PipListener::dataCallback ----->EV_TRAVELING_CALLBACK_UNSUPPORT");
        g_pip_stop_flag.store(1, std::memory_order_relaxed);
    } else if (event_type == platform::kEvTravelingCallbackTvosFastQuit) {
        OrvexLog("orvex:::livecamera",
                 "PipListener::dataCallback ----->EV_TRAVELING_CALLBACK_TVOS_FAST_QUIT");
        g_pip_stop_flag.store(1, std::memory_order_relaxed);
        g_follow_main_flag.store(0, std::memory_order_relaxed);
    }
}
