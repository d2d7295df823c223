#include "rtsp/RtspAccess.h"

#include "rtsp/RtspResponse.h"

namespace {

std::string_view Word(std::string_view line, int index) {
    for (;;) {
        while (!line.empty() && (line.front() == ' ' || line.front() == '\t'))
            line.remove_prefix(1);
        size_t end = line.find_first_of(" \t");
        if (index-- == 0) return line.substr(0, end);
        if (end == std::string_view::npos) return {};
        line.remove_prefix(end);
    }
}

bool IsBlank(char c) { return c == ' ' || c == '\t'; }

}  // namespace

std::optional<std::string> AuthorizationOf(const std::vector<std::string>& lines, bool* repeated) {
    static constexpr std::string_view kName = "authorization";
    std::optional<std::string> value;
    *repeated = false;
    for (size_t i = 1; i < lines.size(); ++i) {
        std::string_view line = lines[i];
        if (line.size() <= kName.size() || line[kName.size()] != ':') continue;
        bool same = true;
        for (size_t k = 0; k < kName.size() && same; ++k) {
            same = static_cast<char>(tolower(static_cast<unsigned char>(line[k]))) == kName[k];
        }
        if (!same) continue;
        if (value) *repeated = true;
        line.remove_prefix(kName.size() + 1);
        while (!line.empty() && IsBlank(line.front())) line.remove_prefix(1);
        while (!line.empty() && (IsBlank(line.back()) || line.back() == '\r'))
            line.remove_suffix(1);
        value = std::string(line);
    }
    return value;
}

auth::AccessDecision JudgeRtspRequest(auth::AccessGate& gate, const std::vector<std::string>& lines,
                                      int method_code, uint32_t address, const std::string& text) {
    bool repeated = false;
    std::optional<std::string> header = AuthorizationOf(lines, &repeated);
    std::string_view request_line = lines.empty() ? std::string_view() : lines[0];
    auth::AccessRequest request;
    request.method = Word(request_line, 0);
    request.uri = Word(request_line, 1);
    request.authorization = header ? &*header : nullptr;
    request.repeated_authorization = repeated;
    request.exempt = method_code == kRtspOptions;
    request.address = address;
    request.address_text = text;
    return gate.Judge(request);
}
