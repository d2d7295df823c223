#include "capture/CameraParameters.h"

void CameraParameters::unflatten(const std::string& flattened) {
    m_values.clear();
    size_t start = 0;
    while (start < flattened.size()) {
        size_t end = flattened.find(';', start);
        if (end == std::string::npos) end = flattened.size();
        std::string pair = flattened.substr(start, end - start);
        size_t eq = pair.find('=');
        if (eq != std::string::npos && eq > 0) set(pair.substr(0, eq), pair.substr(eq + 1));
        start = end + 1;
    }
}

std::string CameraParameters::flatten() const {
    std::string out;
    for (const auto& kv : m_values) {
        if (!out.empty()) out += ';';
        out += kv.first + "=" + kv.second;
    }
    return out;
}

void CameraParameters::set(const std::string& key, const std::string& value) {
    // '=' and ';' would break the flattened form: such a key or value is not stored.
    if (key.find_first_of("=;") != std::string::npos || value.find(';') != std::string::npos)
        return;
    for (auto& kv : m_values) {
        if (kv.first == key) {
            kv.second = value;
            return;
        }
    }
    m_values.emplace_back(key, value);
}

void CameraParameters::set(const std::string& key, int value) { set(key, std::to_string(value)); }

std::string CameraParameters::get(const std::string& key) const {
    for (const auto& kv : m_values) {
        if (kv.first == key) return kv.second;
    }
    return "";
}
