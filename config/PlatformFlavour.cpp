#include "config/PlatformFlavour.h"

#include "config/Settings.h"

PlatformFlavour ReadPlatformFlavour() {
    // The table's choices are in the order of PlatformFlavour, after kFlavourUnknown.
    return static_cast<PlatformFlavour>(config::Reread(config::Property::kFlavour).number);
}

PlatformFlavour PlatformFlavourCache::Get() {
    unsigned v = value_.load(std::memory_order_relaxed);
    if (v == kFlavourUnknown) {
        v = ReadPlatformFlavour();
        value_.store(v, std::memory_order_relaxed);
    }
    return static_cast<PlatformFlavour>(v);
}
