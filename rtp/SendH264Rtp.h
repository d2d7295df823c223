#pragma once

#include <pthread.h>

#include <atomic>
#include <string>

#include "media/cycle_buffer.h"
#include "rtp/DestSocketTable.h"

// The process-wide video sender: one thread takes H.264 items (start code + NAL unit) from the
// video ring, stamps them on the 90 kHz clock, keeps at most 250 ms ahead of the audio sender,
// and sends every packet to every destination from one unbound UDP socket.
// Thread contract: instance, CloseInstance, Start/CloseSendThread from the controlling thread
// (the RTSP listener); add/del_dest_socket_info from any thread; the loop runs on its own.
class H264RtpTransportSession {
public:
    static H264RtpTransportSession* instance();
    static void CloseInstance();
    virtual ~H264RtpTransportSession();

    // The ring the producers write; attached by the server, not owned.
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
    // The port announced to clients in SETUP; packets leave from an unbound socket.
    void SetServerPort(unsigned port) { m_server_port = port; }
    unsigned GetServerPort() const { return m_server_port; }

private:
    H264RtpTransportSession();
    static void* event_loop_thread(void* self);
    void procH264Thread();
    // Dormant parameter-set inspection: kept so a cleared flag inspects the next SPS/PPS.
    void InspectParameterSets(const Buffer_Item& item);

    std::atomic<int> m_running{1};
    pthread_t m_thread{};
    bool m_thread_started = false;
    cycle_buffer* m_ring = nullptr;
    DestSocketTable m_dests;
    bool m_sps_seen = false;
    bool m_pps_seen = false;
    uint32_t m_time_scale = 1;
    std::string m_sps_base64;
    std::string m_pps_base64;
    uint32_t m_last_item_time = 0;
    unsigned m_server_port = 8000;
};
