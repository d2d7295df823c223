#pragma once

#include <openssl/ssl.h>
#include <srtp2/srtp.h>

#include <cstdint>
#include <string>
#include <vector>

// The browser's side of a DTLS-SRTP association, written against OpenSSL and libsrtp2 directly
// (not through webrtc/): the active DTLS client with its own self-signed P-256 certificate, over
// memory BIOs, and the SRTP contexts keyed from its own export. Thread contract: one thread.
namespace webrtc::test {

using Datagrams = std::vector<std::vector<uint8_t>>;

// A self-signed certificate of `key` valid from `from_days` to `to_days` (from now).
X509* SelfSigned(EVP_PKEY* key, long from_days, long to_days);
std::vector<uint8_t> Sha256(X509* cert);
std::string Sha256Text(X509* cert);  // "AB:CD:..."

class DtlsTestClient {
public:
    // `profiles` for use_srtp, or nullptr to offer none.
    explicit DtlsTestClient(const char* profiles);
    ~DtlsTestClient();

    std::vector<uint8_t> Fingerprint() const { return Sha256(cert_); }
    // Feeds the server's datagrams (none to start), steps the handshake and returns what the
    // client sends, one record a datagram as a datagram socket would carry them.
    Datagrams Step(const Datagrams& in);
    // Its retransmission timer: milliseconds left (-1: none), and what it sends again when due.
    int NextTimeoutMs();
    Datagrams OnTimeout();
    bool connected() const { return connected_; }
    bool closed_by_peer() const { return closed_by_peer_; }
    SSL* ssl() { return ssl_; }

    // After connected(): keys its SRTP from the exporter (client side of RFC 5764 §4.2).
    bool KeySrtp();
    bool UnprotectRtp(std::vector<uint8_t>* packet);
    bool UnprotectRtcp(std::vector<uint8_t>* packet);
    bool ProtectRtcp(std::vector<uint8_t>* packet);

private:
    Datagrams Drain();

    EVP_PKEY* key_ = nullptr;
    X509* cert_ = nullptr;
    SSL_CTX* ctx_ = nullptr;
    SSL* ssl_ = nullptr;
    BIO* in_ = nullptr;
    BIO* out_ = nullptr;
    bool connected_ = false;
    bool closed_by_peer_ = false;
    srtp_t receive_ = nullptr;
    srtp_t send_ = nullptr;
};

}  // namespace webrtc::test
