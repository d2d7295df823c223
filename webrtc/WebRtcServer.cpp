#include "webrtc/WebRtcServer.h"

#include <arpa/inet.h>
#include <errno.h>
#include <fcntl.h>
#include <openssl/rand.h>
#include <poll.h>
#include <string.h>
#include <sys/socket.h>
#include <time.h>
#include <unistd.h>

#include <cstdlib>

#include "base/Clocks.h"
#include "base/OrvexLog.h"
#include "codec/H264Packetiser.h"
#include "net/Socket.h"
#include "platform/LogPort.h"
#include "platform/Ports.h"
#include "platform/PropertyPort.h"
#include "stream/KeyFrames.h"
#include "stream/StreamFacts.h"
#include "webrtc/DtlsCertificate.h"
#include "webrtc/DtlsSrtp.h"
#include "webrtc/PacketHistory.h"
#include "webrtc/Rtcp.h"
#include "webrtc/RtpExtension.h"
#include "webrtc/Stun.h"
#include "webrtc/WebRtc.h"
#include "webrtc/WebRtcSdp.h"

namespace webrtc {

namespace {

constexpr const char* kTag = "orvex:::webrtc";
// 1200 bytes of RTP, what browsers themselves send at most: room for SRTP's tag and any VPN
// or tunnel on a viewer's path within a 1500-byte MTU.
constexpr unsigned kRtpMax = 1200;
constexpr unsigned kVideoHeader = 12 + 8;  // RTP, and the extension block: 4 + 4 (playout-delay)
constexpr H264Packing kWebRtcPacking = {kRtpMax - kVideoHeader, kRtpMax - kVideoHeader - 2, true,
                                        false};
constexpr int kReportIntervalMs = 1000;

uint64_t NowMs() { return stream::SteadyMs(); }

uint32_t Random32() {
    uint32_t value = 0;
    if (RAND_bytes(reinterpret_cast<unsigned char*>(&value), sizeof value) != 1)
        value = static_cast<uint32_t>(NowMs() * 2654435761u);
    return value;
}

std::string RandomText(size_t n) {
    static const char kChars[] = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789";
    std::string text(n, 'a');
    for (char& c : text) c = kChars[Random32() % (sizeof kChars - 1)];
    return text;
}

// The one socket is IPv4: every address it sees is a sockaddr_in.
std::string AddressText(const sockaddr_in& addr) {
    return DottedAddress(addr) + ":" + std::to_string(ntohs(addr.sin_port));
}

bool SameAddress(const sockaddr_in& a, const sockaddr_in& b) {
    return a.sin_port == b.sin_port && a.sin_addr.s_addr == b.sin_addr.s_addr;
}

// NTP time (RFC 3550 §4): seconds since 1900 in the high word, the fraction in the low.
uint64_t NtpNow() {
    timespec now{};
    clock_gettime(CLOCK_REALTIME, &now);
    const uint64_t seconds = static_cast<uint64_t>(now.tv_sec) + 2208988800u;
    const uint64_t fraction = (static_cast<uint64_t>(now.tv_nsec) << 32) / 1000000000u;
    return seconds << 32 | fraction;
}

}  // namespace

// One viewer. Everything in it is guarded by the server's lock.
struct Peer {
    std::string id;  // the session's address is /whep/<id>
    std::string text;
    std::string ufrag, pwd;
    WebRtcOffer offer;
    int video_pt = -1, audio_pt = -1, playout_id = -1;
    std::unique_ptr<DtlsSrtpSession> dtls;
    sockaddr_in remote{};
    bool has_remote = false;
    bool playing = false;  // DTLS done: media flows
    bool need_key = true;  // nothing is sent before a key picture
    uint64_t created_ms = 0, last_check_ms = 0, last_report_ms = 0;
    uint32_t video_ssrc = 0, audio_ssrc = 0;
    uint16_t video_seq = 0, audio_seq = 0;
    uint32_t video_packets = 0, video_octets = 0, audio_packets = 0, audio_octets = 0;
    unsigned send_failures = 0, resent = 0, nacked_missing = 0;
    int32_t reported_lost = 0;  // the viewer's own count of our video packets it never got
    bool told_send_failure = false;
    PacketHistory history;
    std::function<void()> end;
};

WebRtcServer::WebRtcServer(stream::CaptureDemand* demand, Options options)
    : m_demand(demand),
      m_options(std::move(options)),
      m_gatherer(this, AccessUnitGatherer::Prefix::kStartCode, false, 4u << 20) {}

WebRtcServer::~WebRtcServer() { Stop(); }

// The certificate, the TLS context and the Opus encoder wait for the first viewer: a service
// nobody watches by WebRTC keeps their few megabytes to itself.
const DtlsCertificate* WebRtcServer::Certificate() {
    thread_mutex::Scoped hold(m_certificate_lock);
    if (m_certificate != nullptr) return m_certificate.get();
    std::string why;
    m_certificate = DtlsCertificate::LoadOrCreate(m_options.certificate_path, &why);
    if (m_certificate == nullptr) {
        OrvexLogPriority(platform::kLogError, kTag, "WebRTC: no certificate at %s (%s)",
                         m_options.certificate_path.c_str(), why.c_str());
        return nullptr;
    }
    OrvexLogPriority(why.empty() ? platform::kLogInfo : platform::kLogWarn, kTag,
                     "WebRTC certificate %s%s%s", m_certificate->Sha256Fingerprint().c_str(),
                     why.empty() ? "" : ": ", why.c_str());
    return m_certificate.get();
}

bool WebRtcServer::Start() {
    m_socket = socket(AF_INET, SOCK_DGRAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0);
    sockaddr_in bind_to{};
    bind_to.sin_family = AF_INET;
    bind_to.sin_port = htons(m_options.port);
    bind_to.sin_addr.s_addr = htonl(INADDR_ANY);
    if (!m_options.bind.empty()) inet_pton(AF_INET, m_options.bind.c_str(), &bind_to.sin_addr);
    if (m_socket < 0 ||
        bind(m_socket, reinterpret_cast<sockaddr*>(&bind_to), sizeof bind_to) != 0) {
        OrvexLogPriority(platform::kLogError, kTag,
                         "WebRTC: cannot have UDP port %u (%s); kv.orvex.webrtc chooses it",
                         m_options.port, strerror(errno));
        if (m_socket >= 0) close(m_socket);
        m_socket = -1;
        return false;
    }
    socklen_t len = sizeof bind_to;
    if (getsockname(m_socket, reinterpret_cast<sockaddr*>(&bind_to), &len) == 0)
        m_options.port = ntohs(bind_to.sin_port);
    // A key picture for 16 viewers leaves at once: about 100 packets each.
    int buffer = 4 << 20;
    setsockopt(m_socket, SOL_SOCKET, SO_SNDBUF, &buffer, sizeof buffer);
    if (pipe2(m_wake, O_NONBLOCK | O_CLOEXEC) != 0) {
        close(m_socket);
        m_socket = -1;
        return false;
    }
    m_tapped = AddFrameSink(this);
    m_thread = std::thread([this] { Run(); });
    OrvexLogPriority(platform::kLogInfo, kTag, "WebRTC on UDP port %u", m_options.port);
    return true;
}

void WebRtcServer::Stop() {
    if (m_socket < 0) return;
    m_stopping.store(true);
    // Should the pipe be full, the thread sees the flag at its next 100 ms wait anyway.
    const ssize_t woke = write(m_wake[1], "x", 1);
    (void)woke;
    if (m_thread.joinable()) m_thread.join();
    if (m_tapped) RemoveFrameSink(this);
    m_tapped = false;
    std::shared_ptr<Peer> ended[kMaxSessions];
    {
        thread_mutex::Scoped hold(m_lock);
        for (int i = 0; i < kMaxSessions; ++i) {
            if (m_peers[i] != nullptr) ended[i] = Remove(i, "the service stops");
        }
    }
    for (auto& peer : ended) {
        if (peer != nullptr) Finish(peer);
    }
    close(m_socket);
    close(m_wake[0]);
    close(m_wake[1]);
    m_socket = -1;
}

WhepEndpoint::Reply WebRtcServer::Offer(OfferRequest request) {
    if (m_stopping.load()) return {503, "The service is stopping.\n", ""};
    const DtlsCertificate* certificate = Certificate();
    if (certificate == nullptr)
        return {503, "WebRTC has no certificate; the service's log says why.\n", ""};
    // The offer's H.264 types are chosen by the stream's own profile; before the first
    // picture the capture is started so that its parameter sets can say which.
    if (m_demand != nullptr) m_demand->HoldCapture(stream::CaptureQueryFor(request.query));
    stream::AskForKeyFrame();
    stream::StreamFacts::Video video;
    int profile = 66, constraints = 0xe0;  // constrained baseline until the stream says
    if (stream::Facts().WaitFresh(&video, 0, 2000) && video.sps.size() >= 4) {
        profile = static_cast<uint8_t>(video.sps[1]);
        constraints = static_cast<uint8_t>(video.sps[2]);
    }
    auto peer = std::make_shared<Peer>();
    std::string why;
    if (!ReadWebRtcOffer(request.sdp, profile, constraints, &peer->offer, &why)) {
        if (m_demand != nullptr) m_demand->ReleaseCapture();
        OrvexLogPriority(platform::kLogWarn, kTag, "WebRTC offer of %s refused: %s",
                         request.peer.c_str(), why.c_str());
        return {400, why + "\n", ""};
    }
    for (WebRtcOffer::Media& media : peer->offer.media) {
        // Lost packets are sent again as they were, not on an RTX stream of their own.
        media.rtx_payload_type = -1;
        if (!media.accepted) continue;
        if (media.kind == "video" && peer->video_pt < 0) {
            peer->video_pt = media.payload_type;
            peer->playout_id = media.playout_delay_extension;
        } else if (media.kind == "audio" && peer->audio_pt < 0) {
            peer->audio_pt = media.payload_type;
        }
    }
    peer->id = RandomText(16);
    peer->text = request.peer;
    peer->ufrag = RandomText(8);
    peer->pwd = RandomText(24);
    peer->video_ssrc = Random32();
    peer->audio_ssrc = Random32();
    peer->video_seq = static_cast<uint16_t>(Random32());
    peer->audio_seq = static_cast<uint16_t>(Random32());
    peer->created_ms = NowMs();
    peer->dtls.reset(new DtlsSrtpSession(*certificate, peer->offer.fingerprint));
    peer->end = std::move(request.end);

    WebRtcAnswerParams params;
    params.ice_ufrag = peer->ufrag;
    params.ice_pwd = peer->pwd;
    params.fingerprint_sha256 = certificate->Sha256Fingerprint();
    params.address = request.local != nullptr && request.local->sa_family == AF_INET
                         ? DottedAddress(*reinterpret_cast<const sockaddr_in*>(request.local))
                         : "127.0.0.1";
    params.port = m_options.port;
    params.video_ssrc = peer->video_ssrc;
    params.audio_ssrc = peer->audio_ssrc;
    params.cname = "orvex";
    params.stream_id = "orvex";
    for (const WebRtcOffer::Media& media : peer->offer.media) {
        if (media.kind == "video" && media.payload_type == peer->video_pt)
            params.h264_profile_level_id = media.h264_profile_level_id;
    }
    params.session_id = (static_cast<uint64_t>(Random32()) << 31) | Random32();
    Reply reply{201, WriteWebRtcAnswer(peer->offer, params), "/whep/" + peer->id};

    {
        thread_mutex::Scoped hold(m_lock);
        int free_slot = -1;
        for (int i = 0; i < kMaxSessions && free_slot < 0; ++i) {
            if (m_peers[i] == nullptr) free_slot = i;
        }
        if (free_slot < 0) {
            if (m_demand != nullptr) m_demand->ReleaseCapture();
            return {503, "Too many WebRTC sessions.\n", ""};
        }
        m_peers[free_slot] = peer;
        m_session_count.fetch_add(1);
    }
    OrvexLog(kTag, "WebRTC session %s for %s: H.264 type %d, Opus type %d\n", peer->id.c_str(),
             peer->text.c_str(), peer->video_pt, peer->audio_pt);
    return reply;
}

bool WebRtcServer::End(const std::string& id) {
    std::shared_ptr<Peer> ended;
    {
        thread_mutex::Scoped hold(m_lock);
        for (int i = 0; i < kMaxSessions && ended == nullptr; ++i) {
            if (m_peers[i] == nullptr || m_peers[i]->id != id) continue;
            Peer* peer = m_peers[i].get();
            if (peer->playing) {  // a close_notify, so the browser need not wait for consent
                peer->dtls->Close(
                    [this, peer](const uint8_t* p, size_t n) { SendDatagram(peer->remote, p, n); });
            }
            ended = Remove(i, "the viewer ended it");
        }
    }
    if (ended == nullptr) return false;
    Finish(ended);
    return true;
}

std::shared_ptr<Peer> WebRtcServer::Remove(int slot, const char* why) {
    std::shared_ptr<Peer> peer = std::move(m_peers[slot]);
    m_peers[slot] = nullptr;
    m_session_count.fetch_sub(1);
    if (peer->playing) m_playing.fetch_sub(1);
    OrvexLog(kTag,
             "WebRTC session %s of %s ended: %s (%u packets sent again, %u asked too late, %u "
             "sends refused, %d never arrived by the viewer's count)\n",
             peer->id.c_str(), peer->text.c_str(), why, peer->resent, peer->nacked_missing,
             peer->send_failures, static_cast<int>(peer->reported_lost));
    return peer;
}

// Outside the lock: the capture hold and the web viewer's count are other locks' business.
void WebRtcServer::Finish(const std::shared_ptr<Peer>& peer) {
    if (m_demand != nullptr) m_demand->ReleaseCapture();
    if (peer->end) peer->end();
}

void WebRtcServer::OnVideoFrame(const uint8_t* data, size_t len, uint32_t time_ms) {
    if (m_playing.load(std::memory_order_relaxed) == 0) return;
    m_gatherer.Add(data, len, time_ms);
}

void WebRtcServer::OnPicture(const AccessUnitGatherer::Picture& picture) {
    const uint32_t timestamp = picture.time_ms * 90u;  // 90 kHz (RFC 6184 §5.1)
    // The picture's NAL units, each behind a 4-byte start code.
    m_units.clear();
    ForEachNalUnit(picture.data, picture.len,
                   [this](const uint8_t* nal, size_t len) { m_units.emplace_back(nal, len); });
    thread_mutex::Scoped hold(m_lock);
    // Which viewers take this picture: those started, and those waiting for a key picture
    // when this is one.
    bool any = false;
    for (auto& peer : m_peers) {
        if (peer == nullptr || !peer->playing) continue;
        if (peer->need_key && picture.key) peer->need_key = false;
        any = any || !peer->need_key;
    }
    if (!any) return;
    if (picture.key) {  // parameter sets first, as a joining decoder needs them
        const std::vector<uint8_t>& sps = m_gatherer.sps();
        const std::vector<uint8_t>& pps = m_gatherer.pps();
        if (!sps.empty()) SendNal(sps.data(), sps.size(), timestamp, false);
        if (!pps.empty()) SendNal(pps.data(), pps.size(), timestamp, false);
    }
    // The marker bit on the last packet of the last unit ends the picture for the browser's
    // jitter buffer.
    for (size_t i = 0; i < m_units.size(); ++i)
        SendNal(m_units[i].first, m_units[i].second, timestamp, i + 1 == m_units.size());
}

void WebRtcServer::SendNal(const uint8_t* nal, size_t len, uint32_t timestamp, bool last) {
    static_assert(sizeof(m_packet) >= kRtpMax + kSrtpMaxTrailer, "packet buffer");
    // The packetiser builds each payload at scratch + 12 and hands it to Payload, which builds
    // every viewer's packet from it with their own header: the unit is cut once for all.
    uint8_t scratch[12 + kRtpMax];
    m_nal_timestamp = timestamp;
    m_nal_last = last;
    PacketiseH264Nal(nal, static_cast<unsigned>(len), kWebRtcPacking, scratch, *this);
}

void WebRtcServer::Payload(unsigned char* built, unsigned length, bool end) {
    const bool marker = m_nal_last && end;
    for (auto& peer : m_peers) {
        if (peer == nullptr || !peer->playing || peer->need_key || peer->video_pt < 0) continue;
        const size_t header = WriteRtpHeaderWithExtensions(
            m_packet, marker, static_cast<uint8_t>(peer->video_pt), peer->video_seq++,
            m_nal_timestamp, peer->video_ssrc, peer->playout_id, -1, "");
        memcpy(m_packet + header, built + 12, length);
        peer->video_packets++;
        peer->video_octets += length;
        SendProtected(*peer, m_packet, header + length, true);
    }
}

void WebRtcServer::SendProtected(Peer& peer, uint8_t* packet, size_t len, bool video) {
    const uint16_t sequence = static_cast<uint16_t>(packet[2] << 8 | packet[3]);
    if (!peer.dtls->ProtectRtp(packet, &len, sizeof m_packet)) return;
    if (video) peer.history.Keep(sequence, packet, len);
    const ssize_t sent = SendDatagram(peer.remote, packet, len);
    if (sent < 0) {
        ++peer.send_failures;
        if (!peer.told_send_failure) {
            peer.told_send_failure = true;
            OrvexLogPriority(platform::kLogWarn, kTag,
                             "WebRTC session %s: sending to %s fails (%s); its packets are "
                             "dropped while it does",
                             peer.id.c_str(), AddressText(peer.remote).c_str(), strerror(errno));
        }
    } else {
        peer.told_send_failure = false;
    }
}

void WebRtcServer::OnAudioPcm(const int16_t* samples, size_t frames, uint32_t time_ms) {
    if (m_playing.load(std::memory_order_relaxed) == 0) return;
    if (m_opus == nullptr) {
        if (m_opus_failed) return;
        m_opus.reset(new OpusTrack);
        if (!m_opus->ok()) {
            OrvexLogPriority(platform::kLogError, kTag,
                             "WebRTC: the Opus encoder did not start; viewers get no sound");
            m_opus.reset();
            m_opus_failed = true;
            return;
        }
    }
    m_opus->Add(samples, frames, [&](const uint8_t* payload, size_t len, uint32_t timestamp) {
        thread_mutex::Scoped hold(m_lock);
        m_audio_clock_ms = time_ms;
        m_audio_clock_ts = timestamp;
        SendAudio(payload, len, timestamp);
    });
}

void WebRtcServer::SendAudio(const uint8_t* payload, size_t len, uint32_t timestamp) {
    for (auto& peer : m_peers) {
        if (peer == nullptr || !peer->playing || peer->audio_pt < 0) continue;
        // No marker: Opus is sent without silence suppression, so no talkspurt ever begins
        // (RFC 3551 §4.1).
        WriteRtpHeaderWithExtensions(m_packet, false, static_cast<uint8_t>(peer->audio_pt),
                                     peer->audio_seq++, timestamp, peer->audio_ssrc, -1, -1, "");
        memcpy(m_packet + 12, payload, len);
        peer->audio_packets++;
        peer->audio_octets += static_cast<uint32_t>(len);
        SendProtected(*peer, m_packet, 12 + len, false);
    }
}

void WebRtcServer::Run() {
    uint8_t buffer[2048];
    int timeout = 100;
    while (!m_stopping.load()) {
        pollfd fds[2] = {{m_socket, POLLIN, 0}, {m_wake[0], POLLIN, 0}};
        poll(fds, 2, timeout);
        std::shared_ptr<Peer> ended[kMaxSessions];
        {
            thread_mutex::Scoped hold(m_lock);
            const uint64_t now = NowMs();
            for (int i = 0; i < 64; ++i) {  // a bounded batch, then the timers
                sockaddr_in from{};
                socklen_t from_len = sizeof from;
                const ssize_t n = recvfrom(m_socket, buffer, sizeof buffer, 0,
                                           reinterpret_cast<sockaddr*>(&from), &from_len);
                if (n <= 0) break;
                OnDatagram(buffer, static_cast<size_t>(n), from, now);
            }
            timeout = Housekeeping(now);
            // Sessions that failed or went silent end here; their holds are released below.
            for (int i = 0; i < kMaxSessions; ++i) {
                Peer* peer = m_peers[i].get();
                if (peer == nullptr) continue;
                const char* why = nullptr;
                const bool failed = peer->dtls->state() == DtlsSrtpSession::State::kFailed;
                // A browser that closes its connection says so (close_notify): not a fault.
                const bool closed =
                    failed && peer->dtls->why().find("close_notify") != std::string::npos;
                if (closed) {
                    why = "the viewer closed it";
                } else if (failed) {
                    why = "DTLS failed";
                } else if (!peer->playing &&
                           now - peer->created_ms >
                               static_cast<uint64_t>(m_options.connect_timeout_ms)) {
                    why = peer->has_remote ? "no DTLS handshake in time"
                                           : "no connectivity check in time (ICE failed)";
                } else if (peer->has_remote &&
                           now - peer->last_check_ms >
                               static_cast<uint64_t>(m_options.consent_timeout_ms)) {
                    why = "no consent check for 30 s (the viewer is gone)";
                }
                if (why != nullptr) {
                    if (failed && !closed) {
                        OrvexLogPriority(platform::kLogWarn, kTag, "WebRTC session %s: %s",
                                         peer->id.c_str(), peer->dtls->why().c_str());
                    }
                    ended[i] = Remove(i, why);
                }
            }
        }
        for (auto& peer : ended) {
            if (peer != nullptr) Finish(peer);
        }
    }
}

int WebRtcServer::Housekeeping(uint64_t now) {
    int timeout = 100;
    auto send_to = [this](Peer* peer) {
        return [this, peer](const uint8_t* p, size_t n) { SendDatagram(peer->remote, p, n); };
    };
    for (auto& slot : m_peers) {
        Peer* peer = slot.get();
        if (peer == nullptr) continue;
        if (!peer->playing && peer->has_remote) {
            const int wait = peer->dtls->NextTimeoutMs();
            if (wait == 0) peer->dtls->OnTimeout(send_to(peer));
            if (wait > 0 && wait < timeout) timeout = wait;
        }
        if (peer->playing && now - peer->last_report_ms >= kReportIntervalMs) {
            peer->last_report_ms = now;
            SendReports(*peer);
        }
    }
    return timeout < 1 ? 1 : timeout;
}

void WebRtcServer::SendReports(Peer& peer) {
    // Sender reports tie each track's RTP time to the wall clock, which is how a browser
    // keeps sound and picture together (RFC 3550 §6.4.1).
    const uint64_t ntp = NtpNow();
    const uint32_t now_ms = GetTimeStampMillsec();
    uint8_t report[64 + kSrtpMaxTrailer];
    if (peer.video_packets > 0) {
        size_t n = WriteSenderReport(peer.video_ssrc, ntp, now_ms * 90u, peer.video_packets,
                                     peer.video_octets, report, 64);
        if (n > 0 && peer.dtls->ProtectRtcp(report, &n, sizeof report)) {
            SendDatagram(peer.remote, report, n);
        }
    }
    if (peer.audio_packets > 0) {
        const uint32_t audio_ts = m_audio_clock_ts + (now_ms - m_audio_clock_ms) * 48u;
        size_t n = WriteSenderReport(peer.audio_ssrc, ntp, audio_ts, peer.audio_packets,
                                     peer.audio_octets, report, 64);
        if (n > 0 && peer.dtls->ProtectRtcp(report, &n, sizeof report)) {
            SendDatagram(peer.remote, report, n);
        }
    }
}

ssize_t WebRtcServer::SendDatagram(const sockaddr_in& to, const uint8_t* p, size_t n) {
    return sendto(m_socket, p, n, MSG_NOSIGNAL, reinterpret_cast<const sockaddr*>(&to), sizeof to);
}

Peer* WebRtcServer::ByAddress(const sockaddr_in& from) {
    for (auto& peer : m_peers) {
        if (peer != nullptr && peer->has_remote && SameAddress(peer->remote, from))
            return peer.get();
    }
    return nullptr;
}

void WebRtcServer::OnDatagram(uint8_t* data, size_t len, const sockaddr_in& from, uint64_t now) {
    if (len == 0) return;
    // RFC 7983 §7: the first byte tells STUN (0-3), DTLS (20-63) and RTP/RTCP (128-191) apart.
    if (LooksLikeStun(data, len)) {
        OnStun(data, len, from, now);
        return;
    }
    Peer* peer = ByAddress(from);
    if (peer == nullptr) return;  // not a checked address: ignored, as ICE requires
    if (data[0] >= 20 && data[0] <= 63) {
        const bool was_playing = peer->playing;
        auto send = [this, peer](const uint8_t* p, size_t n) { SendDatagram(peer->remote, p, n); };
        if (peer->dtls->Feed(data, len, send) == DtlsSrtpSession::State::kConnected &&
            !was_playing) {
            peer->playing = true;
            peer->need_key = true;
            m_playing.fetch_add(1);
            stream::AskForKeyFrame();
            OrvexLog(kTag, "WebRTC session %s of %s playing, from %s, after %u ms\n",
                     peer->id.c_str(), peer->text.c_str(), AddressText(from).c_str(),
                     static_cast<unsigned>(now - peer->created_ms));
        }
        return;
    }
    if (LooksLikeRtcp(data, len) && peer->playing) OnRtcp(*peer, data, len);
}

void WebRtcServer::OnStun(const uint8_t* data, size_t len, const sockaddr_in& from, uint64_t now) {
    StunBindingRequest request{};
    if (ReadStunBindingRequest(data, len, &request) != StunRead::kOk) return;
    const std::string_view ufrag = LocalUfragOf(request.username);
    Peer* peer = nullptr;
    for (auto& candidate : m_peers) {
        if (candidate != nullptr && candidate->ufrag == ufrag) peer = candidate.get();
    }
    if (peer == nullptr || !CheckStunIntegrity(data, len, peer->pwd)) return;
    uint8_t response[256];
    const size_t n = WriteStunBindingSuccess(request, reinterpret_cast<const sockaddr*>(&from),
                                             peer->pwd, response, sizeof response);
    if (n > 0) {
        SendDatagram(from, response, n);
    }
    // ICE-lite: the browser nominates; its nominated pair's address is where media goes.
    if (!peer->has_remote || (request.use_candidate && !SameAddress(peer->remote, from))) {
        peer->remote = from;
        peer->has_remote = true;
    }
    if (SameAddress(peer->remote, from)) peer->last_check_ms = now;
}

void WebRtcServer::OnRtcp(Peer& peer, uint8_t* data, size_t len) {
    if (!peer.dtls->UnprotectRtcp(data, &len)) return;
    RtcpFeedback feedback{};
    if (!ReadRtcp(data, len, &feedback)) return;
    if (feedback.nacked_count > 0 && feedback.nack_media_ssrc == peer.video_ssrc) {
        for (int i = 0; i < feedback.nacked_count; ++i) {
            const uint8_t* packet = nullptr;
            size_t n = 0;
            if (!peer.history.Find(feedback.nacked[i], &packet, &n)) {
                ++peer.nacked_missing;
                continue;
            }
            ++peer.resent;
            SendDatagram(peer.remote, packet, n);
        }
    }
    if (feedback.has_report && feedback.report_ssrc == peer.video_ssrc)
        peer.reported_lost = feedback.cumulative_lost;
    if ((feedback.pli || feedback.fir) && feedback.keyframe_media_ssrc == peer.video_ssrc)
        stream::AskForKeyFrame();
}

}  // namespace webrtc

namespace {
std::unique_ptr<webrtc::WebRtcServer> g_server;

std::string CertificatePath() {
    const char* home = getenv("HOME");
    const char* config = getenv("XDG_CONFIG_HOME");
    if (config != nullptr && config[0] == '/')
        return std::string(config) + "/orvex/webrtc-cert.pem";
    if (home != nullptr && home[0] == '/')
        return std::string(home) + "/.config/orvex/webrtc-cert.pem";
    return "/data/orvex/webrtc-cert.pem";  // the television's service has no home
}
}  // namespace

WhepEndpoint* StartWebRtc(const config::Settings& settings, stream::CaptureDemand* demand) {
    // Unset is the television's default: nothing opens. A refused value was logged.
    if (settings.webrtc_port < 0) return nullptr;
    webrtc::WebRtcServer::Options options;
    options.port = static_cast<uint16_t>(settings.webrtc_port);
    options.bind = settings.bind;
    options.certificate_path = CertificatePath();
    auto server = std::make_unique<webrtc::WebRtcServer>(demand, options);
    if (!server->Start()) return nullptr;
    g_server = std::move(server);
    return g_server.get();
}

void StopWebRtc() { g_server.reset(); }
