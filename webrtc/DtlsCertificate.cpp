#include "webrtc/DtlsCertificate.h"

#include <errno.h>
#include <fcntl.h>
#include <openssl/bio.h>
#include <openssl/bn.h>
#include <openssl/err.h>
#include <openssl/evp.h>
#include <openssl/pem.h>
#include <openssl/rand.h>
#include <openssl/ssl.h>
#include <openssl/x509.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <utility>

namespace webrtc {
namespace {

struct Free {
    void operator()(EVP_PKEY* p) const { EVP_PKEY_free(p); }
    void operator()(X509* p) const { X509_free(p); }
    void operator()(BIO* p) const { BIO_free(p); }
    void operator()(BIGNUM* p) const { BN_free(p); }
    void operator()(SSL_CTX* p) const { SSL_CTX_free(p); }
};
using Key = std::unique_ptr<EVP_PKEY, Free>;
using Cert = std::unique_ptr<X509, Free>;

// Ten years: the browsers compare the digest only, and a certificate that outlived its dates
// would be made anew with a new fingerprint, which a browser that remembers the old one refuses.
constexpr long kValidDays = 3650;

std::string OpensslError(const char* what) {
    char text[256] = "no detail";
    if (unsigned long e = ERR_get_error()) ERR_error_string_n(e, text, sizeof(text));
    ERR_clear_error();
    return std::string(what) + " (" + text + ")";
}

// A key with a passphrase is not ours: refuse it instead of OpenSSL asking the terminal.
int NoPassphrase(char*, int, int, void*) { return 0; }

// The key and certificate of `path` when both are there, belong together, are P-256 and are in
// date; otherwise false with the reason in `why` (empty when the file does not exist).
bool Load(const std::string& path, Key* key, Cert* cert, std::string* why) {
    struct stat st;
    if (stat(path.c_str(), &st) != 0 && errno == ENOENT) {
        why->clear();
        return false;
    }
    std::unique_ptr<BIO, Free> in(BIO_new_file(path.c_str(), "r"));
    if (!in) {
        *why = OpensslError("cannot read it");
        return false;
    }
    key->reset(PEM_read_bio_PrivateKey(in.get(), nullptr, NoPassphrase, nullptr));
    // The certificate is read from the top again, so the order of the two blocks is free.
    if (!*key || BIO_reset(in.get()) != 0) {
        *why = OpensslError("no private key in it");
        return false;
    }
    cert->reset(PEM_read_bio_X509(in.get(), nullptr, NoPassphrase, nullptr));
    if (!*cert) {
        *why = OpensslError("no certificate in it");
        return false;
    }
    char group[32] = "";
    size_t group_len = 0;
    if (!EVP_PKEY_is_a(key->get(), "EC") ||
        !EVP_PKEY_get_group_name(key->get(), group, sizeof(group), &group_len) ||
        strcmp(group, "prime256v1") != 0) {
        *why = "its key is not ECDSA P-256";
        ERR_clear_error();
        return false;
    }
    if (X509_check_private_key(cert->get(), key->get()) != 1) {
        *why = OpensslError("its certificate is not the key's");
        return false;
    }
    // Out of date within a day: made anew before a browser would see it expire mid-session.
    time_t tomorrow = time(nullptr) + 86400;
    if (X509_cmp_time(X509_get0_notAfter(cert->get()), &tomorrow) <= 0) {
        *why = "its certificate has expired";
        return false;
    }
    return true;
}

bool Generate(Key* key, Cert* cert, std::string* why) {
    key->reset(EVP_EC_gen("P-256"));
    cert->reset(X509_new());
    std::unique_ptr<BIGNUM, Free> serial(BN_new());
    // A random positive 63-bit serial (RFC 5280 §4.1.2.2: positive, at most 20 bytes).
    if (!*key || !*cert || !serial || !BN_rand(serial.get(), 63, BN_RAND_TOP_ANY, 0) ||
        !BN_to_ASN1_INTEGER(serial.get(), X509_get_serialNumber(cert->get()))) {
        *why = OpensslError("cannot make a P-256 key");
        return false;
    }
    X509* x = cert->get();
    X509_NAME* name = X509_get_subject_name(x);
    // notBefore a day back: a browser whose clock is behind ours must not see it as not yet valid.
    if (!X509_set_version(x, X509_VERSION_3) || !X509_gmtime_adj(X509_getm_notBefore(x), -86400) ||
        !X509_time_adj_ex(X509_getm_notAfter(x), kValidDays, 0, nullptr) ||
        !X509_set_pubkey(x, key->get()) ||
        !X509_NAME_add_entry_by_txt(name, "CN", MBSTRING_ASC,
                                    reinterpret_cast<const unsigned char*>("orvex"), -1, -1, 0) ||
        !X509_set_issuer_name(x, name) || !X509_sign(x, key->get(), EVP_sha256())) {
        *why = OpensslError("cannot sign the certificate");
        return false;
    }
    return true;
}

// mkdir -p with 0700 for the folders it makes; those already there are left as they are.
bool MakeFolders(const std::string& path, std::string* why) {
    for (size_t slash = path.find('/', 1); slash != std::string::npos;
         slash = path.find('/', slash + 1)) {
        const std::string folder = path.substr(0, slash);
        if (mkdir(folder.c_str(), 0700) != 0 && errno != EEXIST) {
            *why = "cannot make " + folder + ": " + strerror(errno);
            return false;
        }
    }
    return true;
}

// Written whole to a temporary file beside it, then renamed over it: a crash mid-write leaves
// the old file or the new one, never half of one.
bool Save(const std::string& path, EVP_PKEY* key, X509* cert, std::string* why) {
    if (!MakeFolders(path, why)) return false;
    std::string temp = path + ".XXXXXX";
    const int fd = mkstemp(&temp[0]);  // mode 0600 whatever the umask
    if (fd < 0) {
        *why = "cannot write beside " + path + ": " + strerror(errno);
        return false;
    }
    std::unique_ptr<BIO, Free> out(BIO_new_fd(fd, BIO_NOCLOSE));
    bool ok =
        out &&
        PEM_write_bio_PrivateKey(out.get(), key, nullptr, nullptr, 0, nullptr, nullptr) == 1 &&
        PEM_write_bio_X509(out.get(), cert) == 1 && BIO_flush(out.get()) == 1;
    if (!ok) *why = OpensslError(("cannot write " + temp).c_str());
    if (ok && fsync(fd) != 0) {
        *why = "cannot write " + temp + ": " + strerror(errno);
        ok = false;
    }
    close(fd);
    if (ok && rename(temp.c_str(), path.c_str()) != 0) {
        *why = "cannot replace " + path + ": " + strerror(errno);
        ok = false;
    }
    if (!ok) unlink(temp.c_str());
    return ok;
}

std::string Sha256Text(X509* cert) {
    unsigned char md[EVP_MAX_MD_SIZE];
    unsigned int len = 0;
    if (!X509_digest(cert, EVP_sha256(), md, &len)) return "";
    static const char kHex[] = "0123456789ABCDEF";
    std::string text;
    for (unsigned i = 0; i < len; ++i) {
        if (i) text += ':';
        text += kHex[md[i] >> 4];
        text += kHex[md[i] & 15];
    }
    return text;
}

// The DTLS server side every session shares; what is per session (the peer check, the MTU)
// is set on each SSL.
SSL_CTX* ServerContext(EVP_PKEY* key, X509* cert, std::string* why) {
    std::unique_ptr<SSL_CTX, Free> ctx(SSL_CTX_new(DTLS_server_method()));
    // Chrome and Firefox both speak DTLS 1.2; 1.0 is too weak to offer.
    if (!ctx || !SSL_CTX_set_min_proto_version(ctx.get(), DTLS1_2_VERSION) ||
        !SSL_CTX_set_max_proto_version(ctx.get(), DTLS1_2_VERSION) ||
        SSL_CTX_use_certificate(ctx.get(), cert) != 1 ||
        SSL_CTX_use_PrivateKey(ctx.get(), key) != 1 ||
        // Unlike everything else here, 0 is success.
        SSL_CTX_set_tlsext_use_srtp(ctx.get(), "SRTP_AEAD_AES_128_GCM:SRTP_AES128_CM_SHA1_80") !=
            0) {
        *why = OpensslError("cannot make the DTLS context");
        return nullptr;
    }
    // The MTU is set, not asked of a socket there is none of. No resumption and no
    // renegotiation: every handshake must show the peer's certificate for the fingerprint check.
    SSL_CTX_set_options(ctx.get(),
                        SSL_OP_NO_QUERY_MTU | SSL_OP_NO_TICKET | SSL_OP_NO_RENEGOTIATION);
    SSL_CTX_set_session_cache_mode(ctx.get(), SSL_SESS_CACHE_OFF);
    return ctx.release();
}

}  // namespace

std::unique_ptr<DtlsCertificate> DtlsCertificate::LoadOrCreate(const std::string& path,
                                                               std::string* why) {
    why->clear();
    ERR_clear_error();
    Key key;
    Cert cert;
    std::string load_why;
    if (!Load(path, &key, &cert, &load_why)) {
        if (!Generate(&key, &cert, why)) return nullptr;
        std::string save_why;
        if (!Save(path, key.get(), cert.get(), &save_why)) {
            *why = "a new certificate that lasts this run only: " + save_why;
        } else if (!load_why.empty()) {
            *why = "replaced " + path + " with a new certificate: " + load_why;
        }
    } else {
        struct stat st;
        // It holds the private key: whoever loosened its mode, it is ours alone again.
        if (stat(path.c_str(), &st) == 0 && (st.st_mode & 077)) chmod(path.c_str(), 0600);
    }
    const std::string fingerprint = Sha256Text(cert.get());
    SSL_CTX* ctx = fingerprint.empty() ? nullptr : ServerContext(key.get(), cert.get(), why);
    if (!ctx) {
        if (fingerprint.empty()) *why = OpensslError("cannot digest the certificate");
        return nullptr;
    }
    return std::unique_ptr<DtlsCertificate>(new DtlsCertificate(ctx, fingerprint));
}

DtlsCertificate::~DtlsCertificate() { SSL_CTX_free(ctx_); }

}  // namespace webrtc
