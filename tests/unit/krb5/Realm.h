#pragma once

// The realm that the tests of this room share: started at first use, once per program.

#include "krb5/KRB5CredentialCache.h"
#include "tests/support/Kdc.h"
#include "tests/support/Program.h"

#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include <gtest/gtest.h>

namespace lumio {

inline constexpr const char* alicePassword = "alice secret";

/// Principals: alice (no preauthentication), paul (preauthentication), expired, locked, short (10 seconds),
/// robot (keytab client.keytab), host/localhost and nimbo/admin (keytab krb5.keytab).
support::Kdc& realm();

/// Runs each test with the realm's KRB5 environment in an empty directory of its own, and restores both.
class RealmTest : public testing::Test {
  protected:
    RealmTest();
    ~RealmTest() override;

    [[nodiscard]] std::string path(const std::string& name) const { return _directory / name; }
    /// A new file cache bound to the principal.
    [[nodiscard]] std::unique_ptr<KRB5CredentialCache> cacheOf(const KRB5Principal& principal,
                                                               const std::string& name = "cc") const;
    /// The same for alice, with her ticket in it.
    [[nodiscard]] std::unique_ptr<KRB5CredentialCache> aliceWithTicket() const;
    [[nodiscard]] std::unique_ptr<KRB5Principal> principal(const std::string& text) const;
    /// A copy of the credential, with another end time, stored as the only one of the cache.
    void storeWithEnd(KRB5CredentialCache& cache, const KRB5Credential& credential, krb5_timestamp end) const;

    support::ScopedEnvironment _environment;
    std::filesystem::path _directory;
    std::shared_ptr<KRB5Context> _context;
};

/// Runs a program with the current environment; its standard error is part of the output.
adminhost::test::ProgramResult runTool(const std::vector<std::string>& command, std::string_view input = {});
/// How many descriptors this process has open.
int openDescriptors();
std::string contentsOf(const std::string& path);
void write(const std::string& path, const std::string& bytes);

}  // namespace lumio
