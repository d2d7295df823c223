#pragma once

#include <memory>
#include <string>
#include <utility>

struct ssl_ctx_st;

// An ECDSA P-256 self-signed certificate and key, kept in one PEM file (mode 0600, its folder
// created 0700) so browsers see the same fingerprint across restarts; made anew when the file is
// missing, unreadable, not a P-256 key with its certificate, or expired.
// Thread contract: immutable after LoadOrCreate, any thread.
namespace webrtc {

class DtlsCertificate {
public:
    // Null with `why` when no certificate could be made. Otherwise `why` is empty, or a note worth
    // one log line, as the fingerprint browsers see changes: the file was there but not usable
    // (and why) and was replaced, or the new certificate could not be written (it serves this run
    // only).
    static std::unique_ptr<DtlsCertificate> LoadOrCreate(const std::string& path, std::string* why);
    ~DtlsCertificate();
    DtlsCertificate(const DtlsCertificate&) = delete;
    DtlsCertificate& operator=(const DtlsCertificate&) = delete;

    // "AB:CD:..." (32 bytes, uppercase), for a=fingerprint:sha-256 (RFC 8122 §5).
    const std::string& Sha256Fingerprint() const { return fingerprint_; }

private:
    friend class DtlsSrtpSession;
    DtlsCertificate(ssl_ctx_st* ctx, std::string fingerprint)
        : ctx_(ctx), fingerprint_(std::move(fingerprint)) {}

    // The DTLS server context every session of this certificate is made from (SSL_new takes its
    // own reference); owned, freed with the certificate.
    ssl_ctx_st* ctx_;
    std::string fingerprint_;
};

}  // namespace webrtc
