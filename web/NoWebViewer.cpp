// The web viewer's entry points in a build without it (the television's default, which has
// no HTTP library): a kv.orvex.http that asks for it is answered with one line, not a port.
#include "base/OrvexLog.h"
#include "platform/LogPort.h"
#include "web/WebViewer.h"

void StartWebViewer(const config::Settings& settings, stream::CaptureDemand*, auth::AccessGate*,
                    WhepEndpoint*) {
    if (settings.http_text.empty()) return;
    OrvexLogPriority(platform::kLogWarn, "orvex:::web",
                     "kv.orvex.http=%s: this build has no web viewer (docs/android.md says how "
                     "to build it in); no port is opened",
                     settings.http_text.c_str());
}

void StopWebViewer() {}
