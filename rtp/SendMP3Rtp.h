#pragma once

#include <memory>

#include "rtp/RtpPackets.h"
#include "rtp/RtpSendSession.h"
#include "sync/TLock.h"

class ClientFanout;

// The process-wide audio sender (AAC despite the name): takes ADTS frames from the audio ring
// and sends each as one RFC 3640 packet on the audio clock to every destination, publishing its
// position for the video sender. It runs on a thread of its own, or, with kv.orvex.aacenc=inline,
// on the encoder's thread: Pump after each frame written sends what the ring holds.
// Thread contract: as RtpSendSession; instance/CloseInstance from the controlling thread; Pump
// from the audio producer's thread.
class MP3RtpTransportSession final : public RtpSendSession {
public:
    static MP3RtpTransportSession* instance();
    static void CloseInstance();
    ~MP3RtpTransportSession() override;

    void GetSocketInfoList() { m_dests.Refresh(); }
    // Sends the frames the ring holds when the sender is driven and started; else nothing.
    void Pump();

private:
    struct SendRun;

    MP3RtpTransportSession();
    // Unlike the video session, the destination copy is not marked for a rebuild at start.
    void Run() override { procMP3Thread(); }
    bool BeginDriven() override;
    void EndDriven() override;
    void procMP3Thread();
    std::unique_ptr<SendRun> BeginRun();
    // One turn of the loop: true when a frame was sent; false when there was none, or it was
    // dropped (paused, not ready, no destination), and the loop should pause.
    bool Turn(SendRun& run);
    void sendMP3RtpPacket(const Buffer_Item& item, ClientFanout& fanout, uint32_t timestamp,
                          uint16_t sequence);

    unsigned m_payload_type = kAacPayloadType;  // the sender's own, taken when it starts
    TLock m_drive_lock;
    std::unique_ptr<SendRun> m_driven_run ORVEX_GUARDED_BY(m_drive_lock);
};
