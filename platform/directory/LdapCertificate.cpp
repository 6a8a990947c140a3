#include "platform/directory/LdapCertificate.h"

#include "platform/text/Utf8.h"

#include <memory>

#include <fmt/format.h>
#include <openssl/bio.h>
#include <openssl/x509.h>
#include <openssl/x509_vfy.h>
#include <openssl/x509v3.h>

namespace adminhost {
namespace {

struct FreeX509 {
    void operator()(X509* certificate) const noexcept { ::X509_free(certificate); }
    void operator()(X509_STORE* store) const noexcept { ::X509_STORE_free(store); }
    void operator()(X509_STORE_CTX* context) const noexcept { ::X509_STORE_CTX_free(context); }
    void operator()(BIO* text) const noexcept { ::BIO_free(text); }
    void operator()(GENERAL_NAMES* names) const noexcept { ::GENERAL_NAMES_free(names); }
};

std::string textIn(BIO* memory) {
    char* begin = nullptr;
    const long size = ::BIO_get_mem_data(memory, &begin);
    return size <= 0 ? std::string() : utf8Of(std::string_view(begin, static_cast<std::size_t>(size)));
}

std::string timeText(const ASN1_TIME* time) {
    const std::unique_ptr<BIO, FreeX509> text(::BIO_new(::BIO_s_mem()));
    return text && ::ASN1_TIME_print(text.get(), time) == 1 ? textIn(text.get()) : std::string("an unknown time");
}

/// The names that the certificate is for, as "DNS:ldap.example.com, IP Address:10.0.0.1".
std::string namesIn(X509* certificate) {
    const std::unique_ptr<GENERAL_NAMES, FreeX509> names(
        static_cast<GENERAL_NAMES*>(::X509_get_ext_d2i(certificate, NID_subject_alt_name, nullptr, nullptr)));
    const std::unique_ptr<BIO, FreeX509> text(::BIO_new(::BIO_s_mem()));
    for (int i = 0; text && names && i < sk_GENERAL_NAME_num(names.get()); ++i) {
        ::BIO_puts(text.get(), i == 0 ? "" : ", ");
        ::GENERAL_NAME_print(text.get(), sk_GENERAL_NAME_value(names.get(), i));
    }
    std::string found = text ? textIn(text.get()) : std::string();
    return found.empty() ? "no names" : found;
}

bool isFor(X509* certificate, const std::string& host) {
    return ::X509_check_host(certificate, host.c_str(), host.size(), 0, nullptr) == 1 ||
           ::X509_check_ip_asc(certificate, host.c_str(), 0) == 1;
}

/// OpenSSL's reason why no authority of the file vouches for the certificate; empty if one does, or no file is
/// readable.
std::string chainProblem(X509* certificate, const std::string& authorities) {
    const std::unique_ptr<X509_STORE, FreeX509> store(::X509_STORE_new());
    const std::unique_ptr<X509_STORE_CTX, FreeX509> context(::X509_STORE_CTX_new());
    if (!store || !context || ::X509_STORE_load_file(store.get(), authorities.c_str()) != 1 ||
        ::X509_STORE_CTX_init(context.get(), store.get(), certificate, nullptr) != 1 ||
        ::X509_verify_cert(context.get()) == 1) {
        return {};
    }
    return ::X509_verify_cert_error_string(::X509_STORE_CTX_get_error(context.get()));
}

}  // namespace

std::string certificateProblem(std::string_view certificate, const std::string& host, const std::string& authorities) {
    const auto* bytes = reinterpret_cast<const unsigned char*>(certificate.data());
    const std::unique_ptr<X509, FreeX509> parsed(::d2i_X509(nullptr, &bytes, static_cast<long>(certificate.size())));
    if (!parsed) {
        return {};
    }
    if (::X509_cmp_current_time(::X509_get0_notAfter(parsed.get())) < 0) {
        return fmt::format("the server's certificate expired on {}", timeText(::X509_get0_notAfter(parsed.get())));
    }
    if (::X509_cmp_current_time(::X509_get0_notBefore(parsed.get())) > 0) {
        return fmt::format("the server's certificate is not valid before {}; check this machine's clock",
                           timeText(::X509_get0_notBefore(parsed.get())));
    }
    if (!isFor(parsed.get(), host)) {
        return fmt::format("the server's certificate is not for {}, but for {}", host, namesIn(parsed.get()));
    }
    const std::string chain = chainProblem(parsed.get(), authorities);
    return chain.empty() ? std::string()
                         : fmt::format("the server's certificate is not trusted by {}: {}", authorities, chain);
}

}  // namespace adminhost
