#pragma once

#include <map>
#include <string>
#include <vector>

namespace platform {
namespace host {

// Every property key the service reads, the television's and the host's, in the order of the
// property table (config/PropertyTable.cpp). A key in the property file that is not among them
// does nothing, and is most likely misspelt.
const std::vector<std::string>& KnownPropertyKeys();

// The known key with the fewest single-character edits from `key` (the first such in the list).
std::string NearestKnownKey(const std::string& key);

// One warning line for each key of `values` that no part of the service reads, naming the
// nearest known one. Returns how many there were.
int WarnUnknownPropertyKeys(const std::map<std::string, std::string>& values,
                            const std::string& path);

}  // namespace host
}  // namespace platform
