#pragma once

#include <string>

#include "platform/host/capture/HostSources.h"

namespace platform {
namespace host {

// What a person needs to know once the service listens, in one log line: what it captures
// and where to watch, e.g. "serving picture: test pattern, sound: 1 kHz tone at
// rtsp://192.168.1.20:554/skyvo.0 and http://192.168.1.20:8080/". `http_port` 0: no web viewer.
// `access`, when not empty, is appended after "; " (who may watch). A pure function.
std::string StartLine(const SourceChoice& video, const SourceChoice& audio,
                      const std::string& address, unsigned rtsp_port, unsigned http_port,
                      const std::string& access);

// The address other machines reach this one at: `bind` when it names one address, else the
// source address of the route out (no packet is sent), else 127.0.0.1.
std::string ReachableAddress(const std::string& bind);

}  // namespace host
}  // namespace platform
