#pragma once

#include <pthread.h>
#include <unistd.h>

#include <atomic>
#include <cstdint>
#include <string>

#include "buffers/cycle_buffer.h"
#include "rtp/DestSocketTable.h"
#include "sync/TLock.h"

// What the video and audio senders share: the input ring (attached by the server, not owned),
// the client destinations, the send thread's start and stop, and the item time that playing
// starts from. Each sender runs its own loop, on a thread of its own or, for a sender that can
// be driven, on the producer's thread after each write (no thread is started then).
// Thread contract: Start/CloseSendThread from the controlling thread (the RTSP listener);
// add/del_dest_socket_info from any thread; the loop runs on its own thread, or a driven sender
// on whichever thread drives it, one at a time.
class RtpSendSession {
public:
    virtual ~RtpSendSession();
    RtpSendSession(const RtpSendSession&) = delete;
    RtpSendSession& operator=(const RtpSendSession&) = delete;

    void SetInputRing(cycle_buffer* ring) { m_ring = ring; }
    cycle_buffer* GetInputRing() const { return m_ring; }
    // The item time that playing starts from, so the first RTP timestamp counts from it.
    void SetBaseTime(uint32_t ms) { m_last_item_time = ms; }

    int StartSendThread();
    bool sending() const { return m_thread_started; }
    // Stops the thread and forgets every destination.
    void CloseSendThread();
    void add_dest_socket_info(void* key, int port, std::string ip);
    void del_dest_socket_info(void* key);
    size_t dest_count() { return m_dests.size(); }
    // The port SETUP announces for this stream.
    void SetServerPort(unsigned port) { m_server_port = port; }
    unsigned GetServerPort() const { return m_server_port; }

protected:
    // `class_lock` guards the destinations; `closed_text` is printed when the thread was joined.
    RtpSendSession(TLock& class_lock, unsigned server_port, const char* closed_text);
    // Runs on the controlling thread just before the send thread is created.
    virtual void BeforeStart() {}
    // On the controlling thread after BeforeStart: true when the producer will drive the loop,
    // so that no thread is started; EndDriven then ends it at the close.
    virtual bool BeginDriven() { return false; }
    virtual void EndDriven() {}
    // The send loop; returns once m_running is 0.
    virtual void Run() = 0;
    // The loop's pause when it has nothing to send: `poll_us` of sleep, or, when the loops wait
    // for writes and the ring is empty, until an item is written (at most a safety bound).
    void Idle(useconds_t poll_us);

    std::atomic<int> m_running{1};
    cycle_buffer* m_ring = nullptr;
    DestSocketTable m_dests;
    uint32_t m_last_item_time = 0;

private:
    static void* Trampoline(void* self);

    pthread_t m_thread{};
    bool m_thread_started = false;  // or, driven, the loop begun
    bool m_driven = false;
    std::atomic<bool> m_wake_on_write{false};
    unsigned m_server_port;
    const char* m_closed_text;
};
