#pragma once

#include <string>
#include <utility>
#include <vector>

// A camera's parameters as the camera flattens them: "key=value;key=value". Setting a key
// keeps its place; a new key goes last. Thread contract: NOT thread safe; a value type.
class CameraParameters {
public:
    CameraParameters() = default;
    explicit CameraParameters(const std::string& flattened) { unflatten(flattened); }

    void unflatten(const std::string& flattened);
    std::string flatten() const;
    void set(const std::string& key, const std::string& value);
    void set(const std::string& key, int value);
    // The value, or an empty string when the key is absent.
    std::string get(const std::string& key) const;

private:
    std::vector<std::pair<std::string, std::string>> m_values;
};
