#include "krb5/KRB5CredentialCache.h"
#include "tests/support/Kdc.h"
#include "tests/support/SilentServer.h"

#include <chrono>
#include <cstdlib>
#include <fstream>
#include <iostream>

#include <gtest/gtest.h>

namespace lumio {
namespace {

/// Shows how long a caller of the layer blocks in the worst case. The library sets this limit.
TEST(SilentKdc, ThatAcceptsAndNeverAnswersIsGivenUpAsUnreachable) {
    std::string pattern = std::filesystem::temp_directory_path() / "silent.XXXXXX";
    ASSERT_NE(mkdtemp(pattern.data()), nullptr);
    const std::filesystem::path directory = pattern;

    const adminhost::test::SilentServer listener;
    std::ofstream(directory / "krb5.conf") << support::Kdc::clientConfiguration("NIMBO.TEST", listener.port());
    const support::ScopedEnvironment scoped({{"KRB5_CONFIG", directory / "krb5.conf"}});

    const auto context = KRB5Context::context();
    const auto alice = KRB5Principal::initWithString("alice", context);
    const auto cache = KRB5CredentialCache::initWithName((directory / "cc").string(), KRB5CredentialCacheFileType,
                                                         alice.get(), context);
    ASSERT_NE(cache, nullptr);
    const auto start = std::chrono::steady_clock::now();
    EXPECT_TRUE(cache->acquireInitialCredentialIfNecessaryWithPassword("secret"));
    const auto seconds =
        std::chrono::duration_cast<std::chrono::seconds>(std::chrono::steady_clock::now() - start).count();
    EXPECT_EQ(cache->errorCode(), KRB5_KDC_UNREACH) << cache->errorMessage();
    EXPECT_TRUE(cache->credentials().empty());
    std::cout << "given up after " << seconds << " s\n";
    RecordProperty("seconds", static_cast<int>(seconds));
    std::filesystem::remove_all(directory);
}

}  // namespace
}  // namespace lumio
