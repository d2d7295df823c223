#include "platform/host/KnownProperties.h"

#include <algorithm>

#include "platform/LogPort.h"
#include "platform/host/HostLog.h"

namespace platform {
namespace host {

const std::vector<std::string>& KnownPropertyKeys() {
    // The property table's keys, in its order, listed at build time (cmake/PropertyKeys.cmake).
    static const std::vector<std::string> keys = {
#include "PropertyKeys.inc"
    };
    return keys;
}

namespace {

// Levenshtein distance, two rows.
size_t Distance(const std::string& a, const std::string& b) {
    std::vector<size_t> previous(b.size() + 1), current(b.size() + 1);
    for (size_t j = 0; j <= b.size(); ++j) previous[j] = j;
    for (size_t i = 1; i <= a.size(); ++i) {
        current[0] = i;
        for (size_t j = 1; j <= b.size(); ++j) {
            size_t substitute = previous[j - 1] + (a[i - 1] == b[j - 1] ? 0 : 1);
            current[j] = std::min({previous[j] + 1, current[j - 1] + 1, substitute});
        }
        std::swap(previous, current);
    }
    return previous[b.size()];
}

}  // namespace

std::string NearestKnownKey(const std::string& key) {
    const std::vector<std::string>& keys = KnownPropertyKeys();
    std::string best;
    size_t best_distance = static_cast<size_t>(-1);
    for (const std::string& k : keys) {
        size_t d = Distance(key, k);
        if (d < best_distance) {
            best_distance = d;
            best = k;
        }
    }
    return best;
}

int WarnUnknownPropertyKeys(const std::map<std::string, std::string>& values,
                            const std::string& path) {
    const std::vector<std::string>& keys = KnownPropertyKeys();
    int unknown = 0;
    for (const auto& entry : values) {
        if (std::find(keys.begin(), keys.end(), entry.first) != keys.end()) continue;
        ++unknown;
        HostLogf(kLogWarn, "%s: no part of orvex reads the property \"%s\"; did you mean \"%s\"?",
                 path.c_str(), entry.first.c_str(), NearestKnownKey(entry.first).c_str());
    }
    return unknown;
}

}  // namespace host
}  // namespace platform
