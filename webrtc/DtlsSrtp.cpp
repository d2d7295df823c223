#include "webrtc/DtlsSrtp.h"

#include <limits.h>
#include <openssl/bio.h>
#include <openssl/crypto.h>
#include <openssl/err.h>
#include <openssl/evp.h>
#include <openssl/ssl.h>
#include <openssl/x509.h>
#include <srtp2/srtp.h>
#include <string.h>
#include <sys/time.h>

#include <mutex>
#include <utility>

namespace webrtc {

// The session's datagrams to and from OpenSSL without a socket. A read hands over the datagram
// being fed, once, whole (the record layer expects datagram reads, not a byte stream); a write
// is one datagram, as OpenSSL's handshake buffer packs records up to the MTU before it flushes.
struct DtlsDatagramBio {
    static DtlsSrtpSession* Session(BIO* b) {
        return static_cast<DtlsSrtpSession*>(BIO_get_data(b));
    }

    static int Write(BIO* b, const char* data, int len) {
        BIO_clear_retry_flags(b);
        DtlsSrtpSession* s = Session(b);
        // Outside Feed, OnTimeout and Close (SSL_free) there is no one to send to: dropped.
        if (s && s->send_ && len > 0) {
            (*s->send_)(reinterpret_cast<const uint8_t*>(data), static_cast<size_t>(len));
        }
        return len;
    }

    static int Read(BIO* b, char* data, int size) {
        BIO_clear_retry_flags(b);
        DtlsSrtpSession* s = Session(b);
        if (!s || !s->in_ || size <= 0) {
            BIO_set_retry_read(b);
            return -1;
        }
        // A datagram longer than the read is cut, as recvfrom would: its records fail to parse.
        const size_t n = s->in_len_ < static_cast<size_t>(size) ? s->in_len_ : size;
        memcpy(data, s->in_, n);
        s->in_ = nullptr;
        return static_cast<int>(n);
    }

    static long Ctrl(BIO* b, int cmd, long, void*) {
        switch (cmd) {
            case BIO_CTRL_FLUSH:
                return 1;
            case BIO_CTRL_PENDING: {
                DtlsSrtpSession* s = Session(b);
                return s && s->in_ ? static_cast<long>(s->in_len_) : 0;
            }
            default:
                // Including BIO_CTRL_DGRAM_GET_MTU_OVERHEAD: 0, so the link MTU is all ours.
                return 0;
        }
    }

    static int Create(BIO* b) {
        BIO_set_init(b, 1);
        return 1;
    }

    static const BIO_METHOD* Method() {
        static BIO_METHOD* method = [] {
            BIO_METHOD* m =
                BIO_meth_new(BIO_get_new_index() | BIO_TYPE_SOURCE_SINK, "orvex DTLS datagram");
            if (m) {
                BIO_meth_set_write(m, Write);
                BIO_meth_set_read(m, Read);
                BIO_meth_set_ctrl(m, Ctrl);
                BIO_meth_set_create(m, Create);
            }
            return m;
        }();
        return method;
    }
};

bool StartSrtp() {
    static std::once_flag once;
    static bool started = false;
    std::call_once(once, [] {
        started = srtp_init() == srtp_err_status_ok;
        // Debian's libsrtp2 does its cryptography through NSS, which each cipher starts and the
        // last one to go stops, unloading NSS's modules: a context held for the life of the
        // process keeps it started, so the first viewer after an idle spell does not load it
        // again (1.4 ms of a 2.3 ms handshake, bench_webrtc_dtls). It never protects anything.
        static srtp_t held = nullptr;
        unsigned char zeros[30] = {};
        srtp_policy_t policy;
        memset(&policy, 0, sizeof(policy));
        srtp_crypto_policy_set_rtp_default(&policy.rtp);
        srtp_crypto_policy_set_rtcp_default(&policy.rtcp);
        policy.ssrc.type = ssrc_any_outbound;
        policy.key = zeros;
        if (started) (void)srtp_create(&held, &policy);
    });
    return started;
}

namespace {

bool DigestIs(X509* cert, const std::vector<uint8_t>& expected) {
    unsigned char md[EVP_MAX_MD_SIZE];
    unsigned int len = 0;
    return cert && X509_digest(cert, EVP_sha256(), md, &len) && len == expected.size() &&
           CRYPTO_memcmp(md, expected.data(), len) == 0;
}

// RFC 5764 §4.1.2 and RFC 7714 §14.2: both take a 128-bit master key; the salt is 112 bits
// for AES-CM and 96 for GCM.
struct Profile {
    unsigned long id;
    size_t key_len;
    size_t salt_len;
    void (*set)(srtp_crypto_policy_t*);
};
constexpr Profile kProfiles[] = {
    {SRTP_AEAD_AES_128_GCM, 16, 12, srtp_crypto_policy_set_aes_gcm_128_16_auth},
    {SRTP_AES128_CM_SHA1_80, 16, 14, srtp_crypto_policy_set_rtp_default},  // AES-CM, HMAC-SHA1-80
};
constexpr size_t kMaxKeySalt = 16 + 14;

bool MakeSrtp(srtp_t* ctx, const Profile& profile, srtp_ssrc_type_t ssrc, unsigned char* key) {
    srtp_policy_t policy;
    memset(&policy, 0, sizeof(policy));
    profile.set(&policy.rtp);
    profile.set(&policy.rtcp);
    policy.ssrc.type = ssrc;
    policy.key = key;
    policy.window_size = kSrtpReplayWindow;
    // A NACK resend carries the sequence number it first had; its bytes are the same, so
    // protecting it again under the same index reveals nothing new (RFC 3711 §9.1 caveat).
    policy.allow_repeat_tx = ssrc == ssrc_any_outbound;
    return srtp_create(ctx, &policy) == srtp_err_status_ok;
}

}  // namespace

DtlsSrtpSession::DtlsSrtpSession(const DtlsCertificate& cert,
                                 std::vector<uint8_t> remote_fingerprint)
    : remote_fingerprint_(std::move(remote_fingerprint)) {
    if (remote_fingerprint_.size() != 32) {
        Fail("the offer's fingerprint is " + std::to_string(remote_fingerprint_.size()) +
             " bytes, not a SHA-256 digest");
        return;
    }
    ssl_ = SSL_new(cert.ctx_);
    const BIO_METHOD* method = DtlsDatagramBio::Method();
    BIO* bio = method ? BIO_new(method) : nullptr;
    if (!ssl_ || !bio) {
        BIO_free(bio);
        Fail("OpenSSL cannot make a DTLS session");
        return;
    }
    BIO_set_data(bio, this);
    SSL_set_bio(ssl_, bio, bio);  // one reference for both directions, owned by ssl_
    SSL_set_app_data(ssl_, this);
    // RFC 5763 §5: the peer's certificate is self-signed; what vouches for it is the offer.
    SSL_set_verify(ssl_, SSL_VERIFY_PEER | SSL_VERIFY_FAIL_IF_NO_PEER_CERT, VerifyPeer);
    DTLS_set_link_mtu(ssl_, kDtlsMtu);
    // Passive side (RFC 5763 §5, a=setup:passive): the browser sends the ClientHello. No cookie
    // exchange: ICE has already shown that the address answers.
    SSL_set_accept_state(ssl_);
}

DtlsSrtpSession::~DtlsSrtpSession() {
    SSL_free(ssl_);
    if (outbound_) srtp_dealloc(outbound_);
    if (inbound_) srtp_dealloc(inbound_);
}

int DtlsSrtpSession::VerifyPeer(int, X509_STORE_CTX* store) {
    // Only the leaf is checked; what the peer chains above it does not matter, and a
    // self-signed leaf's complaints (preverify 0) are expected.
    if (X509_STORE_CTX_get_error_depth(store) != 0) return 1;
    SSL* ssl =
        static_cast<SSL*>(X509_STORE_CTX_get_ex_data(store, SSL_get_ex_data_X509_STORE_CTX_idx()));
    auto* self = ssl ? static_cast<DtlsSrtpSession*>(SSL_get_app_data(ssl)) : nullptr;
    if (self && DigestIs(X509_STORE_CTX_get_current_cert(store), self->remote_fingerprint_)) {
        X509_STORE_CTX_set_error(store, X509_V_OK);
        return 1;
    }
    if (self) self->fingerprint_mismatch_ = true;
    X509_STORE_CTX_set_error(store, X509_V_ERR_CERT_REJECTED);  // bad_certificate to the peer
    return 0;
}

void DtlsSrtpSession::Fail(std::string why) {
    state_ = State::kFailed;
    why_ = std::move(why);
}

void DtlsSrtpSession::FailFromSsl(int error, const char* during) {
    if (fingerprint_mismatch_) {
        Fail("the peer's certificate is not the one the offer's fingerprint names");
        return;
    }
    std::string detail;
    if (error == SSL_ERROR_SSL) {
        char text[256];
        ERR_error_string_n(ERR_peek_error(), text, sizeof(text));
        detail = text;
    } else {
        detail = "SSL error " + std::to_string(error);
    }
    ERR_clear_error();
    Fail(std::string(during) + ": " + detail);
}

DtlsSrtpSession::State DtlsSrtpSession::Feed(const uint8_t* p, size_t n, const Send& send) {
    // RFC 7983 §7: 20..63 is DTLS; STUN, RTP and RTCP are not this session's.
    if (state_ == State::kFailed || !p || n == 0 || p[0] < 20 || p[0] > 63) return state_;
    in_ = p;
    in_len_ = n;
    send_ = &send;
    ERR_clear_error();
    if (state_ == State::kHandshaking) {
        const int r = SSL_do_handshake(ssl_);
        if (r == 1) {
            if (KeySrtp()) state_ = State::kConnected;
        } else {
            const int error = SSL_get_error(ssl_, r);
            if (error != SSL_ERROR_WANT_READ) FailFromSsl(error, "DTLS handshake failed");
        }
    }
    if (state_ == State::kConnected) {
        // No data channel: what comes now is alerts, or the peer's last flight again when our
        // Finished was lost (OpenSSL answers it here). Any application data is read and dropped.
        uint8_t sink[256];
        for (;;) {
            const int r = SSL_read(ssl_, sink, sizeof(sink));
            if (r > 0) continue;
            const int error = SSL_get_error(ssl_, r);
            if (error == SSL_ERROR_ZERO_RETURN) {
                Fail("the peer closed the DTLS association (close_notify)");
            } else if (error != SSL_ERROR_WANT_READ) {
                FailFromSsl(error, "DTLS association failed");
            }
            break;
        }
    }
    in_ = nullptr;
    send_ = nullptr;
    return state_;
}

int DtlsSrtpSession::NextTimeoutMs() const {
    timeval left;
    if (state_ != State::kHandshaking || DTLSv1_get_timeout(ssl_, &left) != 1) return -1;
    return static_cast<int>(left.tv_sec * 1000 + (left.tv_usec + 999) / 1000);
}

DtlsSrtpSession::State DtlsSrtpSession::OnTimeout(const Send& send) {
    if (state_ != State::kHandshaking) return state_;
    send_ = &send;
    ERR_clear_error();
    // 0: not due yet, or nothing in flight; 1: the last flight sent again; -1: OpenSSL gave up
    // after its twelve retransmissions.
    if (DTLSv1_handle_timeout(ssl_) < 0) {
        FailFromSsl(SSL_ERROR_SSL, "DTLS handshake failed: no answer from the peer");
    }
    send_ = nullptr;
    return state_;
}

void DtlsSrtpSession::Close(const Send& send) {
    if (state_ == State::kConnected) {
        send_ = &send;
        ERR_clear_error();
        SSL_shutdown(ssl_);
        ERR_clear_error();
        send_ = nullptr;
    }
    if (state_ != State::kFailed) Fail("closed");
}

bool DtlsSrtpSession::KeySrtp() {
    // A session the verify callback let through still shows the certificate it was shown.
    if (!DigestIs(SSL_get0_peer_certificate(ssl_), remote_fingerprint_)) {
        Fail("the peer's certificate is not the one the offer's fingerprint names");
        return false;
    }
    const SRTP_PROTECTION_PROFILE* chosen = SSL_get_selected_srtp_profile(ssl_);
    const Profile* profile = nullptr;
    for (const Profile& p : kProfiles) {
        if (chosen && chosen->id == p.id) profile = &p;
    }
    if (!profile) {
        Fail("the peer offered no SRTP profile we take (use_srtp, RFC 5764 §4.1.1)");
        return false;
    }
    if (!StartSrtp()) {
        Fail("libsrtp did not start");
        return false;
    }
    // RFC 5764 §4.2: client write key, server write key, client salt, server salt. We are the
    // server: we send with the server's key and salt and receive with the client's.
    const size_t k = profile->key_len;
    const size_t s = profile->salt_len;
    unsigned char material[2 * kMaxKeySalt];
    unsigned char local[kMaxKeySalt];
    unsigned char remote[kMaxKeySalt];
    static const char kLabel[] = "EXTRACTOR-dtls_srtp";
    bool ok = SSL_export_keying_material(ssl_, material, 2 * (k + s), kLabel, sizeof(kLabel) - 1,
                                         nullptr, 0, 0) == 1;
    if (ok) {
        memcpy(remote, material, k);
        memcpy(remote + k, material + 2 * k, s);
        memcpy(local, material + k, k);
        memcpy(local + k, material + 2 * k + s, s);
        ok = MakeSrtp(&outbound_, *profile, ssrc_any_outbound, local) &&
             MakeSrtp(&inbound_, *profile, ssrc_any_inbound, remote);
    }
    OPENSSL_cleanse(material, sizeof(material));
    OPENSSL_cleanse(local, sizeof(local));
    OPENSSL_cleanse(remote, sizeof(remote));
    if (!ok) {
        Fail("cannot key SRTP from the DTLS association");
        return false;
    }
    profile_name_ = chosen->name;
    return true;
}

bool DtlsSrtpSession::ProtectRtp(uint8_t* packet, size_t* len, size_t cap) {
    if (state_ != State::kConnected || !packet || *len > INT_MAX - kSrtpMaxTrailer ||
        cap < *len + kSrtpMaxTrailer) {
        return false;
    }
    int n = static_cast<int>(*len);
    if (srtp_protect(outbound_, packet, &n) != srtp_err_status_ok) return false;
    *len = static_cast<size_t>(n);
    return true;
}

bool DtlsSrtpSession::ProtectRtcp(uint8_t* packet, size_t* len, size_t cap) {
    if (state_ != State::kConnected || !packet || *len > INT_MAX - kSrtpMaxTrailer ||
        cap < *len + kSrtpMaxTrailer) {
        return false;
    }
    int n = static_cast<int>(*len);
    if (srtp_protect_rtcp(outbound_, packet, &n) != srtp_err_status_ok) return false;
    *len = static_cast<size_t>(n);
    return true;
}

bool DtlsSrtpSession::UnprotectRtcp(uint8_t* packet, size_t* len) {
    if (state_ != State::kConnected || !packet || *len > INT_MAX) return false;
    int n = static_cast<int>(*len);
    if (srtp_unprotect_rtcp(inbound_, packet, &n) != srtp_err_status_ok) return false;
    *len = static_cast<size_t>(n);
    return true;
}

}  // namespace webrtc
