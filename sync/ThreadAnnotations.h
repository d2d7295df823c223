#pragma once

// Clang thread-safety analysis (-Wthread-safety); empty for other compilers.
#if defined(__clang__)
#define ORVEX_TSA(x) __attribute__((x))
#else
#define ORVEX_TSA(x)
#endif

#define ORVEX_CAPABILITY(x) ORVEX_TSA(capability(x))
#define ORVEX_SCOPED_CAPABILITY ORVEX_TSA(scoped_lockable)
#define ORVEX_GUARDED_BY(x) ORVEX_TSA(guarded_by(x))
#define ORVEX_ACQUIRE(...) ORVEX_TSA(acquire_capability(__VA_ARGS__))
#define ORVEX_RELEASE(...) ORVEX_TSA(release_capability(__VA_ARGS__))
#define ORVEX_REQUIRES(...) ORVEX_TSA(requires_capability(__VA_ARGS__))
// For a function the analysis cannot follow, such as a predicate a waiter calls under its lock;
// its contract says which lock it runs under.
#define ORVEX_NO_THREAD_SAFETY_ANALYSIS ORVEX_TSA(no_thread_safety_analysis)
