// Arbitrary bytes as the host property file: parsed into keys and values, then looked up the
// way the service reads its properties (values cut to the platform's limit).
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string>

#include "platform/host/HostProperties.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    std::string text(reinterpret_cast<const char*>(data), size);
    auto values = platform::host::HostProperties::Parse(text);
    for (const auto& entry : values) {
        if (entry.first.empty() || entry.first[0] == '#') abort();
        if (entry.first.find('=') != std::string::npos) abort();
    }
    return 0;
}
