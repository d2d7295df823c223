// The certificate browsers remember: kept in one file across restarts, made anew when the
// file cannot serve.
#include "webrtc/DtlsCertificate.h"

#include <gtest/gtest.h>
#include <openssl/pem.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "DtlsTestClient.h"

namespace webrtc {
namespace {

struct TempDir {
    TempDir() {
        char dir[] = "/tmp/orvex-cert-XXXXXX";
        path = mkdtemp(dir) ? dir : "/nonexistent";
    }
    ~TempDir() { std::filesystem::remove_all(path); }
    std::string path;
};

int ModeOf(const std::string& path) {
    struct stat st;
    return stat(path.c_str(), &st) == 0 ? (st.st_mode & 0777) : -1;
}

std::string Pem(EVP_PKEY* key, X509* cert) {
    BIO* b = BIO_new(BIO_s_mem());
    if (key) PEM_write_bio_PrivateKey(b, key, nullptr, nullptr, 0, nullptr, nullptr);
    if (cert) PEM_write_bio_X509(b, cert);
    char* p = nullptr;
    const long n = BIO_get_mem_data(b, &p);
    std::string text(n > 0 ? p : "", n > 0 ? n : 0);
    BIO_free(b);
    return text;
}

TEST(DtlsCertificateTest, KeptAcrossLoadsInAPrivateFile) {
    TempDir dir;
    const std::string path = dir.path + "/made/here/dtls.pem";
    std::string why;
    auto first = DtlsCertificate::LoadOrCreate(path, &why);
    ASSERT_NE(first, nullptr) << why;
    EXPECT_EQ(why, "");
    EXPECT_EQ(ModeOf(path), 0600);
    EXPECT_EQ(ModeOf(path.substr(0, path.rfind('/'))), 0700);
    chmod(path.c_str(), 0644);
    auto second = DtlsCertificate::LoadOrCreate(path, &why);
    ASSERT_NE(second, nullptr);
    EXPECT_EQ(why, "");
    EXPECT_EQ(second->Sha256Fingerprint(), first->Sha256Fingerprint());
    EXPECT_EQ(ModeOf(path), 0600) << "it holds the private key";
    EXPECT_EQ(first->Sha256Fingerprint().size(), 32u * 3 - 1);
}

TEST(DtlsCertificateTest, AnUnusableFileIsReplaced) {
    EVP_PKEY* p256 = EVP_EC_gen("P-256");
    EVP_PKEY* other = EVP_EC_gen("P-256");
    EVP_PKEY* p384 = EVP_EC_gen("P-384");
    X509* cert = test::SelfSigned(p256, -1, 30);
    X509* expired = test::SelfSigned(p256, -30, -1);
    X509* cert384 = test::SelfSigned(p384, -1, 30);
    const struct {
        const char* name;
        std::string contents;
    } cases[] = {
        {"empty", ""},
        {"not PEM", "orvex\n\x01\x02\xff"},
        {"a key without its certificate", Pem(p256, nullptr)},
        {"a certificate without its key", Pem(nullptr, cert)},
        {"a certificate of another key", Pem(other, cert)},
        {"a P-384 key", Pem(p384, cert384)},
        {"an expired certificate", Pem(p256, expired)},
    };
    TempDir dir;
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        const std::string path = dir.path + "/dtls.pem";
        std::ofstream(path) << c.contents;
        std::string why;
        auto made = DtlsCertificate::LoadOrCreate(path, &why);
        ASSERT_NE(made, nullptr) << why;
        EXPECT_EQ(why.find("replaced " + path), 0u) << why;
        EXPECT_NE(made->Sha256Fingerprint(), test::Sha256Text(cert));
        auto again = DtlsCertificate::LoadOrCreate(path, &why);
        ASSERT_NE(again, nullptr);
        EXPECT_EQ(why, "");
        EXPECT_EQ(again->Sha256Fingerprint(), made->Sha256Fingerprint());
    }
    const std::string kept = dir.path + "/kept.pem";
    std::ofstream(kept) << Pem(nullptr, cert) << Pem(p256, nullptr);
    std::string why;
    auto good = DtlsCertificate::LoadOrCreate(kept, &why);
    ASSERT_NE(good, nullptr);
    EXPECT_EQ(good->Sha256Fingerprint(), test::Sha256Text(cert)) << "the certificate first is fine";
    for (X509* x : {cert, expired, cert384}) X509_free(x);
    for (EVP_PKEY* k : {p256, other, p384}) EVP_PKEY_free(k);
}

TEST(DtlsCertificateTest, AnUnwritableFolderServesThisRunOnly) {
    std::string why;
    auto cert = DtlsCertificate::LoadOrCreate("/dev/null/orvex/dtls.pem", &why);
    ASSERT_NE(cert, nullptr);
    EXPECT_NE(why.find("this run only"), std::string::npos) << why;
}

TEST(DtlsCertificateTest, AnUnreadableFileIsReplaced) {
    if (geteuid() == 0) GTEST_SKIP() << "root reads any file";
    TempDir dir;
    const std::string path = dir.path + "/dtls.pem";
    std::string why;
    const auto first = DtlsCertificate::LoadOrCreate(path, &why);
    ASSERT_NE(first, nullptr);
    chmod(path.c_str(), 0);
    const auto second = DtlsCertificate::LoadOrCreate(path, &why);
    ASSERT_NE(second, nullptr);
    EXPECT_EQ(why.find("replaced"), 0u) << why;
    EXPECT_EQ(ModeOf(path), 0600);
}

}  // namespace
}  // namespace webrtc
