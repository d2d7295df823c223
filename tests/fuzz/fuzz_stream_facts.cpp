// Arbitrary bytes as an entering frame and as a viewer's query: the stream's facts take what
// stands before the first slice and describe it as SDP text; a query becomes the nine capture
// keys with values of letters, digits and '_' only, whatever it held.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string>

#include "stream/CaptureChoice.h"
#include "stream/StreamFacts.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    static stream::StreamFacts facts;
    facts.Note(data, size, 1);
    stream::StreamFacts::Video video;
    if (facts.Get(&video)) {
        if (video.width == 0 || video.height == 0) abort();
        for (char c : stream::LiveH264Fmtp(video)) {
            if (c < 0x20 || c > 0x7e) abort();  // one SDP line, no control bytes
        }
    }
    const std::string query =
        stream::CaptureQueryFor(std::string(reinterpret_cast<const char*>(data), size));
    int keys = 0;
    for (size_t i = 1; i < query.size(); ++i) {
        const char c = query[i];
        if (c == '&') ++keys;
        if (!(isalnum(static_cast<unsigned char>(c)) || c == '_' || c == '=' || c == '&')) abort();
    }
    if (query[0] != '?' || keys != 8) abort();
    unsigned width = 0, height = 0;
    stream::CaptureQuerySize(query, &width, &height);
    return 0;
}
