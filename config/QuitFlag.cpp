#include "config/QuitFlag.h"

#include <atomic>

namespace {
std::atomic<int*> g_quit_flag{nullptr};
}

extern "C" void set_live_quit_flag_var(void* flag) {
    g_quit_flag.store(static_cast<int*>(flag), std::memory_order_release);
}

void ClearLiveQuitFlag() {
    int* flag = g_quit_flag.load(std::memory_order_acquire);
    if (flag != nullptr) __atomic_store_n(flag, 0, __ATOMIC_RELAXED);
}
