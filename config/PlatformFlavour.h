#pragma once

#include <atomic>

// Which vendor interfaces the television offers, from the property "kelvo.build.kelvotv".
enum PlatformFlavour : unsigned {
    kFlavourUnknown = 0,
    kFlavourSa = 1,
    kFlavourPx = 2,
    kFlavourDqx = 3,
};

// Reads the property now: "sa", "px" and "dqx" (exact, case-sensitive) or unknown.
PlatformFlavour ReadPlatformFlavour();

// A module's own cached flavour: an unknown value is looked up again at the next use.
// Thread contract: Get and Forget may be called from any thread.
class PlatformFlavourCache {
public:
    PlatformFlavour Get();
    // Back to unknown (tests, and a module that must look again).
    void Forget() { value_.store(kFlavourUnknown, std::memory_order_relaxed); }

private:
    std::atomic<unsigned> value_{kFlavourUnknown};
};
