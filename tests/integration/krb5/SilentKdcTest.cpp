#include "krb5/KRB5CredentialCache.h"
#include "tests/support/Kdc.h"

#include <chrono>
#include <cstdlib>
#include <fstream>
#include <iostream>

#include <gtest/gtest.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

namespace lumio {
namespace {

/// Shows how long a caller of the layer blocks in the worst case. The library sets this limit.
TEST(SilentKdc, ThatAcceptsAndNeverAnswersIsGivenUpAsUnreachable) {
    std::string pattern = std::filesystem::temp_directory_path() / "silent.XXXXXX";
    ASSERT_NE(mkdtemp(pattern.data()), nullptr);
    const std::filesystem::path directory = pattern;

    // Connections are completed by the kernel and wait to be accepted for ever.
    const int listener = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    socklen_t length = sizeof address;
    ASSERT_EQ(bind(listener, reinterpret_cast<const sockaddr*>(&address), length), 0);
    ASSERT_EQ(getsockname(listener, reinterpret_cast<sockaddr*>(&address), &length), 0);
    ASSERT_EQ(listen(listener, 16), 0);
    std::ofstream(directory / "krb5.conf") << support::Kdc::clientConfiguration("NIMBO.TEST", ntohs(address.sin_port));
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
    close(listener);
    std::filesystem::remove_all(directory);
}

}  // namespace
}  // namespace lumio
