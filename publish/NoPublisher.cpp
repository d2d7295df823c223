// The publisher's entry points in a build without it (the television's default, which has no
// muxing library): a kv.orvex.publish that asks for it is answered with one line.
#include "base/OrvexLog.h"
#include "platform/LogPort.h"
#include "publish/Publisher.h"

void StartPublishing(const config::Settings& settings, stream::CaptureDemand*) {
    if (settings.publish.find_first_not_of(" \t") == std::string::npos) return;
    OrvexLogPriority(platform::kLogWarn, "orvex:::publish",
                     "kv.orvex.publish is set, but this build has no publisher (docs/android.md "
                     "says how to build it in); nothing is published");
}

void StopPublishing() {}
