#include "base/OrvexLog.h"

#include <cstdarg>
#include <cstdio>
#include <cstring>

#include "platform/Ports.h"

std::atomic<unsigned char> g_orvex_debug_printf{0};

unsigned char GET_ORVEX_API_DEBUG_PRINTF() {
    return g_orvex_debug_printf.load(std::memory_order_relaxed);
}

namespace {

// Longer messages are cut; the platform log truncates long lines the same way.
constexpr size_t kMessageMax = 2048;

struct Message {
    char text[kMessageMax];
};

void Format(Message& m, const char* fmt, va_list args) {
    int n = vsnprintf(m.text, sizeof m.text, fmt, args);
    if (n < 0) m.text[0] = '\0';
}

// One fwrite per message so that lines of concurrent threads do not interleave.
void WriteStdout(const char* prefix, const char* text, const char* suffix) {
    if (!platform::Log().MirrorToStdout()) return;
    char framed[kMessageMax + 4];
    int n = snprintf(framed, sizeof framed, "%s%s%s", prefix, text, suffix);
    if (n < 0) return;
    size_t len =
        static_cast<size_t>(n) < sizeof framed ? static_cast<size_t>(n) : sizeof framed - 1;
    fwrite(framed, 1, len, stdout);
    fflush(stdout);
}

// va_start must run in the variadic function itself, hence a macro.
#define FORMAT_ARGS(m, fmt)   \
    Message m;                \
    do {                      \
        va_list args;         \
        va_start(args, fmt);  \
        Format(m, fmt, args); \
        va_end(args);         \
    } while (0)

void ToLog(int priority, const char* tag, const char* text) {
    platform::Log().Write(platform::kLogIdSystem, priority, tag, text);
}

}  // namespace

void OrvexLog(const char* tag, const char* fmt, ...) {
    FORMAT_ARGS(m, fmt);
    ToLog(platform::kLogDebug, tag, m.text);
    if (GET_ORVEX_API_DEBUG_PRINTF() == 1) WriteStdout("\n", m.text, "\n");
}

void OrvexLogPriority(int priority, const char* tag, const char* fmt, ...) {
    FORMAT_ARGS(m, fmt);
    ToLog(priority, tag, m.text);
}

void OrvexPrintLog(const char* tag, const char* fmt, ...) {
    FORMAT_ARGS(m, fmt);
    ToLog(platform::kLogDebug, tag, m.text);
    WriteStdout("\n", m.text, "\n");
}

void OrvexPrint(const char* fmt, ...) {
    FORMAT_ARGS(m, fmt);
    WriteStdout("\n", m.text, "\n");
}

void OrvexDebugPrint(const char* fmt, ...) {
    if (GET_ORVEX_API_DEBUG_PRINTF() != 1) return;
    FORMAT_ARGS(m, fmt);
    WriteStdout("\n", m.text, "\n");
}

void OrvexDebugRaw(const char* fmt, ...) {
    if (GET_ORVEX_API_DEBUG_PRINTF() != 1) return;
    FORMAT_ARGS(m, fmt);
    WriteStdout("", m.text, "");
}

void OrvexRaw(const char* fmt, ...) {
    FORMAT_ARGS(m, fmt);
    WriteStdout("", m.text, "");
}

void OrvexPuts(const char* text) { WriteStdout("", text, "\n"); }

void OrvexDebugPuts(const char* text) {
    if (GET_ORVEX_API_DEBUG_PRINTF() == 1) OrvexPuts(text);
}
