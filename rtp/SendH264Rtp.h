#pragma once

#include <chrono>
#include <string>

#include "rtp/RtpSendSession.h"

class FrameLatency;

// The process-wide video sender: one thread takes H.264 items (start code + NAL unit) from the
// video ring, stamps them on the 90 kHz clock, keeps at most 250 ms ahead of the audio sender,
// and sends every packet to every destination from one unbound UDP socket.
// Thread contract: as RtpSendSession; instance/CloseInstance from the controlling thread.
class H264RtpTransportSession final : public RtpSendSession {
public:
    static H264RtpTransportSession* instance();
    static void CloseInstance();
    ~H264RtpTransportSession() override;

private:
    H264RtpTransportSession();
    void BeforeStart() override;
    using Clock = std::chrono::steady_clock;

    void Run() override { procH264Thread(); }
    void procH264Thread();
    void ReportLatency(unsigned ring_wait_ms, Clock::time_point send_start, FrameLatency* latency);
    // Dormant parameter-set inspection: kept so a cleared flag inspects the next SPS/PPS.
    void InspectParameterSets(const Buffer_Item& item);
    // Whether `item` begins a key picture, a point a new client can start decoding from.
    bool StartsKeyPicture(const Buffer_Item& item);

    bool m_sps_seen = false;
    unsigned m_last_nal_type = 0;  // send thread only (reset before it starts)
    bool m_pps_seen = false;
    uint32_t m_time_scale = 1;
    std::string m_sps_base64;
    std::string m_pps_base64;
};
