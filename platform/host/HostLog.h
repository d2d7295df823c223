#pragma once

#include <atomic>
#include <cstdio>
#include <string>

#include "platform/LogPort.h"
#include "sync/thread_mutex.h"

namespace platform {
namespace host {

// The platform log on Linux: one line per text line, in logcat's threadtime layout
// ("MM-DD HH:MM:SS.mmm  PID  TID D tag: text"), to standard error (default), to syslog, or
// appended to a file. Lines below `least_priority` are left out; the service's stdout copy of
// its traces is printed only when debug lines are kept. Thread contract: Write from any thread.
class HostLog final : public LogPort {
public:
    // `sink`: "stderr", "syslog" or "file:PATH"; anything else means standard error.
    explicit HostLog(const std::string& sink, int least_priority = kLogDebug);
    ~HostLog() override;

    void Write(int buffer, int priority, const char* tag, const char* text) override;
    bool MirrorToStdout() const override {
        return least_priority_ <= kLogDebug || mirror_shown_.load(std::memory_order_relaxed);
    }
    // From now on the stdout copy is printed whatever the level.
    void ShowMirror() { mirror_shown_.store(true, std::memory_order_relaxed); }

private:
    enum class Sink { kStderr, kSyslog, kFile };
    void WriteLine(int priority, const char* tag, const char* line, size_t len);

    // Held for each whole line, so that lines of concurrent threads do not interleave on the
    // stream; the sink and its file are chosen by the constructor and fixed after.
    thread_mutex mutex_;
    Sink sink_ = Sink::kStderr;
    FILE* file_ = nullptr;
    const int least_priority_;
    std::atomic<bool> mirror_shown_{false};
};

// The least priority the host logs, from the first of these that is set: $ORVEX_LOG_LEVEL,
// the property orvex.host.log.level (verbose, debug, info, warn or error), and the
// television's kv.orvex.log (non-zero or "debug" turns on the capture's debug logging, which
// is only seen at debug). Otherwise info: the system's traces are debug lines a person does
// not need. An unknown level gives info and a sentence for the log in `complaint`.
int ChooseLogLevel(const char* env, const std::string& property, const std::string& kv_log,
                   std::string* complaint);

// logcat's priority letter: V D I W E F, '?' for other values.
char PriorityLetter(int priority);

// One formatted line to the installed platform log under the host's tag ("orvex:::host"), cut
// at 511 characters. Debug priority is for what a person does not need to see.
void HostLogf(int priority, const char* format, ...) __attribute__((format(printf, 2, 3)));

}  // namespace host
}  // namespace platform
