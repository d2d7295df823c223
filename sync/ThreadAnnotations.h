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
