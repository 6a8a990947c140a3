#include "platform/crypto/Certificate.h"

#include <algorithm>
#include <ctime>
#include <limits>
#include <memory>
#include <string>
#include <utility>

#include <openssl/err.h>
#include <openssl/pem.h>
#include <openssl/x509v3.h>

namespace adminhost {
namespace {

constexpr std::size_t maximumText = std::numeric_limits<int>::max();

using Text = std::unique_ptr<BIO, decltype(&BIO_free)>;

Text openText(std::string_view text) {
    return {::BIO_new_mem_buf(text.data(), static_cast<int>(std::min(text.size(), maximumText))), &BIO_free};
}

/// No passphrase is asked for: the library would read it from the terminal.
int noPassphrase(char*, int, int, void* wasAsked) {
    *static_cast<bool*>(wasAsked) = true;
    return 0;
}

Date dateOf(const ASN1_TIME* time) {
    std::tm parts{};
    return ::ASN1_TIME_to_tm(time, &parts) == 1 ? Date(std::chrono::seconds(::timegm(&parts))) : Date();
}

auto unusable(std::string text) {
    ::ERR_clear_error();  // the queue is the thread's
    return failure({"certificate", 1, std::move(text)});
}

}  // namespace

Result<CertificateFacts> examineCertificate(std::string_view certificate, std::string_view key,
                                            std::string_view hostName) {
    const Text certificateText = openText(certificate);
    const std::unique_ptr<X509, decltype(&X509_free)> parsed(
        ::PEM_read_bio_X509(certificateText.get(), nullptr, nullptr, nullptr), &X509_free);
    if (!parsed) {
        return unusable("the file does not hold a certificate in PEM form");
    }
    bool wasAsked = false;
    const Text keyText = openText(key);
    const std::unique_ptr<EVP_PKEY, decltype(&EVP_PKEY_free)> parsedKey(
        ::PEM_read_bio_PrivateKey(keyText.get(), nullptr, &noPassphrase, &wasAsked), &EVP_PKEY_free);
    if (!parsedKey) {
        return unusable(wasAsked ? "the key is protected by a passphrase"
                                 : "the file does not hold a private key in PEM form");
    }
    CertificateFacts facts;
    facts.notBefore = dateOf(::X509_get0_notBefore(parsed.get()));
    facts.notAfter = dateOf(::X509_get0_notAfter(parsed.get()));
    facts.fitsHost = ::X509_check_host(parsed.get(), hostName.data(), hostName.size(), 0, nullptr) == 1 ||
                     ::X509_check_ip_asc(parsed.get(), std::string(hostName).c_str(), 0) == 1;
    facts.belongsToKey = ::X509_check_private_key(parsed.get(), parsedKey.get()) == 1;
    ::ERR_clear_error();
    return facts;
}

}  // namespace adminhost
