#include "rtsp/CaptureQuery.h"

#include <cctype>

#include "base/OrvexLog.h"
#include "config/LivecameraResolution.h"
#include "rtsp/KeyWordValue.h"
#include "rtsp/RequestFields.h"

namespace {

constexpr const char* kTag = "orvex:::RtspSession";

unsigned CameraCode(const std::string& v) {
    if (v == "hd0") return 5;
    if (v == "hd1") return 6;
    if (v == "hd2") return 7;
    if (v == "sd") return 3;
    return 0;
}

// "allwithoutosd" is 13 characters and query values are cut at 10, so code 2 cannot come
// from a URL; the comparison is kept as it is.
unsigned WindowCode(const std::string& v) {
    if (v == "sub") return 4;
    if (v == "main") return 6;
    if (v == "allwithosd") return 1;
    if (v == "allwithoutosd") return 2;
    return 0;
}

unsigned Number(const std::string& v) { return static_cast<unsigned>(LeadingInt(v).value_or(0)); }

}  // namespace

const char kCaptureKeysText[] =
    "width, height, cameraid, win, sub, dumpvideo, dumpaudio, specialcase, framerate";

CaptureQueryResult ApplyCaptureQuery(const std::string& query, std::string* missing_key) {
    static const char* kKeys[] = {"width=",     "height=",    "cameraid=",    "win=",      "sub=",
                                  "dumpvideo=", "dumpaudio=", "specialcase=", "framerate="};
    std::string values[9];
    for (int i = 0; i < 9; ++i) {
        values[i] = getKeyWordValue(kKeys[i], query);
        if (values[i] == "failed") {
            OrvexPrintLog(kTag, "get %s failed \n ", kKeys[i]);
            if (missing_key != nullptr) *missing_key = kKeys[i];
            return CaptureQueryResult::kMissingKey;
        }
    }
    int refused = set_video_resolution_support_more(
        Number(values[0]), Number(values[1]), CameraCode(values[2]), WindowCode(values[3]),
        Number(values[4]), Number(values[5]), Number(values[6]),
        values[7] == "followmain" ? 1u : 0u, Number(values[8]));
    return refused != 0 ? CaptureQueryResult::kRefused : CaptureQueryResult::kApplied;
}
