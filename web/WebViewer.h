#pragma once

#include <atomic>
#include <memory>
#include <string>
#include <thread>

#include "auth/AccessGate.h"
#include "config/Settings.h"
#include "stream/CaptureChoice.h"
#include "sync/thread_mutex.h"
#include "web/ConnectionWarden.h"
#include "web/FragmentRing.h"
#include "web/LiveMuxer.h"
#include "web/WhepEndpoint.h"

struct MHD_Daemon;
struct MHD_Connection;

// The web viewer: an HTTP server (libmicrohttpd, a thread per connection) that serves the
// player page at "/" and the live fMP4 stream at "/stream.mp4" to up to `max_viewers` viewers
// beside the RTSP clients. Each viewer holds capture as a playing RTSP client does; they all
// read one ring of fragments that the muxer fills from the frame tap, so a viewer that reads
// slowly skips ahead or is dropped without slowing capture or anyone else.
// Who may watch is judged by the RTSP listener's gate: one set of address rules, one lockout,
// the same Digest users.
// Thread contract: Start and Stop from the controlling thread; the rest runs on the server's
// threads.
class WebViewer {
public:
    struct Options {
        unsigned port = 8080;
        std::string bind;  // IPv4 address, empty for all
        int max_viewers = 16;
        size_t ring_bytes = 8u << 20;
        int start_wait_ms = 8000;      // how long a new viewer waits for the first key frame
        unsigned idle_timeout_s = 10;  // a connection that moves nothing for this long ends
        // Connections waiting for a request at once, and how long each may take to send it.
        int waiting_max = 32;
        unsigned request_deadline_ms = 5000;
        // Who may watch, for a viewer with a gate of its own (kv.orvex.allow, kv.orvex.auth).
        std::string allow;
        std::string auth_file;
    };

    // `gate`: who may watch, shared with the RTSP side; null makes the viewer a gate of its own,
    // configured from the options at Start. `whep`: WebRTC playback offered at /whep (null:
    // none); it must outlive the viewer's Stop.
    WebViewer(stream::CaptureDemand* transport, auth::AccessGate* gate, Options options,
              WhepEndpoint* whep = nullptr);
    ~WebViewer();
    WebViewer(const WebViewer&) = delete;
    WebViewer& operator=(const WebViewer&) = delete;

    // Listens and taps the frames; false
    // (one log line, nothing left open) when the port cannot be had.
    bool Start();
    void Stop();

    int viewers() const { return m_viewers->load(std::memory_order_relaxed); }
    unsigned port() const { return m_options.port; }

private:
    friend struct WebViewerCalls;  // libmicrohttpd's callbacks, in the source file

    stream::CaptureDemand* m_transport;
    Options m_options;
    FragmentRing m_ring;
    LiveMuxer m_muxer;
    MHD_Daemon* m_daemon = nullptr;
    bool m_tapped = false;
    std::unique_ptr<auth::AccessGate> m_own_gate;  // only without a shared one
    auth::AccessGate* m_gate;
    // Shared with the WebRTC sessions, which may end after the viewer has stopped.
    std::shared_ptr<std::atomic<int>> m_viewers = std::make_shared<std::atomic<int>>(0);
    WhepEndpoint* m_whep;
    std::atomic<bool> m_stopping{false};
    ConnectionWarden m_warden;
    std::thread m_sweeper;  // closes connections that did not send their request in time
    thread_mutex m_sweep_lock;
    thread_condition m_sweep_wake;
    std::atomic<uint32_t> m_crowd_logged_ms{0};  // one line per episode, not per connection
};

// The service's web viewer, started when the settings' kv.orvex.http names a port (unset: none,
// no port is opened), with kv.orvex.http.max viewers at once and kv.orvex.bind. Main thread.
void StartWebViewer(const config::Settings& settings, stream::CaptureDemand* transport,
                    auth::AccessGate* gate, WhepEndpoint* whep = nullptr);
void StopWebViewer();
// The port the service's web viewer listens on; 0 when there is none.
unsigned WebViewerPort();
