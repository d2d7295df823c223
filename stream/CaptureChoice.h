#pragma once

#include <string>

namespace stream {

// The capture a consumer beside RTSP (a web viewer, the publisher) asks for, as a query from
// its '?' on: the capture keys `query` gives (a value of letters, digits and '_' only), the rest
// as tools/run.sh's URL has them. Any thread: a pure function.
std::string CaptureQueryFor(const std::string& query);
// The size a query as CaptureQueryFor makes it asks for (0 for a value that is not a number).
void CaptureQuerySize(const std::string& query, unsigned* width, unsigned* height);

// Who keeps capture running for consumers beside the RTSP clients: while any hold stands,
// capture runs (with the hold's choice when nobody else chose), and the last release stops it
// when no RTSP client watches. The RTSP listener is the one there is.
// Thread contract: any thread.
class CaptureDemand {
public:
    virtual ~CaptureDemand() = default;
    // `query` as CaptureQueryFor makes it.
    virtual void HoldCapture(const std::string& query) = 0;
    virtual void ReleaseCapture() = 0;
};

}  // namespace stream

// The C-style names the RTSP side has always used.
using stream::CaptureQueryFor;
using stream::CaptureQuerySize;
