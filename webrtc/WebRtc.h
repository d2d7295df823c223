#pragma once

#include "config/Settings.h"
#include "stream/CaptureChoice.h"
#include "web/WhepEndpoint.h"

// The service's WebRTC playback, started when the settings' kv.orvex.webrtc names a UDP port
// (unset: none, nothing is opened; a build without it says so in one line). Main thread: Start
// before the web viewer, which offers it at /whep, and Stop after the web viewer has stopped.
WhepEndpoint* StartWebRtc(const config::Settings& settings, stream::CaptureDemand* demand);
void StopWebRtc();
