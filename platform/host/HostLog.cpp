#include "platform/host/HostLog.h"

#include <sys/syscall.h>
#include <sys/time.h>
#include <syslog.h>
#include <unistd.h>

#include <strings.h>

#include <cstdarg>
#include <cstdlib>
#include <cstring>
#include <ctime>

#include "platform/Ports.h"
#include "sync/thread_mutex.h"

namespace platform {
namespace host {

char PriorityLetter(int priority) {
    static const char kLetters[] = "??VDIWEF";  // 2 verbose ... 7 fatal
    return priority >= 2 && priority <= 7 ? kLetters[priority] : '?';
}

int ChooseLogLevel(const char* env, const std::string& property, const std::string& kv_log,
                   std::string* complaint) {
    static const struct {
        const char* name;
        int priority;
    } kLevels[] = {{"verbose", 2},     {"debug", kLogDebug},  {"info", kLogInfo},
                   {"warn", kLogWarn}, {"warning", kLogWarn}, {"error", kLogError}};
    const bool from_env = env != nullptr && env[0] != '\0';
    const std::string text = from_env ? env : property;
    if (text.empty()) {
        return kv_log == "debug" || atoi(kv_log.c_str()) != 0 ? kLogDebug : kLogInfo;
    }
    for (const auto& level : kLevels) {
        if (strcasecmp(text.c_str(), level.name) == 0) return level.priority;
    }
    if (complaint != nullptr) {
        *complaint = std::string(from_env ? "ORVEX_LOG_LEVEL" : "orvex.host.log.level") + "=\"" +
                     text + "\" is not debug, info, warn or error; logging at info";
    }
    return kLogInfo;
}

HostLog::HostLog(const std::string& sink, int least_priority) : least_priority_(least_priority) {
    if (sink == "syslog") {
        sink_ = Sink::kSyslog;
        openlog("orvex", LOG_PID, LOG_DAEMON);
    } else if (sink.compare(0, 5, "file:") == 0) {
        file_ = fopen(sink.c_str() + 5, "a");
        if (file_ != nullptr) {
            sink_ = Sink::kFile;
        } else {
            fprintf(stderr, "orvex: cannot open log file %s: %s; logging to stderr\n",
                    sink.c_str() + 5, strerror(errno));
        }
    }
}

HostLog::~HostLog() {
    if (file_ != nullptr) fclose(file_);
    if (sink_ == Sink::kSyslog) closelog();
}

void HostLog::Write(int, int priority, const char* tag, const char* text) {
    if (priority < least_priority_) return;
    if (tag == nullptr) tag = "";
    if (text == nullptr) text = "";
    // The service frames many texts with newlines; each non-empty line becomes one entry.
    bool wrote = false;
    const char* p = text;
    while (*p != '\0') {
        const char* nl = strchr(p, '\n');
        size_t len = nl != nullptr ? static_cast<size_t>(nl - p) : strlen(p);
        if (len > 0) {
            WriteLine(priority, tag, p, len);
            wrote = true;
        }
        if (nl == nullptr) break;
        p = nl + 1;
    }
    if (!wrote) WriteLine(priority, tag, "", 0);
}

void HostLog::WriteLine(int priority, const char* tag, const char* line, size_t len) {
    int n = len > 4000 ? 4000 : static_cast<int>(len);
    if (sink_ == Sink::kSyslog) {
        int level = priority >= 6 ? LOG_ERR : priority == 5 ? LOG_WARNING : LOG_DEBUG;
        syslog(level, "%s: %.*s", tag, n, line);
        return;
    }
    timeval tv{};
    gettimeofday(&tv, nullptr);
    tm local{};
    localtime_r(&tv.tv_sec, &local);
    char when[32];
    strftime(when, sizeof when, "%m-%d %H:%M:%S", &local);
    thread_mutex::Scoped hold(mutex_);
    FILE* out = sink_ == Sink::kFile ? file_ : stderr;
    fprintf(out, "%s.%03ld %5d %5ld %c %s: %.*s\n", when, static_cast<long>(tv.tv_usec / 1000),
            static_cast<int>(getpid()), static_cast<long>(syscall(SYS_gettid)),
            PriorityLetter(priority), tag, n, line);
    fflush(out);
}

void HostLogf(int priority, const char* format, ...) {
    char text[512];
    va_list args;
    va_start(args, format);
    vsnprintf(text, sizeof text, format, args);
    va_end(args);
    Log().Write(kLogIdSystem, priority, "orvex:::host", text);
}

}  // namespace host
}  // namespace platform
