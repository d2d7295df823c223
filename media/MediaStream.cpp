#include "media/MediaStream.h"

#include <cmath>

MediaStream::MediaStream(const char* name, int type)
    : m_name(name != nullptr ? name : ""), m_type(type) {}

MediaStream::~MediaStream() {
    TLock::Scoped hold(m_state_lock);
    m_playing = 0;
    m_transport.reset();
}

bool MediaStream::Init(unsigned bitrate, unsigned packet_size) {
    m_packet_size = packet_size;
    m_initialised = 1;
    // bitrate x 1.2 plus 96 header bits for each packet that carries it, in kbit/s rounded up.
    double bits = bitrate * 1.2;
    double payload_bits = packet_size * 8.0 - 96.0;
    double packets = payload_bits > 0 ? std::ceil(bits / payload_bits) : 0;
    m_bandwidth = static_cast<float>(std::floor((bits + packets * 96.0 + 999.0) / 1000.0));
    return true;
}

bool MediaStream::TransportSetup(const char* local_address, unsigned local_port,
                                 const char* remote_address, unsigned remote_port) {
    if (m_initialised == 0) return false;
    m_setup = 0;
    m_transport = std::make_unique<Rtp>(m_packet_size);
    if (!m_transport->Open(local_address != nullptr ? local_address : "",
                           static_cast<int>(local_port))) {
        return false;
    }
    if (!m_transport->Connect(remote_address != nullptr ? remote_address : "",
                              static_cast<int>(remote_port))) {
        return false;
    }
    m_remote_port = remote_port;
    m_setup = 1;
    return true;
}

bool MediaStream::TransportStart() {
    if (m_setup == 0) return false;
    TLock::Scoped hold(m_state_lock);
    m_playing = 1;
    return true;
}

bool MediaStream::TransportStop() {
    TLock::Scoped hold(m_state_lock);
    m_playing = 0;
    return true;
}

bool MediaStream::TransportTeardown() {
    TransportStop();
    m_transport.reset();
    return true;
}

std::string MediaStream::GetName() { return m_name; }
int MediaStream::GetType() { return m_type; }
int MediaStream::GetRtpPayloadType() { return m_rtp_payload_type; }
float MediaStream::GetBandWidth() { return m_bandwidth; }

int MediaStream::SendPacket(unsigned char* payload, unsigned len, int timestamp, int marker) {
    if (!m_transport) return 0;
    int sent = m_transport->Write(payload, static_cast<unsigned short>(len),
                                  static_cast<signed char>(m_rtp_payload_type), timestamp, 0,
                                  marker, 500000);
    return sent > 0 ? sent : 0;
}
