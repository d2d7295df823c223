#include "platform/android/AndroidLog.h"

#include <log/log.h>

namespace platform {
namespace android_port {

void AndroidLog::Write(int buffer, int priority, const char* tag, const char* text) {
    // The text is already formatted; "%s" keeps a stray '%' in it from being interpreted.
    __android_log_buf_print(buffer, priority, tag, "%s", text != nullptr ? text : "");
}

}  // namespace android_port
}  // namespace platform
