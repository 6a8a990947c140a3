#pragma once

// A certificate authority of the test's own, and certificates for servers.

#include "tests/support/ServerProcess.h"
#include "tests/support/Slapd.h"

#include <chrono>
#include <cstdio>
#include <filesystem>
#include <memory>
#include <stdexcept>
#include <string>

#include <openssl/evp.h>
#include <openssl/pem.h>
#include <openssl/x509v3.h>

namespace adminhost {

class TestAuthority {
  public:
    TestAuthority() : _directory(support::createTemporaryDirectory("authority")), _key(newKey()) {
        _certificate = certificateFor("Test Authority", _key.get(), "", std::chrono::hours(24));
        writePem("authority.pem", _certificate.get());
    }
    TestAuthority(const TestAuthority&) = delete;
    TestAuthority& operator=(const TestAuthority&) = delete;
    ~TestAuthority() { std::filesystem::remove_all(_directory); }

    [[nodiscard]] std::filesystem::path file() const { return _directory / "authority.pem"; }

    /// A certificate for "DNS:NAME" or "IP:ADDRESS" that is valid for that time from now on; one that has expired for a
    /// negative time.
    [[nodiscard]] support::Slapd::Certificates issue(const std::string& subject, std::chrono::hours valid) const {
        const std::string name = "server" + std::to_string(++_issued);
        const Key key = newKey();
        writePem(name + ".pem", certificateFor("Test Server", key.get(), subject, valid).get());
        const std::unique_ptr<std::FILE, int (*)(std::FILE*)> file(
            std::fopen((_directory / (name + ".key")).c_str(), "w"), &std::fclose);
        require(file && PEM_write_PrivateKey(file.get(), key.get(), nullptr, nullptr, 0, nullptr, nullptr) == 1);
        return {this->file(), _directory / (name + ".pem"), _directory / (name + ".key")};
    }

  private:
    struct Free {
        void operator()(EVP_PKEY* key) const { EVP_PKEY_free(key); }
        void operator()(X509* certificate) const { X509_free(certificate); }
        void operator()(X509_EXTENSION* extension) const { X509_EXTENSION_free(extension); }
    };
    using Key = std::unique_ptr<EVP_PKEY, Free>;
    using Certificate = std::unique_ptr<X509, Free>;

    static void require(bool condition) {
        if (!condition) {
            throw std::runtime_error("the certificate cannot be created");
        }
    }
    static Key newKey() {
        Key key(EVP_EC_gen("P-256"));
        require(key != nullptr);
        return key;
    }

    /// Without alternative names, the authority's own certificate.
    [[nodiscard]] Certificate certificateFor(const std::string& name, EVP_PKEY* key, const std::string& alternatives,
                                             std::chrono::hours valid) const {
        const long seconds = std::chrono::duration_cast<std::chrono::seconds>(valid).count();
        Certificate certificate(X509_new());
        X509* const x = certificate.get();
        require(x != nullptr && X509_set_version(x, 2) == 1 && X509_set_pubkey(x, key) == 1);
        static int serial = 0;
        ASN1_INTEGER_set(X509_get_serialNumber(x), ++serial);
        X509_gmtime_adj(X509_getm_notBefore(x), -48L * 3600);
        X509_gmtime_adj(X509_getm_notAfter(x), seconds);
        X509_NAME* const subject = X509_get_subject_name(x);
        X509_NAME_add_entry_by_txt(subject, "CN", MBSTRING_UTF8, reinterpret_cast<const unsigned char*>(name.c_str()),
                                   -1, -1, 0);
        X509* const issuer = alternatives.empty() ? x : _certificate.get();
        X509_set_issuer_name(x, X509_get_subject_name(issuer));
        const auto extend = [&](int kind, const std::string& value) {
            const std::unique_ptr<X509_EXTENSION, Free> extension(
                X509V3_EXT_conf_nid(nullptr, nullptr, kind, value.c_str()));
            require(extension && X509_add_ext(x, extension.get(), -1) == 1);
        };
        if (alternatives.empty()) {
            extend(NID_basic_constraints, "critical,CA:TRUE");
            extend(NID_key_usage, "critical,keyCertSign");
        } else {
            extend(NID_subject_alt_name, alternatives);
        }
        require(X509_sign(x, _key.get(), EVP_sha256()) > 0);
        return certificate;
    }

    void writePem(const std::string& name, X509* certificate) const {
        const std::unique_ptr<std::FILE, int (*)(std::FILE*)> file(std::fopen((_directory / name).c_str(), "w"),
                                                                   &std::fclose);
        require(file && PEM_write_X509(file.get(), certificate) == 1);
    }

    std::filesystem::path _directory;
    Key _key;
    Certificate _certificate;
    mutable int _issued = 0;
};

}  // namespace adminhost
