#include "config/PlatformFlavour.h"

#include <cstring>

#include "platform/Ports.h"

PlatformFlavour ReadPlatformFlavour() {
    char value[platform::kPropertyValueMax] = {};
    platform::Properties().Get("kelvo.build.kelvotv", value, "");
    if (strcmp(value, "sa") == 0) return kFlavourSa;
    if (strcmp(value, "px") == 0) return kFlavourPx;
    if (strcmp(value, "dqx") == 0) return kFlavourDqx;
    return kFlavourUnknown;
}

PlatformFlavour PlatformFlavourCache::Get() {
    unsigned v = value_.load(std::memory_order_relaxed);
    if (v == kFlavourUnknown) {
        v = ReadPlatformFlavour();
        value_.store(v, std::memory_order_relaxed);
    }
    return static_cast<PlatformFlavour>(v);
}
