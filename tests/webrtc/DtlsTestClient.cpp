#include "DtlsTestClient.h"

#include <openssl/evp.h>
#include <openssl/x509.h>

#include <sys/time.h>

#include <cstring>

#include "webrtc/DtlsSrtp.h"

namespace webrtc::test {

X509* SelfSigned(EVP_PKEY* key, long from_days, long to_days) {
    X509* x = X509_new();
    X509_NAME* name = X509_get_subject_name(x);
    ASN1_INTEGER_set(X509_get_serialNumber(x), 7);
    X509_time_adj_ex(X509_getm_notBefore(x), from_days, 0, nullptr);
    X509_time_adj_ex(X509_getm_notAfter(x), to_days, 0, nullptr);
    X509_set_pubkey(x, key);
    X509_NAME_add_entry_by_txt(name, "CN", MBSTRING_ASC,
                               reinterpret_cast<const unsigned char*>("browser"), -1, -1, 0);
    X509_set_issuer_name(x, name);
    X509_sign(x, key, EVP_sha256());
    return x;
}

std::vector<uint8_t> Sha256(X509* cert) {
    unsigned char md[EVP_MAX_MD_SIZE];
    unsigned len = 0;
    X509_digest(cert, EVP_sha256(), md, &len);
    return std::vector<uint8_t>(md, md + len);
}

std::string Sha256Text(X509* cert) {
    std::string text;
    char hex[4];
    for (uint8_t b : Sha256(cert)) {
        snprintf(hex, sizeof(hex), "%s%02X", text.empty() ? "" : ":", b);
        text += hex;
    }
    return text;
}

DtlsTestClient::DtlsTestClient(const char* profiles) {
    webrtc::StartSrtp();  // the process's one start, shared with the server side
    key_ = EVP_EC_gen("P-256");
    cert_ = SelfSigned(key_, -1, 30);
    ctx_ = SSL_CTX_new(DTLS_client_method());
    SSL_CTX_set_min_proto_version(ctx_, DTLS1_2_VERSION);
    SSL_CTX_set_max_proto_version(ctx_, DTLS1_2_VERSION);
    SSL_CTX_use_certificate(ctx_, cert_);
    SSL_CTX_use_PrivateKey(ctx_, key_);
    if (profiles) SSL_CTX_set_tlsext_use_srtp(ctx_, profiles);
    // The browser checks the server against the answer's fingerprint; the tests do it by hand.
    SSL_CTX_set_verify(ctx_, SSL_VERIFY_PEER, [](int, X509_STORE_CTX*) { return 1; });
    SSL_CTX_set_options(ctx_, SSL_OP_NO_QUERY_MTU);
    ssl_ = SSL_new(ctx_);
    in_ = BIO_new(BIO_s_mem());
    out_ = BIO_new(BIO_s_mem());
    BIO_set_mem_eof_return(in_, -1);
    SSL_set_bio(ssl_, in_, out_);
    DTLS_set_link_mtu(ssl_, 1200);
    SSL_set_connect_state(ssl_);
}

DtlsTestClient::~DtlsTestClient() {
    if (receive_) srtp_dealloc(receive_);
    if (send_) srtp_dealloc(send_);
    SSL_free(ssl_);
    SSL_CTX_free(ctx_);
    X509_free(cert_);
    EVP_PKEY_free(key_);
}

Datagrams DtlsTestClient::Step(const Datagrams& in) {
    for (const auto& d : in) {
        BIO_write(in_, d.data(), static_cast<int>(d.size()));
        if (!connected_) {
            connected_ = SSL_do_handshake(ssl_) == 1;
        }
        uint8_t sink[2048];
        while (connected_ && SSL_read(ssl_, sink, sizeof(sink)) > 0) {
        }
        closed_by_peer_ = closed_by_peer_ || (SSL_get_shutdown(ssl_) & SSL_RECEIVED_SHUTDOWN);
    }
    if (in.empty() && !connected_) connected_ = SSL_do_handshake(ssl_) == 1;
    return Drain();
}

int DtlsTestClient::NextTimeoutMs() {
    timeval left;
    if (DTLSv1_get_timeout(ssl_, &left) != 1) return -1;
    return static_cast<int>(left.tv_sec * 1000 + (left.tv_usec + 999) / 1000);
}

Datagrams DtlsTestClient::OnTimeout() {
    DTLSv1_handle_timeout(ssl_);
    return Drain();
}

Datagrams DtlsTestClient::Drain() {
    // The memory BIO runs the records together; a record header (RFC 6347 §4.1) holds its
    // length in bytes 11 and 12.
    char* p = nullptr;
    const long n = BIO_get_mem_data(out_, &p);
    Datagrams out;
    for (long at = 0; at + 13 <= n;) {
        const long len =
            13 + ((static_cast<uint8_t>(p[at + 11]) << 8) | static_cast<uint8_t>(p[at + 12]));
        out.emplace_back(p + at, p + at + len);
        at += len;
    }
    (void)BIO_reset(out_);
    return out;
}

bool DtlsTestClient::KeySrtp() {
    const SRTP_PROTECTION_PROFILE* profile = SSL_get_selected_srtp_profile(ssl_);
    if (!profile) return false;
    const bool gcm = profile->id == SRTP_AEAD_AES_128_GCM;
    const size_t k = 16, s = gcm ? 12 : 14;
    unsigned char m[60], client[30], server[30];
    if (SSL_export_keying_material(ssl_, m, 2 * (k + s), "EXTRACTOR-dtls_srtp", 19, nullptr, 0,
                                   0) != 1) {
        return false;
    }
    memcpy(client, m, k);
    memcpy(client + k, m + 2 * k, s);
    memcpy(server, m + k, k);
    memcpy(server + k, m + 2 * k + s, s);
    srtp_policy_t p[2];
    memset(p, 0, sizeof(p));
    for (int i = 0; i < 2; ++i) {
        if (gcm) {
            srtp_crypto_policy_set_aes_gcm_128_16_auth(&p[i].rtp);
            srtp_crypto_policy_set_aes_gcm_128_16_auth(&p[i].rtcp);
        } else {
            srtp_crypto_policy_set_rtp_default(&p[i].rtp);
            srtp_crypto_policy_set_rtcp_default(&p[i].rtcp);
        }
        p[i].window_size = 4096;
    }
    p[0].ssrc.type = ssrc_any_inbound;
    p[0].key = server;
    p[1].ssrc.type = ssrc_any_outbound;
    p[1].key = client;
    return srtp_create(&receive_, &p[0]) == srtp_err_status_ok &&
           srtp_create(&send_, &p[1]) == srtp_err_status_ok;
}

bool DtlsTestClient::UnprotectRtp(std::vector<uint8_t>* packet) {
    int n = static_cast<int>(packet->size());
    if (srtp_unprotect(receive_, packet->data(), &n) != srtp_err_status_ok) return false;
    packet->resize(n);
    return true;
}

bool DtlsTestClient::UnprotectRtcp(std::vector<uint8_t>* packet) {
    int n = static_cast<int>(packet->size());
    if (srtp_unprotect_rtcp(receive_, packet->data(), &n) != srtp_err_status_ok) return false;
    packet->resize(n);
    return true;
}

bool DtlsTestClient::ProtectRtcp(std::vector<uint8_t>* packet) {
    int n = static_cast<int>(packet->size());
    packet->resize(n + SRTP_MAX_TRAILER_LEN + 4);
    if (srtp_protect_rtcp(send_, packet->data(), &n) != srtp_err_status_ok) return false;
    packet->resize(n);
    return true;
}

}  // namespace webrtc::test
