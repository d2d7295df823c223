#pragma once

#include <netinet/in.h>

#include <atomic>
#include <memory>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "codec/AccessUnitGatherer.h"
#include "codec/H264Packetiser.h"
#include "stream/CaptureChoice.h"
#include "stream/FrameTap.h"
#include "sync/thread_mutex.h"
#include "web/WhepEndpoint.h"
#include "webrtc/OpusTrack.h"

namespace webrtc {

class DtlsCertificate;
struct Peer;

// WebRTC playback for the web viewer's WHEP endpoint: ICE-lite on one UDP port for every
// session, DTLS-SRTP as the passive side, the stream's own H.264 (packetization mode 1) and the
// sound as Opus. Pictures are sent as they are gathered, to every viewer at once on the thread
// that brings them: one packetising for all, then per viewer its header, its encryption and a
// non-blocking send, so a viewer whose packets go nowhere costs what any other does and holds
// nobody up. Each viewer keeps about a second of sent packets to answer NACKs; PLI and FIR ask
// the stream for a key frame.
// Thread contract: Offer and End on the HTTP server's threads; the tap's callbacks on the
// producers' threads; the socket on the server's own thread. One lock guards the sessions.
class WebRtcServer final : public WhepEndpoint,
                           public EncodedFrameSink,
                           private AccessUnitGatherer::Sink,
                           private H264PayloadSink {
public:
    struct Options {
        uint16_t port = 8189;
        std::string bind;              // IPv4 address, empty for all
        std::string certificate_path;  // kept across restarts: browsers remember it
        int consent_timeout_ms = 30000;
        int connect_timeout_ms = 10000;  // from the answer to a working DTLS association
    };

    WebRtcServer(stream::CaptureDemand* demand, Options options);
    ~WebRtcServer() override;
    WebRtcServer(const WebRtcServer&) = delete;
    WebRtcServer& operator=(const WebRtcServer&) = delete;

    // Binds the port and taps the frames; false (one line) when it cannot.
    bool Start();
    void Stop();
    uint16_t port() const { return m_options.port; }
    int sessions() const { return m_session_count.load(); }

    Reply Offer(OfferRequest request) override;
    bool End(const std::string& id) override;

    void OnVideoFrame(const uint8_t* data, size_t len, uint32_t time_ms) override;
    void OnAudioFrame(const uint8_t*, size_t, uint32_t) override {}
    void OnAudioPcm(const int16_t* samples, size_t frames, uint32_t time_ms) override;

private:
    static constexpr int kMaxSessions = 64;

    void OnPicture(const AccessUnitGatherer::Picture& picture) override;
    void OnPictureLost(AccessUnitGatherer::Loss) override {}
    void SendNal(const uint8_t* nal, size_t len, uint32_t timestamp, bool last)
        ORVEX_REQUIRES(m_lock);
    // Each payload of the unit SendNal cuts; runs inside SendNal, under its lock.
    void Payload(unsigned char* built, unsigned length,
                 bool end) override ORVEX_NO_THREAD_SAFETY_ANALYSIS;
    void SendAudio(const uint8_t* payload, size_t len, uint32_t timestamp) ORVEX_REQUIRES(m_lock);
    void SendProtected(Peer& peer, uint8_t* packet, size_t len, bool video) ORVEX_REQUIRES(m_lock);
    void Run();
    void OnDatagram(uint8_t* data, size_t len, const sockaddr_in& from, uint64_t now)
        ORVEX_REQUIRES(m_lock);
    void OnStun(const uint8_t* data, size_t len, const sockaddr_in& from, uint64_t now)
        ORVEX_REQUIRES(m_lock);
    void OnRtcp(Peer& peer, uint8_t* data, size_t len) ORVEX_REQUIRES(m_lock);
    int Housekeeping(uint64_t now) ORVEX_REQUIRES(m_lock);
    void SendReports(Peer& peer) ORVEX_REQUIRES(m_lock);
    std::shared_ptr<Peer> Remove(int slot, const char* why) ORVEX_REQUIRES(m_lock);
    void Finish(const std::shared_ptr<Peer>& peer);
    Peer* ByAddress(const sockaddr_in& from) ORVEX_REQUIRES(m_lock);
    const DtlsCertificate* Certificate();  // loaded or made at the first offer; null: none
    ssize_t SendDatagram(const sockaddr_in& to, const uint8_t* p, size_t n);

    stream::CaptureDemand* m_demand;
    Options m_options;
    thread_mutex m_certificate_lock;
    std::unique_ptr<DtlsCertificate> m_certificate ORVEX_GUARDED_BY(m_certificate_lock);
    int m_socket = -1;
    int m_wake[2] = {-1, -1};  // Stop's word to the socket thread
    std::thread m_thread;
    std::atomic<bool> m_stopping{false};
    bool m_tapped = false;

    thread_mutex m_lock;
    std::shared_ptr<Peer> m_peers[kMaxSessions] ORVEX_GUARDED_BY(m_lock);
    std::atomic<int> m_session_count{0};
    std::atomic<int> m_playing{0};  // sessions past DTLS: the tap does nothing without one

    // The tap's side, serialised by the tap: the gatherer and the Opus encoder.
    AccessUnitGatherer m_gatherer;
    std::unique_ptr<OpusTrack> m_opus;  // made for the first viewer
    bool m_opus_failed = false;
    std::vector<std::pair<const uint8_t*, size_t>> m_units;  // of the picture being sent
    uint32_t m_audio_clock_ms = 0;  // when the block of the last Opus time stamp came
    uint32_t m_audio_clock_ts = 0;
    uint8_t m_packet[1500] ORVEX_GUARDED_BY(m_lock) = {};   // one packet under construction
    uint32_t m_nal_timestamp ORVEX_GUARDED_BY(m_lock) = 0;  // of the unit SendNal cuts
    bool m_nal_last ORVEX_GUARDED_BY(m_lock) = false;       // it ends its picture
};

}  // namespace webrtc
