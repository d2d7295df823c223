#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "webrtc/DtlsCertificate.h"

struct ssl_st;
struct srtp_ctx_t_;
struct x509_store_ctx_st;

namespace webrtc {

// What protecting adds to a packet at most: the 16-byte tag of AES-128-GCM (HMAC-SHA1-80's is
// 10) plus, for SRTCP, the 4-byte E flag and index (RFC 3711 §3.4); no MKI is negotiated.
constexpr size_t kSrtpMaxTrailer = 16 + 4;

// Largest DTLS datagram we send: the size WebRTC stacks keep to so that a flight fits a path
// whose MTU is unknown (1200 + 20 IPv4 + 8 UDP, or + 40 IPv6, stays well under 1280).
constexpr size_t kDtlsMtu = 1200;

// How far behind the newest sent sequence number a packet may still be protected (a NACK
// resend): 2048 packets is about 1.2 s at 16 Mbit/s in 1200-byte packets (16e6 / 8 / 1200 =
// 1667 a second). libsrtp keeps 2048 bits for it per SSRC; SRTCP's window is its own (128).
constexpr unsigned long kSrtpReplayWindow = 2048;

// One viewer's DTLS association (server side, RFC 5763/5764) and the SRTP contexts keyed from it.
// It keeps its own reference to the certificate's context: the certificate may go first.
// Thread contract: one thread at a time (the caller serialises; the UDP thread in practice).
// Starts libsrtp for the process, once; any thread, any number of times. Every user of
// libsrtp in the process goes through here: srtp_init again would restart its crypto kernel
// under a session being keyed on another thread. False when libsrtp cannot start.
bool StartSrtp();

class DtlsSrtpSession {
public:
    enum class State { kHandshaking, kConnected, kFailed };
    using Send = std::function<void(const uint8_t*, size_t)>;

    // `remote_fingerprint` is the a=fingerprint of the offer (sha-256 bytes); a peer certificate
    // whose digest differs fails the handshake.
    DtlsSrtpSession(const DtlsCertificate& cert, std::vector<uint8_t> remote_fingerprint);
    ~DtlsSrtpSession();
    DtlsSrtpSession(const DtlsSrtpSession&) = delete;
    DtlsSrtpSession& operator=(const DtlsSrtpSession&) = delete;

    // One datagram from the peer (RFC 7983: first byte 20..63; others are ignored). Any datagrams
    // to send back (each at most kDtlsMtu) go to `send` before it returns; `send` must not call
    // into this session. Returns the state after it.
    State Feed(const uint8_t* p, size_t n, const Send& send);
    // Handshake retransmissions: call when NextTimeoutMs() has passed (DTLSv1_handle_timeout).
    // OpenSSL waits 1 s, doubling to 60 s, and gives up (kFailed) after twelve; a caller that
    // ends sessions whose ICE consent lapses needs no limit of its own.
    int NextTimeoutMs() const;  // -1 none
    State OnTimeout(const Send& send);
    // Sends close_notify when connected; the session is kFailed ("closed") after it.
    void Close(const Send& send);

    State state() const { return state_; }
    const std::string& why() const { return why_; }
    // The negotiated profile's name (RFC 5764 §4.1.2, RFC 7714 §14.2), empty before kConnected.
    const char* srtp_profile() const { return profile_name_; }

    // After kConnected. In place; `cap` >= len + kSrtpMaxTrailer. False when not connected or
    // libsrtp refuses (the packet is then unchanged or unusable).
    bool ProtectRtp(uint8_t* packet, size_t* len, size_t cap);
    bool ProtectRtcp(uint8_t* packet, size_t* len, size_t cap);
    // A compound RTCP packet from the peer (receiver reports, NACK, PLI); false when it does not
    // authenticate or replays one already taken.
    bool UnprotectRtcp(uint8_t* packet, size_t* len);

private:
    friend struct DtlsDatagramBio;
    // OpenSSL's verify callback for the peer's chain: accepts self-signed certificates and
    // checks the leaf's digest against the offer's.
    static int VerifyPeer(int preverify_ok, x509_store_ctx_st* store);

    void Fail(std::string why);
    void FailFromSsl(int ret, const char* during);
    bool KeySrtp();

    ssl_st* ssl_ = nullptr;
    srtp_ctx_t_* outbound_ = nullptr;
    srtp_ctx_t_* inbound_ = nullptr;
    State state_ = State::kHandshaking;
    std::string why_;
    const char* profile_name_ = "";
    std::vector<uint8_t> remote_fingerprint_;

    // Set only while Feed, OnTimeout or Close runs: the datagram being fed, which the BIO hands
    // to OpenSSL once, and where the datagrams OpenSSL writes go.
    const uint8_t* in_ = nullptr;
    size_t in_len_ = 0;
    const Send* send_ = nullptr;
    // Set by VerifyPeer while the handshake runs, for why().
    bool fingerprint_mismatch_ = false;
};

}  // namespace webrtc
