#pragma once

#include <cstdio>
#include <mutex>
#include <string>

#include "platform/LogPort.h"

namespace platform {
namespace host {

// The platform log on Linux: one line per text line, in logcat's threadtime layout
// ("MM-DD HH:MM:SS.mmm  PID  TID D tag: text"), to standard error (default), to syslog, or
// appended to a file. Thread contract: Write from any thread.
class HostLog final : public LogPort {
public:
    // `sink`: "stderr", "syslog" or "file:PATH"; anything else means standard error.
    explicit HostLog(const std::string& sink);
    ~HostLog() override;

    void Write(int buffer, int priority, const char* tag, const char* text) override;

private:
    enum class Sink { kStderr, kSyslog, kFile };
    void WriteLine(int priority, const char* tag, const char* line, size_t len);

    std::mutex mutex_;
    Sink sink_ = Sink::kStderr;
    FILE* file_ = nullptr;
};

// logcat's priority letter: V D I W E F, '?' for other values.
char PriorityLetter(int priority);

// One formatted line to the installed platform log under the host's tag ("orvex:::host"), cut
// at 511 characters. Debug priority is for what a person does not need to see.
void HostLogf(int priority, const char* format, ...) __attribute__((format(printf, 2, 3)));

}  // namespace host
}  // namespace platform
