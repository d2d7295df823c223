#pragma once

#include <cstdint>

// The program's two clocks. They sit below the configuration so that the frame ring can stamp
// items without reaching up to it; GlobalConfig.h declares them too, through this header.
// Thread contract: every function may be called from any thread.

// Whole seconds since boot ("/proc/uptime"; the boot-time clock when that cannot be read).
unsigned GetTimeHeartbeatSec();
// Milliseconds of the monotonic clock, wrapping modulo 2^32 (about 49.7 days).
unsigned GetTimeStampMillsec();
// The arithmetic of GetTimeStampMillsec, for any clock reading.
unsigned MillisecondsOf(int64_t seconds, long nanoseconds);
