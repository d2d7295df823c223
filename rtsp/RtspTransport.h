#pragma once

#include <netinet/in.h>
#include <pthread.h>
#include <sys/select.h>

#include <atomic>
#include <map>
#include <memory>
#include <set>
#include <string>

#include "buffers/cycle_buffer.h"
#include "media/MediaSessionList.h"
#include "platform/UniqueFd.h"
#include "rtsp/RtspAccess.h"
#include "stream/CaptureChoice.h"
#include "sync/thread_mutex.h"

class RtspSession;

// Stops capture and both send threads, forgets every RTP destination, empties the send rings
// and puts the TV settings back. Any departing client does this for all.
void CloseVideoAndAudioDecodeAndSend();

// The RTSP server: the listening socket, one listener thread that multiplexes it and every
// client connection, at most five clients (one per IPv4 address), the two media rings, and
// the rules that start capture with the first PLAY and stop it when a client goes away.
// A client whose connection becomes readable is served exclusively until it leaves.
// Thread contract: Open and CloseAll from the controlling thread; the add_* producers from any
// threads (the rings' producer contract, buffers/cycle_buffer.h); HoldCapture, ReleaseCapture and
// Wake from any thread; everything else runs on the listener thread.
class RtspTransport : public MediaSessionList, public stream::CaptureDemand {
public:
    RtspTransport();
    ~RtspTransport() override;

    bool Open(const char* ip, unsigned port, unsigned extra);
    static void* StartListenThread(void* self);
    bool Close();
    void CloseAll();

    // 1 when the frame was stored, 0 when it was dropped after three tries 1 ms apart.
    int skyvo_add_h264_data(unsigned char* data, unsigned len);
    int skyvo_add_mp3_data(unsigned char* data, unsigned len, unsigned timestamp);

    cycle_buffer& video_ring() { return m_video_ring; }
    cycle_buffer& audio_ring() { return m_audio_ring; }
    int client_count() const { return m_client_count.load(std::memory_order_relaxed); }
    int listen_port() const;

    // Who may watch; configure it before Open starts the listener.
    auth::AccessGate& access() { return m_access; }

    // The listener's select wait, two seconds in service. Tests shorten it.
    static void SetSelectWaitMs(int ms);

    // Consumers beside RTSP (web viewers, the publisher) hold capture as a playing client does:
    // while any hold stands, the listener starts capture within a second whenever it is not
    // running (also after a departing RTSP client stopped it for all), and the last release
    // stops it when no RTSP client is connected. `query` carries capture keys as an RTSP URL's
    // query does, from its '?' on; the listener applies it when no RTSP client is connected (empty:
    // keep the current choice). Any thread. With no hold ever taken the listener behaves as before.
    void HoldCapture(const std::string& query) override;
    void ReleaseCapture() override;
    int capture_holders() const { return m_capture_holders.load(std::memory_order_relaxed); }
    // Listener rounds completed so far, so that a test can wait for rounds to pass.
    unsigned rounds() const { return m_rounds.load(std::memory_order_relaxed); }
    // Ends the listener's current select wait. Any thread; the first call opens the pipe.
    void Wake();

    int ProcessNewIncomingRtspSession(int listenFd, fd_set& ready, int& maxFd);
    int ProcessReadRtspSession(fd_set& ready);
    int ProcessDelRtspSession(int fd);
    int ProcessDelRtspSessionOther(int fd);
    int FindSameIpFromMap(std::map<int, std::string>& addresses, const char* ip);

private:
    void ListenThread();
    void ServePipRestart();
    void StartStreaming(int fd);
    void StartCaptureAndSend();
    void ServeCaptureHolders();
    void DrainWake();

    std::string m_address;
    unsigned m_port = 0;
    unsigned m_extra = 0;
    platform::UniqueFd m_listen_fd;
    auth::AccessGate m_access;
    sockaddr_in m_listen_addr{};
    int m_opened = 0;
    std::map<int, std::unique_ptr<RtspSession>> m_sessions;
    // Drops a client's session, forgetting its descriptor first (see m_client_fds).
    void DropSession(std::map<int, std::unique_ptr<RtspSession>>::iterator it);
    // The client connections, for a stop from another thread to end the listener's wait on
    // one. A descriptor leaves the set before its session closes it, under the lock, so the
    // stop never reaches a descriptor number that was reused.
    thread_mutex m_clients_lock;
    std::set<int> m_client_fds ORVEX_GUARDED_BY(m_clients_lock);
    cycle_buffer m_audio_ring{500000};
    cycle_buffer m_video_ring{8000000};
    pthread_t m_thread{};
    bool m_thread_started = false;
    std::atomic<int> m_running{0};
    std::atomic<int> m_client_count{0};
    std::map<int, std::string> m_addresses;
    // PIP restart: a reopen pending, its countdown in listener rounds, and the reopened mark.
    bool m_reopen_pending = false;
    int m_reopen_countdown = 3;
    int m_reopened = 0;
    // Capture holds; the query of the latest hold waits for the listener under its lock.
    std::atomic<int> m_capture_holders{0};
    std::atomic<unsigned> m_rounds{0};
    bool m_held = false;  // listener thread: holds were seen, so their end may stop capture
    thread_mutex m_hold_lock;
    std::string m_hold_query ORVEX_GUARDED_BY(m_hold_lock);
    bool m_hold_query_pending ORVEX_GUARDED_BY(m_hold_lock) = false;
    unsigned m_hold_query_ms ORVEX_GUARDED_BY(m_hold_lock) = 0;  // when it became pending
    // Self-pipe in the select set, opened on first use so that a listener nobody wakes keeps
    // its descriptors as they were.
    thread_mutex m_wake_lock;
    std::atomic<int> m_wake_read{-1};
    std::atomic<int> m_wake_write{-1};
};

// Capture runs (1) from the first PLAY of a single client until any client leaves.
extern std::atomic<int> g_capture_running;
// Accepts that found no client connected.
extern std::atomic<unsigned> g_accepts_without_clients;
