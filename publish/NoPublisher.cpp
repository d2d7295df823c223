// The publisher's entry points in a build without it (the television's default, which has no
// muxing library): a kv.orvex.publish that asks for it is answered with one line.
#include <cstring>

#include "base/OrvexLog.h"
#include "platform/LogPort.h"
#include "platform/Ports.h"
#include "publish/Publisher.h"

void StartPublishing(stream::CaptureDemand*) {
    char value[platform::kPropertyValueMax] = {};
    platform::Properties().Get("kv.orvex.publish", value, "");
    if (value[strspn(value, " \t")] == '\0') return;
    OrvexLogPriority(platform::kLogWarn, "orvex:::publish",
                     "kv.orvex.publish is set, but this build has no publisher (docs/android.md "
                     "says how to build it in); nothing is published");
}

void StopPublishing() {}
