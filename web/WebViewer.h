#pragma once

#include <atomic>
#include <memory>
#include <string>

#include "media/thread_mutex.h"
#include "rtsp/RtspAccess.h"
#include "web/FragmentRing.h"
#include "web/LiveMuxer.h"

class RtspTransport;
struct MHD_Daemon;
struct MHD_Connection;

// The web viewer: an HTTP server (libmicrohttpd, a thread per connection) that serves the
// player page at "/" and the live fMP4 stream at "/stream.mp4" to up to `max_viewers` viewers
// beside the RTSP clients. Each viewer holds capture as a playing RTSP client does; they all
// read one ring of fragments that the muxer fills from the frame tap, so a viewer that reads
// slowly skips ahead or is dropped without slowing capture or anyone else.
// Who may watch is judged as for RTSP: the same address rules, lockout and Digest users.
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
    };

    WebViewer(RtspTransport* transport, Options options);
    ~WebViewer();
    WebViewer(const WebViewer&) = delete;
    WebViewer& operator=(const WebViewer&) = delete;

    // Reads who may watch (kv.orvex.allow, kv.orvex.auth), listens and taps the frames; false
    // (one log line, nothing left open) when the port cannot be had.
    bool Start();
    void Stop();

    RtspAccess& access() { return m_access; }
    int viewers() const { return m_viewers.load(std::memory_order_relaxed); }
    unsigned port() const { return m_options.port; }

private:
    friend struct WebViewerCalls;  // libmicrohttpd's callbacks, in the source file

    RtspTransport* m_transport;
    Options m_options;
    FragmentRing m_ring;
    LiveMuxer m_muxer;
    MHD_Daemon* m_daemon = nullptr;
    bool m_tapped = false;
    thread_mutex m_access_lock;  // RtspAccess is not thread safe; connections come in parallel
    RtspAccess m_access ORVEX_GUARDED_BY(m_access_lock);
    std::atomic<int> m_viewers{0};
    std::atomic<bool> m_stopping{false};
};

// The service's web viewer, started when kv.orvex.http names a port (unset: none, no port is
// opened). kv.orvex.http.max: viewers at once (default 16). Main thread.
void StartWebViewer(RtspTransport* transport);
void StopWebViewer();
// The port the service's web viewer listens on; 0 when there is none.
unsigned WebViewerPort();
