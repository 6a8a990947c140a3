// Kerberos with broken KDCs, clocks, disks and files.

#include "krb5/KRB5CredentialCache.h"
#include "tests/support/KeytabFile.h"
#include "tests/unit/krb5/Realm.h"

#include <array>
#include <csignal>
#include <ctime>

#include <linux/capability.h>
#include <netinet/in.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <unistd.h>

namespace {

int clockShift = 0;

}  // namespace

/// The clock that the Kerberos library reads. It replaces the real one.
extern "C" int gettimeofday(timeval* __restrict now, void* __restrict /*zone*/) noexcept {
    timespec real{};
    clock_gettime(CLOCK_REALTIME, &real);
    now->tv_sec = real.tv_sec + clockShift;
    now->tv_usec = real.tv_nsec / 1000;
    return 0;
}

namespace lumio {
namespace {

/// While it exists, this program's clock is that many seconds fast.
class ShiftedClock {
  public:
    explicit ShiftedClock(int seconds) { clockShift = seconds; }
    ShiftedClock(const ShiftedClock&) = delete;
    ShiftedClock& operator=(const ShiftedClock&) = delete;
    ~ShiftedClock() { clockShift = 0; }
};

/// A loopback port that is in use and refuses connections.
class ClosedPort {
  public:
    ClosedPort() : _socket(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
        sockaddr_in address{};
        address.sin_family = AF_INET;
        address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        socklen_t length = sizeof address;
        EXPECT_EQ(bind(_socket, reinterpret_cast<const sockaddr*>(&address), length), 0);
        EXPECT_EQ(getsockname(_socket, reinterpret_cast<sockaddr*>(&address), &length), 0);
        _port = ntohs(address.sin_port);
    }
    ClosedPort(const ClosedPort&) = delete;
    ClosedPort& operator=(const ClosedPort&) = delete;
    ~ClosedPort() { close(_socket); }
    [[nodiscard]] int port() const { return _port; }

  private:
    int _socket;
    int _port = 0;
};

/// While it exists, no file of this process can exceed the size, as on a full disk.
class FullDisk {
  public:
    explicit FullDisk(rlim_t size) : _formerHandler(std::signal(SIGXFSZ, SIG_IGN)) {
        getrlimit(RLIMIT_FSIZE, &_former);
        const rlimit limit{size, _former.rlim_max};
        EXPECT_EQ(setrlimit(RLIMIT_FSIZE, &limit), 0);
    }
    FullDisk(const FullDisk&) = delete;
    FullDisk& operator=(const FullDisk&) = delete;
    ~FullDisk() {
        setrlimit(RLIMIT_FSIZE, &_former);
        static_cast<void>(std::signal(SIGXFSZ, _formerHandler));
    }

  private:
    rlimit _former{};
    void (*_formerHandler)(int);
};

/// While it exists, the permissions of files also apply to root.
class ObeyedPermissions {
  public:
    ObeyedPermissions() {
        EXPECT_EQ(syscall(SYS_capget, &_header, _former.data()), 0);
        auto lesser = _former;
        lesser[0].effective &= ~((1U << CAP_DAC_OVERRIDE) | (1U << CAP_DAC_READ_SEARCH));
        EXPECT_EQ(syscall(SYS_capset, &_header, lesser.data()), 0);
    }
    ObeyedPermissions(const ObeyedPermissions&) = delete;
    ObeyedPermissions& operator=(const ObeyedPermissions&) = delete;
    ~ObeyedPermissions() { syscall(SYS_capset, &_header, _former.data()); }

  private:
    __user_cap_header_struct _header{_LINUX_CAPABILITY_VERSION_3, 0};
    std::array<__user_cap_data_struct, _LINUX_CAPABILITY_U32S_3> _former{};
};

class BadInput : public RealmTest {
  protected:
    /// Replaces _context by one whose realm has its KDC at that port.
    void useKdcAt(int port, const std::string& libdefaults = {}) {
        write(path("krb5.conf"), support::Kdc::clientConfiguration("NIMBO.TEST", port, libdefaults));
        setenv("KRB5_CONFIG", path("krb5.conf").c_str(), 1);  // restored by the fixture
        _context = KRB5Context::context();
    }
    /// The realm's own configuration with further lines in [libdefaults].
    void useConfigurationWith(const std::string& libdefaults) {
        std::string text = contentsOf(realm().configuration());
        text.insert(text.find("[realms]"), libdefaults);
        write(path("krb5.conf"), text);
        setenv("KRB5_CONFIG", path("krb5.conf").c_str(), 1);
        _context = KRB5Context::context();
    }
    [[nodiscard]] std::unique_ptr<KRB5CredentialCache> unbound(const std::string& name) const {
        return KRB5CredentialCache::initWithName(path(name), KRB5CredentialCacheFileType, nullptr, _context);
    }
    /// Returns the errors of opening the cache for alice and of acquiring into it. Opening must fail.
    [[nodiscard]] std::int64_t statusOfAcquiringInto(const std::string& name) const {
        const auto alice = principal("alice");
        EXPECT_EQ(KRB5CredentialCache::initWithName(path(name), KRB5CredentialCacheFileType, alice.get(), _context),
                  nullptr);
        const auto cache = unbound(name);
        EXPECT_NE(cache, nullptr);
        cache->acquireInitialCredentialWithPrincipal(alice.get(), nullptr, alicePassword);
        EXPECT_FALSE(cache->errorMessage().empty());
        const auto status = cache->errorCode();
        EXPECT_TRUE(cache->credentials().empty());
        return status;
    }
};

TEST_F(BadInput, KdcDownIsUnreachable) {
    const ClosedPort port;
    useKdcAt(port.port());
    const auto cache = cacheOf(*principal("alice"));
    EXPECT_TRUE(cache->acquireInitialCredentialIfNecessaryWithPassword(alicePassword));
    EXPECT_EQ(cache->errorCode(), KRB5_KDC_UNREACH);
    EXPECT_NE(cache->errorMessage().find("NIMBO.TEST"), std::string::npos) << cache->errorMessage();
    EXPECT_TRUE(cache->credentials().empty());
}

TEST_F(BadInput, ClockFarOffIsLearntFromTheKdcUnlessForbidden) {
    for (const int days : {-5, 5}) {
        const ShiftedClock clock(days * 24 * 3600);
        useConfigurationWith("");
        const auto cache = cacheOf(*principal("paul"));
        EXPECT_TRUE(cache->acquireInitialCredentialIfNecessaryWithPassword(alicePassword));
        EXPECT_EQ(cache->errorCode(), 0) << days << ": " << cache->errorMessage();
        EXPECT_FALSE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(nullptr)) << days;

        useConfigurationWith(" kdc_timesync = 0\n");
        const auto strict = cacheOf(*principal("paul"), "strict");
        EXPECT_TRUE(strict->acquireInitialCredentialIfNecessaryWithPassword(alicePassword));
        EXPECT_EQ(strict->errorCode(), KRB5KRB_AP_ERR_SKEW) << strict->errorMessage();
        EXPECT_TRUE(strict->credentials().empty());
        std::filesystem::remove(path("cc"));
    }
}

TEST_F(BadInput, ClockFarBehindWithoutPreauthenticationGivesATicketThatHasEnded) {
    // The client does not know the KDC's time, so it requests a ticket that ends in the past, and gets it.
    const ShiftedClock clock(-5 * 24 * 3600);
    useConfigurationWith("");
    const auto cache = cacheOf(*principal("alice"));
    EXPECT_TRUE(cache->acquireInitialCredentialIfNecessaryWithPassword(alicePassword));
    EXPECT_EQ(cache->errorCode(), 0) << cache->errorMessage();
    EXPECT_TRUE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(nullptr));
    EXPECT_EQ(cache->errorCode(), 0);
}

TEST_F(BadInput, CacheInMissingDirectory) {
    EXPECT_EQ(statusOfAcquiringInto("missing/cc"), KRB5_FCC_NOFILE);
}

TEST_F(BadInput, CacheBelowAFileOrWhereADirectoryIs) {
    write(path("file"), "x");
    EXPECT_EQ(statusOfAcquiringInto("file/cc"), KRB5_FCC_NOFILE);
    std::filesystem::create_directory(path("directory"));
    EXPECT_NE(statusOfAcquiringInto("directory"), 0);
}

TEST_F(BadInput, CacheInADirectoryThatIsNotWritableIsRefusedAndNoneIsMade) {
    std::filesystem::create_directory(path("closed"));
    std::filesystem::permissions(path("closed"), std::filesystem::perms(0555));
    const ObeyedPermissions obeyed;
    EXPECT_EQ(statusOfAcquiringInto("closed/cc"), KRB5_FCC_PERM);
    EXPECT_TRUE(std::filesystem::is_empty(path("closed")));
}

TEST_F(BadInput, CacheThatMayNotBeReadTellsAndIsReplacedByOpeningItForAPrincipal) {
    static_cast<void>(cacheOf(*principal("paul")));
    std::filesystem::permissions(path("cc"), std::filesystem::perms::none);
    const ObeyedPermissions obeyed;
    const auto cache = unbound("cc");
    EXPECT_TRUE(cache->credentials().empty());
    EXPECT_EQ(cache->errorCode(), KRB5_FCC_PERM);
    EXPECT_FALSE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(principal("alice").get()));
    EXPECT_EQ(cache->errorCode(), KRB5_FCC_PERM);
    EXPECT_EQ(*cacheOf(*principal("alice"))->principal(), *principal("alice"));
}

TEST_F(BadInput, KeytabThatMayNeitherBeMadeNorReadTellsSo) {
    std::filesystem::create_directory(path("closed"));
    std::filesystem::permissions(path("closed"), std::filesystem::perms(0555));
    write(path("kt"), support::keytabFile(1, 1));
    std::filesystem::permissions(path("kt"), std::filesystem::perms(0400));
    const ObeyedPermissions obeyed;
    const auto readOnly = KRB5Keytab::initWithName(path("kt"), KRB5KeytabFileType, _context);
    const auto entries = readOnly->entries();
    ASSERT_EQ(entries.size(), 1U);
    readOnly->removeEntry(entries[0]);
    EXPECT_EQ(readOnly->errorCode(), EACCES);
    EXPECT_TRUE(readOnly->containsEntry(entries[0]));

    const auto unwritable = KRB5Keytab::initWithName(path("closed/kt"), KRB5KeytabFileType, _context);
    unwritable->addEntry(entries[0]);
    EXPECT_EQ(unwritable->errorCode(), ENOENT) << "the library tells of its look for a file to extend";
    EXPECT_TRUE(std::filesystem::is_empty(path("closed")));

    std::filesystem::permissions(path("kt"), std::filesystem::perms::none);
    EXPECT_TRUE(readOnly->entries().empty());
    EXPECT_EQ(readOnly->errorCode(), EACCES);
}

TEST_F(BadInput, CacheOnAFullDiskCannotBeBound) {
    const FullDisk full(4);
    EXPECT_NE(statusOfAcquiringInto("cc"), 0);
}

TEST_F(BadInput, TicketThatDoesNotFitOnTheDiskIsStillNecessary) {
    const auto alice = principal("alice");
    const auto cache = cacheOf(*alice);
    const FullDisk full(std::filesystem::file_size(path("cc")) + 20);
    EXPECT_TRUE(cache->acquireInitialCredentialIfNecessaryWithPassword(alicePassword));
    EXPECT_EQ(cache->errorCode(), 0) << "how the request went; storing is not recorded";
    EXPECT_EQ(cache->initialCredential(), nullptr);
    EXPECT_NE(cache->errorCode(), 0);
}

TEST_F(BadInput, CacheCutAtAnyByteIsListedAsFarAsItGoesAndInitialisedByOpeningItForAPrincipal) {
    const auto alice = principal("alice");
    {
        const auto cache = cacheOf(*alice);
        cache->acquireInitialCredentialWithPassword(alicePassword);
        ASSERT_EQ(runTool({"/usr/bin/kvno", "-c", path("cc"), "host/localhost"}).status, 0);
        ASSERT_EQ(cache->credentials().size(), 2U);
    }
    const std::string bytes = contentsOf(path("cc"));
    int bound = 0;
    for (std::size_t length = 0; length < bytes.size(); ++length) {
        write(path("cut"), bytes.substr(0, length));
        const auto cut = unbound("cut");
        ASSERT_NE(cut, nullptr);
        const auto listed = cut->credentials();
        EXPECT_LT(listed.size(), 2U) << length;
        const bool readable = cut->principal() != nullptr;
        bound += readable ? 1 : 0;
        const bool hasTicket = cut->initialCredential() != nullptr;
        EXPECT_EQ(hasTicket, listed.size() == 1) << length;
        EXPECT_FALSE(hasTicket && !readable) << length;
        const bool necessary = cut->initialCredentialAcquisitionIsNecessaryForPrincipal(alice.get());
        EXPECT_FALSE(necessary && hasTicket) << length;

        const auto opened =
            KRB5CredentialCache::initWithName(path("cut"), KRB5CredentialCacheFileType, alice.get(), _context);
        ASSERT_NE(opened, nullptr) << length;
        EXPECT_EQ(opened->errorCode(), 0);
        EXPECT_EQ(*opened->principal(), *alice);
    }
    EXPECT_GT(bound, 0);
    EXPECT_LT(bound, static_cast<int>(bytes.size()));
}

TEST_F(BadInput, GarbageInsteadOfACacheIsInitialised) {
    write(path("cc"), std::string(5000, '\xff'));
    EXPECT_TRUE(unbound("cc")->credentials().empty());
    const auto cache = unbound("cc");
    static_cast<void>(cache->principal());
    EXPECT_EQ(cache->errorCode(), KRB5_CCACHE_BADVNO);
    EXPECT_EQ(*cacheOf(*principal("alice"))->principal(), *principal("alice"));
}

}  // namespace
}  // namespace lumio
