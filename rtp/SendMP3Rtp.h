#pragma once

#include "rtp/RtpPackets.h"
#include "rtp/RtpSendSession.h"

class ClientFanout;

// The process-wide audio sender (AAC despite the name): one thread takes ADTS frames from the
// audio ring and sends each as one RFC 3640 packet on the audio clock to every destination,
// publishing its position for the video sender.
// Thread contract: as RtpSendSession; instance/CloseInstance from the controlling thread.
class MP3RtpTransportSession final : public RtpSendSession {
public:
    static MP3RtpTransportSession* instance();
    static void CloseInstance();
    ~MP3RtpTransportSession() override;

    void GetSocketInfoList() { m_dests.Refresh(); }

private:
    MP3RtpTransportSession();
    // Unlike the video session, the destination copy is not marked for a rebuild at start.
    void Run() override { procMP3Thread(); }
    void procMP3Thread();
    void sendMP3RtpPacket(const Buffer_Item& item, ClientFanout& fanout, uint32_t timestamp,
                          uint16_t sequence);

    unsigned m_payload_type = kAacPayloadType;  // the send thread's own, taken when it starts
};
