#pragma once

// Port to the platform log (Android: __android_log_buf_print on a log buffer).
// Thread contract: Write may be called from any thread at any time.

namespace platform {

// Values as the Android log headers number them.
constexpr int kLogIdSystem = 3;  // LOG_ID_SYSTEM
constexpr int kLogDebug = 3;     // ANDROID_LOG_DEBUG
constexpr int kLogInfo = 4;      // ANDROID_LOG_INFO
constexpr int kLogWarn = 5;      // ANDROID_LOG_WARN
constexpr int kLogError = 6;     // ANDROID_LOG_ERROR

class LogPort {
public:
    virtual ~LogPort() = default;
    // `text` is fully formatted; the port adds no formatting of its own.
    virtual void Write(int buffer, int priority, const char* tag, const char* text) = 0;
    // Whether the service's framed copy of its traces on standard output is printed. The
    // television's console shows it; the host leaves it out unless asked for debug output.
    virtual bool MirrorToStdout() const { return true; }
};

}  // namespace platform
