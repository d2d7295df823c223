#pragma once

#include <atomic>

// Diagnostics of the service: every message goes to the platform log (system buffer, debug
// priority) under its tag, and is mirrored to standard output framed by newlines. Every stdout
// write below happens only where the platform log port shows the mirror (MirrorToStdout).
// Thread contract: every function may be called from any thread.

// The process-wide debug-print switch: starts at 0 and nothing in the service turns it on,
// so the output that depends on it stays off. Kept as a switch (tests turn it on).
extern std::atomic<unsigned char> g_orvex_debug_printf;
unsigned char GET_ORVEX_API_DEBUG_PRINTF();

// Platform log always; the framed stdout mirror only while the debug switch is on.
void OrvexLog(const char* tag, const char* fmt, ...) __attribute__((format(printf, 2, 3)));
// Platform log at the given priority, no stdout mirror.
void OrvexLogPriority(int priority, const char* tag, const char* fmt, ...)
    __attribute__((format(printf, 3, 4)));
// Platform log and the framed stdout mirror, always.
void OrvexPrintLog(const char* tag, const char* fmt, ...) __attribute__((format(printf, 2, 3)));
// Framed stdout only: "\n" text "\n".
void OrvexPrint(const char* fmt, ...) __attribute__((format(printf, 1, 2)));
// Framed stdout only, while the debug switch is on.
void OrvexDebugPrint(const char* fmt, ...) __attribute__((format(printf, 1, 2)));
// stdout exactly as formatted (no framing), while the debug switch is on: protocol traces.
void OrvexDebugRaw(const char* fmt, ...) __attribute__((format(printf, 1, 2)));
// stdout exactly as formatted, always.
void OrvexRaw(const char* fmt, ...) __attribute__((format(printf, 1, 2)));
// stdout as puts writes it: the text and one newline.
void OrvexPuts(const char* text);
// stdout as puts writes it, while the debug switch is on.
void OrvexDebugPuts(const char* text);
