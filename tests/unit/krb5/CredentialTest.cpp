#include "krb5/KRB5CredentialCache.h"
#include "tests/unit/krb5/Realm.h"

namespace lumio {
namespace {

using Credential = RealmTest;

TEST_F(Credential, DescribesItself) {
    const auto ticket = aliceWithTicket()->initialCredential();
    krb5_creds changed = *ticket->nativeCredential();
    changed.times = {1700000000, 0, 1700000600, 0};
    const auto copy = KRB5Credential::initWithNativeCredential(&changed, _context);
    EXPECT_EQ(copy->startTime(), adminhost::Date(std::chrono::seconds(1700000000))) << "the authentication time";
    EXPECT_EQ(copy->description(),
              "client='alice@NIMBO.TEST' server='krbtgt/NIMBO.TEST@NIMBO.TEST' start='2023-11-14 22:13:20 +0000' "
              "end='2023-11-14 22:23:20 +0000' renew='1970-01-01 00:00:00 +0000'");
    changed.times.starttime = 1700000001;
    EXPECT_EQ(KRB5Credential::initWithNativeCredential(&changed, _context)->startTime(),
              adminhost::Date(std::chrono::seconds(1700000001)));
}

TEST_F(Credential, WithoutRecordAnswersNull) {
    const krb5_creds nobodys{};
    for (const krb5_creds* native : {static_cast<const krb5_creds*>(nullptr), &nobodys}) {
        const auto empty = KRB5Credential::initWithNativeCredential(native, _context);
        ASSERT_NE(empty, nullptr);
        EXPECT_EQ(empty->nativeCredential(), nullptr);
        EXPECT_EQ(empty->clientPrincipal(), nullptr);
        EXPECT_EQ(empty->serverPrincipal(), nullptr);
        EXPECT_EQ(empty->startTime(), std::nullopt);
        EXPECT_EQ(empty->endTime(), std::nullopt);
        EXPECT_EQ(empty->renewUntil(), std::nullopt);
        EXPECT_EQ(empty->description(), "client='(null)' server='(null)' start='(null)' end='(null)' renew='(null)'");
    }
}

TEST_F(Credential, WithoutOneOfItsPrincipalsIsNotCopied) {
    const auto ticket = aliceWithTicket()->initialCredential();
    krb5_creds changed = *ticket->nativeCredential();
    changed.client = nullptr;
    EXPECT_EQ(KRB5Credential::initWithNativeCredential(&changed, _context)->nativeCredential(), nullptr);
    changed = *ticket->nativeCredential();
    changed.server = nullptr;
    EXPECT_EQ(KRB5Credential::initWithNativeCredential(&changed, _context)->nativeCredential(), nullptr);
}

}  // namespace
}  // namespace lumio
