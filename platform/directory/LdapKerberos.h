#pragma once

// The Kerberos credential with which a node signs in to its server.

#include "platform/files/Path.h"
#include "platform/value/Result.h"

#include <memory>
#include <string>

namespace adminhost {

/// A ticket obtained with a keytab. It is kept in a cache in the memory of this process, which no environment variable
/// names, so tools that are run never see it.
class KerberosCredential {
  public:
    KerberosCredential();
    KerberosCredential(const KerberosCredential&) = delete;
    KerberosCredential& operator=(const KerberosCredential&) = delete;
    ~KerberosCredential();

    /// A gss_cred_id_t for the principal, or for the first one in the keytab if it is empty. It is valid until the next
    /// call. The ticket is renewed if it ends within 10 minutes. How long that may need is up to Kerberos' own
    /// configuration.
    [[nodiscard]] Result<void*> use(const DiskPath& keytab, const std::string& principal);

  private:
    struct State;
    std::unique_ptr<State> _state;
};

/// The realm of Kerberos' own configuration; empty if there is none.
[[nodiscard]] std::string defaultKerberosRealm();

}  // namespace adminhost
