#pragma once

#include <string>

#include "config/PropertyTable.h"

namespace config {

// The properties that take effect at start, typed, read once through the table
// (config/PropertyTable.h) and handed to the constructors and start functions that use them.
// Thread contract: a plain value; read it on one thread, then share it read-only.
struct Settings {
    std::string allow;      // kv.orvex.allow, as written (AccessGate parses it)
    std::string auth_file;  // kv.orvex.auth
    std::string bind;       // kv.orvex.bind: empty for every address
    bool bind_refused = false;
    unsigned http_port = 0;            // kv.orvex.http: 0 for no web viewer
    std::string http_text;             // as written, for a build without the web viewer
    int http_max = 16;                 // kv.orvex.http.max
    int webrtc_port = -1;              // kv.orvex.webrtc: -1 for no WebRTC, 0 for any free port
    std::string webrtc_text;           // as written, for a build without WebRTC
    std::string publish;               // kv.orvex.publish, as written (the publisher splits it)
    int audio_payload_type = 98;       // kv.orvex.audiopt
    bool wake_on_write = false;        // kv.orvex.wake=event
    bool report_latency = false;       // kv.orvex.latency=1
    bool audio_clock_samples = false;  // kv.orvex.audioclock=samples
    bool aac_inline = false;           // kv.orvex.aacenc=inline
};

// Reads every start-time property of the service from `port`, logging each refused value
// once as its entry says. Called once at start (skyvo_rtsp_sever_init), and by tests.
Settings ReadSettings(platform::PropertyPort& port);

// One property read now through the installed port, its refusal logged: the properties that
// take effect at the next PLAY (TakesEffect::kAtPlay, kAtFirstUse).
PropertyValue Reread(Property id);

}  // namespace config
