#include "base/Clocks.h"

#include <time.h>

#include <cstdio>
#include <cstdlib>

unsigned GetTimeHeartbeatSec() {
    char line[100] = {};
    FILE* f = fopen("/proc/uptime", "r");
    if (f != nullptr) {
        char* got = fgets(line, sizeof line, f);
        fclose(f);
        if (got != nullptr) return static_cast<unsigned>(atof(line));
    }
    timespec ts{};
    clock_gettime(CLOCK_BOOTTIME, &ts);
    return static_cast<unsigned>(ts.tv_sec);
}

unsigned MillisecondsOf(int64_t seconds, long nanoseconds) {
    // Unsigned arithmetic: the result wraps modulo 2^32 like the 32-bit stamps it feeds.
    return static_cast<unsigned>(static_cast<uint64_t>(seconds) * 1000u +
                                 static_cast<uint64_t>(nanoseconds / 1000000));
}

unsigned GetTimeStampMillsec() {
    timespec ts{};
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return MillisecondsOf(ts.tv_sec, ts.tv_nsec);
}
