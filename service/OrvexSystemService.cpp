#include "service/OrvexSystemService.h"

#include <pthread.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>

#include "base/OrvexLog.h"
#include "base/ThreadName.h"
#include "config/GlobalConfig.h"
#include "config/QuitFlag.h"
#include "platform/Ports.h"
#include "service/OrvexService.h"
#include "sync/thread_mutex.h"

namespace {

// The spelling "sevice" is the tag operators filter on.
constexpr const char* kTag = "orvex:::startorvexsevice";

std::atomic<bool> g_service_run{false};
thread_mutex g_service_lock;  // with g_service_wake: ends a waiting service loop at once
thread_condition g_service_wake;
pthread_t g_service_thread{};
bool g_service_started = false;
std::atomic<bool> g_refused{false};

}  // namespace

int start_orvex_service_main(std::atomic<bool>* run) {
    platform::BinderPort& binder = platform::Binder();
    binder.initWithDriver("/dev/vndbinder");
    OrvexPrintLog(kTag, "OrvexServiceThread( ServiceManager: %p)", binder.defaultServiceManager());
    binder.startThreadPool();
    if (android::OrvexService::instantiate() == -EADDRINUSE) {
        // Another orvex would get this one's pictures, and its clients sound only; the port
        // said how to run two. The process ends as SIGTERM would end it.
        g_refused = true;
        ClearLiveQuitFlag();
        return -EADDRINUSE;
    }
    OrvexPuts("\n start orvex service ");
    OrvexLog(kTag, "\n start orvex service \n");
    Global_Config* config = Global_Config::instance();
    const useconds_t poll_us = config->run_flag_poll_us();
    if (config->wake_on_write()) {
        thread_mutex::Scoped hold(g_service_lock);
        while (run->load(std::memory_order_relaxed)) {
            g_service_wake.wait_for(g_service_lock, std::chrono::microseconds(poll_us));
        }
    } else {
        while (run->load(std::memory_order_relaxed)) usleep(poll_us);
    }
    OrvexPuts("\n end orvex service ");
    OrvexLog(kTag, "\n end orvex service \n");
    OrvexPrintLog(kTag, "OrvexServiceThread end");
    return 0;
}

void* start_orvex_service_thread(void*) {
    NameThisThread("orvex-service");
    OrvexPrintLog(kTag, "start_orvex_service_thread");
    start_orvex_service_main(&g_service_run);
    return nullptr;
}

int start_orvex_system_service() {
    OrvexPrintLog(kTag, "start_orvex_system_service");
    g_service_started = false;
    g_service_run = true;
    int rc = pthread_create(&g_service_thread, nullptr, start_orvex_service_thread, nullptr);
    if (rc != 0) {
        OrvexPrintLog(kTag, "start_orvex_system_service----------->thread_create create failed");
        return rc;
    }
    g_service_started = true;
    return 0;
}

void close_orvex_system_service() {
    OrvexPrintLog(kTag, "close_orvex_system_service");
    {
        thread_mutex::Scoped hold(g_service_lock);
        g_service_run = false;
    }
    g_service_wake.notify_all();
    if (g_service_started) pthread_join(g_service_thread, nullptr);
    g_service_started = false;
}

bool orvex_system_service_refused() { return g_refused.load(); }
