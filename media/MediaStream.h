#pragma once

#include <memory>
#include <string>

#include "rtp/Rtp.h"
#include "sync/TLock.h"

// Stream kinds.
constexpr int kMediaTypeH264 = 201;
constexpr int kMediaTypeMP4A = 101;

// One track of a presentation: its name (also the SDP control name), kind, packet size, and
// an optional RTP transport of its own with a packetiser (the live stream is packetised by the
// send sessions instead).
// Thread contract: the playing flag and TransportData are guarded by the state lock; the rest
// is set up by one thread before use.
class MediaStream {
public:
    MediaStream(const char* name, int type);
    virtual ~MediaStream();
    MediaStream(const MediaStream&) = delete;
    MediaStream& operator=(const MediaStream&) = delete;

    // Stores the packet size (RTP header included) and a bandwidth estimate in kbit/s.
    virtual bool Init(unsigned bitrate, unsigned packet_size);
    // The track's media section; stores `payload_type` as the track's payload type.
    virtual std::string GenerateMediaSdp(unsigned payload_type, int with_control) = 0;
    virtual bool TransportSetup(const char* local_address, unsigned local_port,
                                const char* remote_address, unsigned remote_port);
    virtual bool TransportStart();
    // Bytes sent; 0 unless playing.
    virtual int TransportData(unsigned char* data, unsigned len, int timestamp) = 0;
    virtual bool TransportStop();
    virtual bool TransportTeardown();
    virtual std::string GetName();
    virtual int GetType();
    virtual int GetRtpPayloadType();
    virtual float GetBandWidth();

    unsigned packet_size() const { return m_packet_size; }
    unsigned remote_port() const { return m_remote_port; }
    bool playing() const { return m_playing != 0; }
    Rtp* transport() { return m_transport.get(); }

protected:
    // One packet through the transport with the track's payload type (SSRC 0).
    int SendPacket(unsigned char* payload, unsigned len, int timestamp, int marker);

    std::string m_name;
    int m_type;
    unsigned m_packet_size = 0;
    int m_rtp_payload_type = 0;
    unsigned m_remote_port = 0;
    float m_bandwidth = 0;
    int m_initialised = 0;
    int m_setup = 0;
    int m_playing = 0;
    std::unique_ptr<Rtp> m_transport;
    TLock m_state_lock;
};
