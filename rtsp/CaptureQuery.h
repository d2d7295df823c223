#pragma once

#include <string>

#include "stream/CaptureChoice.h"

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
