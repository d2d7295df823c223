// Arbitrary bytes straight into one reader of request fields, chosen at build time
// (ORVEX_FIELD), so that each reader gets a fuzzer and a corpus of its own.
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "rtsp/KeyWordValue.h"
#include "rtsp/RequestFields.h"

namespace {

[[maybe_unused]] void ReadTrack(std::string_view in) {
    std::optional<std::string> stream = StreamNameOf(in);
    TrackIndexOf(stream ? std::string_view(*stream) : in);
}

[[maybe_unused]] void ReadTransport(std::string_view in) {
    std::vector<std::string> lines;
    size_t start = 0;
    for (size_t end; (end = in.find('\n', start)) != std::string_view::npos; start = end + 1) {
        lines.emplace_back(in.substr(start, end - start));
    }
    lines.emplace_back(in.substr(start));
    std::optional<std::string> transport = HeaderValueOf(lines, "Transport");
    if (!transport) return;
    PortPairOf(*transport, "client_port=");
    PortPairOf(*transport, "interleaved=");
}

[[maybe_unused]] void ReadCSeq(std::string_view in) {
    CSeqOf(in);
    LeadingInt(in);
}

[[maybe_unused]] void ReadSession(std::string_view in) {
    RequestMethodOf(in);
    std::optional<std::string> url = MrlOf(in);
    std::string_view u = url ? std::string_view(*url) : in;
    SessionNameOf(u);
    StreamNameOf(u);
    UrlAfterHostOf(u);
}

[[maybe_unused]] void ReadQuery(std::string_view in) {
    static const char* kKeys[] = {"width=",     "height=",    "cameraid=",    "win=",      "sub=",
                                  "dumpvideo=", "dumpaudio=", "specialcase=", "framerate="};
    for (const char* key : kKeys) LeadingInt(getKeyWordValue(key, std::string(in)));
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    std::string_view in(reinterpret_cast<const char*>(data), size);
    ORVEX_FIELD(in);
    return 0;
}
