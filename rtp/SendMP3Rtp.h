#pragma once

#include <pthread.h>

#include <atomic>
#include <string>

#include "media/cycle_buffer.h"
#include "rtp/DestSocketTable.h"

// The process-wide audio sender (AAC despite the name): one thread takes ADTS frames from the
// audio ring and sends each as one RFC 3640 packet on the audio clock to every destination,
// publishing its position for the video sender.
// Thread contract: as H264RtpTransportSession.
class MP3RtpTransportSession {
public:
    static MP3RtpTransportSession* instance();
    static void CloseInstance();
    virtual ~MP3RtpTransportSession();

    void SetInputRing(cycle_buffer* ring) { m_ring = ring; }
    cycle_buffer* GetInputRing() const { return m_ring; }

    // The item time that playing starts from, so the first RTP timestamp counts from it.
    void SetBaseTime(uint32_t ms) { m_last_item_time = ms; }
    int StartSendThread();
    bool sending() const { return m_thread_started; }
    void CloseSendThread();
    void add_dest_socket_info(void* key, int port, std::string ip);
    void del_dest_socket_info(void* key);
    void GetSocketInfoList() { m_dests.Refresh(); }
    size_t dest_count() { return m_dests.size(); }
    // The port the audio socket binds and SETUP announces.
    void SetServerPort(unsigned port) { m_server_port = port; }
    unsigned GetServerPort() const { return m_server_port; }

private:
    MP3RtpTransportSession();
    static void* event_loop_thread(void* self);
    void procMP3Thread();
    void sendMP3RtpPacket(const Buffer_Item& item, int sockfd, uint32_t timestamp, uint16_t sequence);

    std::atomic<int> m_running{1};
    pthread_t m_thread{};
    bool m_thread_started = false;
    cycle_buffer* m_ring = nullptr;
    DestSocketTable m_dests;
    uint32_t m_last_item_time = 0;
    unsigned m_server_port = 8002;
};
