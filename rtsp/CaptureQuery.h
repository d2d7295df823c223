#pragma once

#include <string>

// The capture keys of an RTSP URL's query ("width=…&height=…&cameraid=…&win=…&sub=…&
// dumpvideo=…&dumpaudio=…&specialcase=…&framerate=…"), applied to the capture state.
// Thread contract: the RTSP listener's thread, which owns the capture state.
enum class CaptureQueryResult {
    kApplied,
    kMissingKey,  // a key is absent; traced with its name, given in `missing_key`
    kRefused,     // the capture rules refused the values
};

CaptureQueryResult ApplyCaptureQuery(const std::string& query, std::string* missing_key = nullptr);

// The capture keys as a person reads them: "width, height, ..., framerate".
extern const char kCaptureKeysText[];

// The capture a consumer beside RTSP (a web viewer, the publisher) asks for, as a query from
// its '?' on: the capture keys `query` gives (a value of letters, digits and '_' only), the
// rest as tools/run.sh's URL has them. Any thread: a pure function.
std::string CaptureQueryFor(const std::string& query);
// The size a query as CaptureQueryFor makes it asks for (0 for a value that is not a number).
void CaptureQuerySize(const std::string& query, unsigned* width, unsigned* height);
