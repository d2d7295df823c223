#pragma once

#include <pthread.h>

// Names the calling thread (15 characters at most), so that top -H, perf and debuggers tell
// the service's threads apart.
inline void NameThisThread(const char* name) { pthread_setname_np(pthread_self(), name); }
