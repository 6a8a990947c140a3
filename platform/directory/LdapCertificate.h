#pragma once

// Why the certificate of a server is not trusted, in words: the TLS library of libldap reports no reason.

#include <string>
#include <string_view>

namespace adminhost {

/// The first reason why this certificate (DER) must not be trusted as that of the host, with the authorities of the
/// file (PEM): expired, not valid yet, for other names, or not issued by an authority of the file. Empty if none is
/// found.
[[nodiscard]] std::string certificateProblem(std::string_view certificate, const std::string& host,
                                             const std::string& authorities);

}  // namespace adminhost
