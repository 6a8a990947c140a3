#include "platform/dnssd/HostName.h"
#include "platform/dnssd/NetService.h"
#include "platform/value/ValueText.h"
#include "tests/support/AvahiNamespace.h"
#include "tests/support/Environment.h"

#include <cstring>
#include <thread>

#include <arpa/inet.h>
#include <gmock/gmock.h>
#include <netdb.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

namespace adminhost {
namespace {

using namespace std::chrono_literals;
using Clock = std::chrono::steady_clock;
using support::ScopedEnvironment;
using test::PublishedService;
using test::SilentAvahi;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::SizeIs;

constexpr const char* type = "_nimbo._tcp";

SocketAddress ipv4(const char* text, std::uint16_t port = 0) {
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_port = htons(port);
    EXPECT_EQ(::inet_pton(AF_INET, text, &address.sin_addr), 1);
    SocketAddress bytes(sizeof address);
    std::memcpy(bytes.data(), &address, sizeof address);
    return bytes;
}

SocketAddress ipv6(const char* text) {
    sockaddr_in6 address{};
    address.sin6_family = AF_INET6;
    EXPECT_EQ(::inet_pton(AF_INET6, text, &address.sin6_addr), 1);
    SocketAddress bytes(sizeof address);
    std::memcpy(bytes.data(), &address, sizeof address);
    return bytes;
}

ScopedEnvironment::Changes busAt(const std::string& address) {
    return {{"DBUS_SYSTEM_BUS_ADDRESS", address}};
}

/// A service whose callbacks are recorded.
struct Recorded {
    explicit Recorded(EventLoop& loop, const std::string& name, const std::string& serviceType = type)
        : service(loop, "local", serviceType, name) {
        service.setDelegate({[this](NetService& which, const Dictionary& error) {
                                 EXPECT_EQ(&which, &service);
                                 EXPECT_EQ(std::this_thread::get_id(), thread);
                                 failures.push_back(error);
                             },
                             [this](NetService& which) {
                                 EXPECT_EQ(&which, &service);
                                 EXPECT_EQ(std::this_thread::get_id(), thread);
                                 ++stops;
                             }});
    }

    /// Waits as a caller does: turns of one second until there is an address or a failure.
    void wait(EventLoop& loop) const {
        for (int turns = 20; turns > 0 && failures.empty() && service.addresses().empty(); --turns) {
            loop.runOnce(1s);
        }
    }
    [[nodiscard]] std::int64_t code() const {
        return failures.empty() ? 0 : failures.front().get("errorCode").integer().value_or(0);
    }
    [[nodiscard]] std::string description() const {
        return failures.empty() ? "" : textOf(failures.front().get("errorDescription"));
    }

    std::thread::id thread = std::this_thread::get_id();
    std::vector<Dictionary> failures;
    int stops = 0;
    NetService service;
};

TEST(NetService, PublishedInstanceIsFoundAtItsHostsAddress) {
    const PublishedService published("Studio One", type);
    EventLoop loop;
    Recorded recorded(loop, "Studio One");
    recorded.service.resolveWithTimeout(10s);
    recorded.wait(loop);
    EXPECT_THAT(recorded.service.addresses(), ElementsAre(ipv4("10.77.0.1", 7777)));
    EXPECT_THAT(recorded.failures, IsEmpty());
    recorded.service.stop();
    EXPECT_EQ(recorded.stops, 1);
    EXPECT_THAT(recorded.service.addresses(), SizeIs(1)) << "what was found stays found";
    EXPECT_EQ(hostNameOf(recorded.service.addresses()[0]).name, "controller.test.example");
}

TEST(NetService, RunThatFindsTheAddressEndsEarly) {
    const PublishedService published("Studio Two", type);
    EventLoop loop;
    Recorded recorded(loop, "Studio Two");
    recorded.service.resolveWithTimeout(60s);
    EXPECT_TRUE(loop.runOnce(60s)) << "news, not the time, ended the run";
    EXPECT_THAT(recorded.service.addresses(), SizeIs(1));
}

TEST(NetService, NameWithOtherCharactersThanAsciiIsFound) {
    const PublishedService published("Schneider\xC3\xA4ume. Etage 2", type);
    EventLoop loop;
    Recorded recorded(loop, "Schneider\xC3\xA4ume. Etage 2");
    recorded.service.resolveWithTimeout(10s);
    recorded.wait(loop);
    EXPECT_THAT(recorded.service.addresses(), SizeIs(1));
}

TEST(NetService, UnknownInstanceFailsByTheDaemonBeforeTheTimeOut) {
    EventLoop loop;
    Recorded recorded(loop, "No Such");
    const auto begin = Clock::now();
    recorded.service.resolveWithTimeout(60s);
    recorded.wait(loop);
    EXPECT_LT(Clock::now() - begin, 30s);
    ASSERT_THAT(recorded.failures, SizeIs(1));
    EXPECT_EQ(recorded.code(), NetService::timeoutCode);
    EXPECT_THAT(recorded.service.addresses(), IsEmpty());
    EXPECT_EQ(recorded.stops, 0);
    recorded.service.stop();
    EXPECT_EQ(recorded.stops, 0) << "what has failed is over already";
}

TEST(NetService, TrafficWithTheDaemonsDoesNotEndARun) {
    EventLoop loop;
    Recorded recorded(loop, "No Such");
    recorded.service.resolveWithTimeout(60s);
    const auto begin = Clock::now();
    EXPECT_FALSE(loop.runOnce(400ms));
    EXPECT_GE(Clock::now() - begin, 400ms);
    EXPECT_THAT(recorded.failures, IsEmpty());
}

TEST(NetService, OtherTypeIsNotFound) {
    const PublishedService published("Studio Three", "_other._tcp");
    EventLoop loop;
    Recorded recorded(loop, "Studio Three");
    recorded.service.resolveWithTimeout(1500ms);
    recorded.wait(loop);
    EXPECT_EQ(recorded.code(), NetService::timeoutCode);
}

TEST(NetService, NameThatCannotBeAnInstanceFails) {
    for (const std::string& name : {std::string(), std::string(64, 'x'), std::string("\xFF"), std::string("a\0b", 3)}) {
        EventLoop loop;
        Recorded recorded(loop, name);
        recorded.service.resolveWithTimeout(60s);
        recorded.wait(loop);
        ASSERT_THAT(recorded.failures, SizeIs(1)) << name;
        EXPECT_LT(recorded.code(), 0);
        EXPECT_FALSE(recorded.description().empty());
    }
}

TEST(NetService, WithoutABusItFailsAtOnceThroughTheCallback) {
    const ScopedEnvironment noBus(busAt("unix:path=/run/with-avahi/missing"));
    EventLoop loop;
    Recorded recorded(loop, "Studio One");
    recorded.service.resolveWithTimeout(60s);
    ASSERT_THAT(recorded.failures, SizeIs(1)) << "before the first run";
    EXPECT_EQ(recorded.code(), NetService::noDaemonCode);
    EXPECT_THAT(recorded.description(), HasSubstr("bus"));
}

TEST(NetService, WithoutADaemonItFailsInTheFirstRun) {
    const char* address = std::getenv("EMPTY_BUS_ADDRESS");
    ASSERT_NE(address, nullptr);
    const ScopedEnvironment emptyBus(busAt(address));
    EventLoop loop;
    Recorded recorded(loop, "Studio One");
    recorded.service.resolveWithTimeout(60s);
    EXPECT_TRUE(loop.runOnce(60s));
    ASSERT_THAT(recorded.failures, SizeIs(1));
    EXPECT_EQ(recorded.code(), NetService::noDaemonCode);
    EXPECT_THAT(recorded.description(), HasSubstr("Avahi"));
}

TEST(NetService, SilentDaemonEndsWithTheTimeOutThroughTheCallback) {
    const SilentAvahi silent;
    EventLoop loop;
    Recorded recorded(loop, "Studio One");
    const auto begin = Clock::now();
    recorded.service.resolveWithTimeout(700ms);
    recorded.wait(loop);
    const auto time = Clock::now() - begin;
    EXPECT_GE(time, 700ms);
    EXPECT_LT(time, 15s) << "the daemon's silence does not hold the caller";
    ASSERT_THAT(recorded.failures, SizeIs(1));
    EXPECT_EQ(recorded.code(), NetService::timeoutCode);
}

TEST(NetService, SilentBusEndsWithTheTimeOutThroughTheCallback) {
    const std::string path = "/run/with-avahi/silent";
    const int listener = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
    ASSERT_EQ(::bind(listener, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    ASSERT_EQ(::listen(listener, 8), 0);
    const ScopedEnvironment silentBus(busAt("unix:path=" + path));
    EventLoop loop;
    Recorded recorded(loop, "Studio One");
    const auto begin = Clock::now();
    recorded.service.resolveWithTimeout(700ms);
    recorded.wait(loop);
    EXPECT_GE(Clock::now() - begin, 700ms);
    EXPECT_EQ(recorded.code(), NetService::timeoutCode);
    ::close(listener);
    ::unlink(path.c_str());
}

TEST(NetService, StoppingInTheMiddleEndsWithDidStopAndNothingAfter) {
    EventLoop loop;
    Recorded recorded(loop, "No Such");
    recorded.service.resolveWithTimeout(500ms);
    EXPECT_FALSE(loop.runOnce(100ms));
    recorded.service.stop();
    EXPECT_EQ(recorded.stops, 1);
    recorded.service.stop();
    EXPECT_EQ(recorded.stops, 1);
    EXPECT_FALSE(loop.runOnce(700ms));
    EXPECT_THAT(recorded.failures, IsEmpty());
}

TEST(NetService, StoppingWhileTheDaemonIsAskedIsSafe) {
    EventLoop loop;
    Recorded recorded(loop, "No Such");
    recorded.service.resolveWithTimeout(500ms);
    recorded.service.stop();
    EXPECT_EQ(recorded.stops, 1);
    EXPECT_FALSE(loop.runOnce(50ms));
}

TEST(NetService, StoppingInTheFailureCallbackIsSafe) {
    EventLoop loop;
    NetService service(loop, "local", type, "No Such");
    int failures = 0;
    service.setDelegate({[&](NetService& failed, const Dictionary&) {
                             ++failures;
                             failed.stop();
                         },
                         {}});
    service.resolveWithTimeout(300ms);
    while (failures == 0) {
        loop.runOnce(1s);
    }
    EXPECT_FALSE(loop.runOnce(50ms));
    EXPECT_EQ(failures, 1);
}

TEST(NetService, ServiceThatGoesAwayUnderWayLeavesTheLoopUsable) {
    const PublishedService published("Studio Four", type);
    EventLoop loop;
    {
        Recorded gone(loop, "No Such");
        gone.service.resolveWithTimeout(10s);
        EXPECT_FALSE(loop.runOnce(100ms));
    }
    Recorded recorded(loop, "Studio Four");
    recorded.service.resolveWithTimeout(10s);
    recorded.wait(loop);
    EXPECT_THAT(recorded.service.addresses(), SizeIs(1));
}

TEST(NetService, ResolvedServiceStopsAtItsTimeOutWithoutFailure) {
    const PublishedService published("Studio Five", type);
    EventLoop loop;
    Recorded recorded(loop, "Studio Five");
    recorded.service.resolveWithTimeout(3s);
    recorded.wait(loop);
    ASSERT_THAT(recorded.service.addresses(), SizeIs(1));
    while (recorded.stops == 0 && recorded.failures.empty()) {
        loop.runOnce(1s);
    }
    EXPECT_THAT(recorded.failures, IsEmpty());
    EXPECT_EQ(recorded.stops, 1);
}

TEST(EventLoop, RunWithNothingToWaitForLastsItsTime) {
    EventLoop loop;
    const auto begin = Clock::now();
    EXPECT_FALSE(loop.runOnce(50ms));
    EXPECT_GE(Clock::now() - begin, 50ms);
}

// Reverse look-up.

TEST(HostName, AddressesOfBothFamiliesHaveTheirNames) {
    EXPECT_EQ(hostNameOf(ipv4("10.77.0.1", 7777)), (HostName{"controller.test.example", 0}));
    EXPECT_EQ(hostNameOf(ipv6("fd00:1:2:3:4:5:6:7")), (HostName{"six.test.example", 0}));
}

TEST(HostName, IPv6AddressesAreReadWhole) {
    EXPECT_EQ(hostNameOf(ipv6("fd00:1:2:3:4:5:6:8")), (HostName{"other.test.example", 0}))
        << "differs in its last byte";
}

TEST(HostName, AddressWithoutANameIsAnErrorNotANumber) {
    const HostName result = hostNameOf(ipv4("10.77.0.99"));
    EXPECT_FALSE(result.name);
    EXPECT_NE(result.error, 0);
}

TEST(HostName, TextThatIsNotAnAddressIsAnError) {
    EXPECT_EQ(hostNameOf({}).error, EAI_FAMILY);
    EXPECT_EQ(hostNameOf({2}).error, EAI_FAMILY);
    SocketAddress cut = ipv4("10.77.0.1");
    cut.resize(7);
    EXPECT_EQ(hostNameOf(cut).error, EAI_FAMILY);
    SocketAddress local(110, 0);
    local[0] = AF_UNIX;
    EXPECT_EQ(hostNameOf(local).error, EAI_FAMILY);
    EXPECT_EQ(hostNameOf(SocketAddress(1000, 2)).error, EAI_FAMILY);
}

TEST(HostName, SilentNameServerIsGivenUpSoonerThanTheSystemsDefault) {
    const int server = ::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0);
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_port = htons(53);
    ASSERT_EQ(::inet_pton(AF_INET, "10.77.0.1", &address.sin_addr), 1);
    ASSERT_EQ(::bind(server, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    const auto begin = Clock::now();
    const HostName result = hostNameOf(ipv4("10.77.0.99"));
    EXPECT_LT(Clock::now() - begin, 8s) << "the default is two times 5 seconds";
    EXPECT_FALSE(result.name);
    EXPECT_NE(result.error, 0);
    char question[512];
    EXPECT_GT(::recv(server, question, sizeof question, MSG_DONTWAIT), 0) << "the server was asked";
    EXPECT_LT(::recv(server, question, sizeof question, MSG_DONTWAIT), 0) << "once";
    ::close(server);
}

}  // namespace
}  // namespace adminhost

int main(int argc, char** argv) {
    adminhost::test::enterAvahiNamespace(argc, argv);
    testing::InitGoogleTest(&argc, argv);
    return RUN_ALL_TESTS();
}
