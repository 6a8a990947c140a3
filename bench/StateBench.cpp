// The state of the service through client, front, worker and plug-in. Without details: against the service manager's
// own answer. With details: against the sum of its bare parts, which are five runs of the database tool, one search of
// the directory, one ticket from a KDC and one run of the grid tool.
//
// Runs beside a service manager of its own (tests/support/with-systemd): a real systemd for root, else a mock.

#include "bench/Road.h"
#include "krb5/KRB5CredentialCache.h"
#include "platform/directory/Directory.h"
#include "platform/directory/LocalAccounts.h"
#include "platform/files/Path.h"
#include "platform/service/ServiceState.h"
#include "tests/support/Kdc.h"
#include "tests/support/ServiceManager.h"

#include <memory>

namespace {

using namespace bench;

constexpr const char* unit = "com.brenn.lumioserverd.service";
constexpr const char* account = "lumiogrid";
constexpr const char* password = "sample grid password";  // the sample's own, see demo/README.md
constexpr const char* withDetails = R"({"variant":"withDetails"})";

bool askManager() {
    return adminhost::GetLaunchDaemonServiceState(
        adminhost::HostPath("/System/Library/LaunchDaemons/com.brenn.lumioserverd.plist"));
}

/// The sample service, which the manager shows as running.
class Service {
  public:
    explicit Service(const std::string& configuration) {
        _root.write("/etc/adminhostd.toml", "service_manager = \"systemd\"\n" + configuration);
        adminhost::setServiceManager(adminhost::ServiceManager::systemd);
        if (!askManager()) {
            adminhost::test::addUnit(unit, "[Unit]\nDefaultDependencies=no\n[Service]\nExecStart=/bin/sleep 1000000\n");
            adminhost::test::startUnit(unit);
            if (!adminhost::test::reachState(unit, "active")) {
                throw std::runtime_error("the unit does not start");
            }
        }
        _daemon = std::make_unique<Daemon>(_root, Command{"--config", _root.disk("/etc/adminhostd.toml")});
    }
    [[nodiscard]] const SampleRoot& root() const { return _root; }
    [[nodiscard]] const Daemon& daemon() const { return *_daemon; }

  private:
    SampleRoot _root;
    std::unique_ptr<Daemon> _daemon;
};

void getState(benchmark::State& state) {
    const Service service("");
    compare(state, "getState", "{}", service.daemon(), [] {
        if (!askManager()) {
            throw std::runtime_error("the service does not run");
        }
    });
}

/// One search for the account's principal, as the check makes it.
void searchAccount() {
    adminhost::DirectoryQuery query;
    query.recordTypes = {std::string(adminhost::directory::users)};
    query.attribute = adminhost::directory::recordName;
    query.values = {account};
    query.attributes = {std::string(adminhost::directory::authenticationAuthority)};
    query.maximum = 1;
    const auto found = adminhost::searchDirectory(query);
    if (!found || found->size() != 1) {
        throw std::runtime_error("the account is not found");
    }
}

/// One ticket into a cache file of its own, which is removed again with `use` in between.
template <class Use>
void withTicket(const std::string& file, const std::string& principalText, Use use) {
    const auto principal = lumio::KRB5Principal::initWithString(principalText);
    const auto cache = lumio::KRB5CredentialCache::initWithName(file, lumio::KRB5CredentialCacheFileType,
                                                                principal.get(), principal->context());
    cache->acquireInitialCredentialWithPassword(password);
    if (cache->errorCode() != 0) {
        throw std::runtime_error("no ticket: " + cache->errorMessage());
    }
    use();
    cache->destroy();
}

void getStateWithDetails(benchmark::State& state) {
    const support::Kdc kdc;
    kdc.admin(std::string("addprinc -pw \"") + password + "\" " + account);
    const support::ScopedEnvironment scoped(kdc.environment());
    const Service service("[[directory.node]]\nname = \"/Local\"\nkind = \"local\"\nkerberos_realm = \"" + kdc.realm() +
                          "\"\n");
    const SampleRoot& root = service.root();
    if (service.daemon().request("getState", withDetails).find("kNimboAvailable") == std::string::npos) {
        throw std::runtime_error("the grid is not reached");
    }
    adminhost::setSystemRoot(root.path());
    adminhost::setDirectoryNodes({adminhost::localAccounts(std::nullopt, kdc.realm())});
    const std::string enabled = " from cameras where (disabled != 't' OR disabled is NULL)";
    const std::vector<Command> queries{
        query(root, "select count(*)" + enabled),
        query(root, "select count(*)" + enabled + " and recording_status!='offline'"),
        query(root, "select count(*)" + enabled + " and recording_status like 'capturing%'"),
        query(root, "select count(*) from jobs where nimbo_job_status='Running'"),
        query(root, "select count(*) from jobs where nimbo_job_id is not NULL")};
    const std::string cache = root.directory() + "/cache";
    ::setenv("KRB5CCNAME", ("FILE:" + cache).c_str(), 1);
    compare(state, "getState", withDetails, service.daemon(), [&] {
        runAll(queries);
        searchAccount();
        withTicket(cache, std::string(account) + '@' + kdc.realm(), [&] {
            run({root.disk("/usr/bin/nimbo"), "-h", "grid", "-auth", "Kerberos", "-f", "xml", "-grid", "list"});
        });
    });
    adminhost::setDirectoryNodes({adminhost::localAccounts()});
    adminhost::setSystemRoot("/");
}

BENCHMARK(getState)->UseManualTime()->Unit(benchmark::kMillisecond)->MinTime(2);
BENCHMARK(getStateWithDetails)->UseManualTime()->Unit(benchmark::kMillisecond)->MinTime(2);

}  // namespace

int main(int argc, char** argv) {
    adminhost::test::enterServiceManager(argc, argv);
    benchmark::Initialize(&argc, argv);
    benchmark::RunSpecifiedBenchmarks();
    return 0;
}
