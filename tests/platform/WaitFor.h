#pragma once

#include <chrono>
#include <thread>

// Polls `done` every 10 ms for at most `seconds`; true once it holds. For the host tests that
// wait on real threads and processes.
template <typename F>
bool WaitFor(F done, int seconds = 10) {
    const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(seconds);
    while (!done()) {
        if (std::chrono::steady_clock::now() > end) return false;
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    return true;
}
