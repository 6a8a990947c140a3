#pragma once

// Certificates of servers, as far as an administrator wants to know in advance what clients will complain about.

#include "platform/framework/Export.h"
#include "platform/value/Result.h"
#include "platform/value/Value.h"

#include <string_view>

namespace adminhost {

struct ADMINHOST_EXPORT CertificateFacts {
    Date notBefore;
    Date notAfter;
    bool fitsHost = false;  ///< a client that connects to the host name accepts the certificate's names
    bool belongsToKey = false;
};

/// Examines the first certificate of a PEM text and the private key of another. Fails, with a sentence for people, if
/// the text holds no certificate or no key, or if the key is protected by a passphrase. The error quotes neither text.
[[nodiscard]] ADMINHOST_EXPORT Result<CertificateFacts> examineCertificate(std::string_view certificate,
                                                                           std::string_view key,
                                                                           std::string_view hostName);

}  // namespace adminhost
