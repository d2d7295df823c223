#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "auth/AccessGate.h"

// The value of the one "Authorization:" header of a request, if any; `*repeated` is set when
// there are several.
std::optional<std::string> AuthorizationOf(const std::vector<std::string>& lines, bool* repeated);

// The gate's verdict on one RTSP request: `lines` are its lines, `method_code` its RtspMethod
// (OPTIONS needs no credentials).
auth::AccessDecision JudgeRtspRequest(auth::AccessGate& gate, const std::vector<std::string>& lines,
                                      int method_code, uint32_t address, const std::string& text);
