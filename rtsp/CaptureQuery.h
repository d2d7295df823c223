#pragma once

#include <string>

// The capture keys of an RTSP URL's query ("width=…&height=…&cameraid=…&win=…&sub=…&
// dumpvideo=…&dumpaudio=…&specialcase=…&framerate=…"), applied to the capture state.
// Thread contract: the RTSP listener's thread, which owns the capture state.
enum class CaptureQueryResult {
    kApplied,
    kMissingKey,  // a key is absent; logged with its name
    kRefused,     // the capture rules refused the values
};

CaptureQueryResult ApplyCaptureQuery(const std::string& query);
