// Look-ups of people in the machine's accounts, with 10 and with 100,000 accounts.
//
// FirstLookUp reads the account files. NextLookUp uses the result of that pass, and needs the same time for any number
// of accounts. Request has the look-ups of a listing of 1000 cameras with 5 access entries each, including the one
// pass; its counter "passes" is the number of times an account file was read. Completion compares the names of every
// account.

#include "platform/directory/AccountFiles.h"
#include "platform/directory/Directory.h"
#include "platform/directory/Entries.h"
#include "platform/directory/LocalAccounts.h"
#include "platform/directory/NameBasedUuid.h"

#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <string>
#include <thread>

#include <benchmark/benchmark.h>

namespace {

using namespace adminhost;

/// A system root with this many users, which exists as long as the object.
class Accounts {
  public:
    explicit Accounts(std::int64_t count) {
        std::string pattern = std::filesystem::temp_directory_path() / "directory-bench.XXXXXX";
        if (::mkdtemp(pattern.data()) == nullptr) {
            throw std::runtime_error("no temporary directory");
        }
        _directory = pattern;
        std::filesystem::create_directory(_directory / "etc");
        std::ofstream users(_directory / "etc/passwd");
        for (std::int64_t i = 0; i < count; ++i) {
            users << "user" << i << ":x:" << 10'000 + i << ":100:User Number " << i << ",,,:/home/user" << i
                  << ":/bin/bash\n";
        }
        users.close();
        std::ofstream(_directory / "etc/group") << "staff:x:50:\n";
        setSystemRoot(_directory.string());
        // A file that has just been changed is read at every look-up, which is not to be measured here.
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
    }
    Accounts(const Accounts&) = delete;
    Accounts& operator=(const Accounts&) = delete;
    ~Accounts() {
        setSystemRoot("/");
        setDirectoryNodes({localAccounts()});
        std::filesystem::remove_all(_directory);
    }

  private:
    std::filesystem::path _directory;
};

std::string uuidOfUser(std::int64_t number) {
    return textOf(nameBasedUuid(localAccountsNamespace, "user:user" + std::to_string(number)));
}

/// The look-up of one access list of five people.
std::size_t lookUp(std::int64_t accounts) {
    DirectoryQuery query;
    query.recordTypes = {std::string(directory::users), std::string(directory::groups)};
    query.attribute = directory::generatedUID;
    for (std::int64_t i = 1; i <= 5; ++i) {
        query.values.push_back(uuidOfUser(accounts - i));
    }
    query.attributes = {std::string(directory::recordName), std::string(directory::realName),
                        std::string(directory::generatedUID)};
    const auto records = searchDirectory(query);
    if (!records || records->size() != 5) {
        throw std::runtime_error("not all of the five were found");
    }
    return records->size();
}

void FirstLookUp(benchmark::State& state) {
    const Accounts accounts(state.range(0));
    while (state.KeepRunning()) {
        setDirectoryNodes({localAccounts()});  // has read no file yet
        benchmark::DoNotOptimize(lookUp(state.range(0)));
    }
}

void NextLookUp(benchmark::State& state) {
    const Accounts accounts(state.range(0));
    setDirectoryNodes({localAccounts()});
    lookUp(state.range(0));
    while (state.KeepRunning()) {
        benchmark::DoNotOptimize(lookUp(state.range(0)));
    }
}

void Request(benchmark::State& state) {
    const Accounts accounts(state.range(0));
    while (state.KeepRunning()) {
        setDirectoryNodes({localAccounts()});
        for (int camera = 0; camera < 1000; ++camera) {
            benchmark::DoNotOptimize(lookUp(state.range(0)));
        }
    }
    AccountFiles files;
    for (int camera = 0; camera < 1000; ++camera) {
        benchmark::DoNotOptimize(files.table(AccountKind::user));
        benchmark::DoNotOptimize(files.table(AccountKind::group));
    }
    state.counters["passes"] = static_cast<double>(files.passes());
}

void Completion(benchmark::State& state) {
    const Accounts accounts(state.range(0));
    setDirectoryNodes({localAccounts()});
    while (state.KeepRunning()) {
        benchmark::DoNotOptimize(directoryEntries("user number 9", 20));
    }
}

BENCHMARK(FirstLookUp)->Arg(10)->Arg(100'000)->Unit(benchmark::kMillisecond);
BENCHMARK(NextLookUp)->Arg(10)->Arg(100'000)->Unit(benchmark::kMicrosecond);
BENCHMARK(Request)->Arg(10)->Arg(100'000)->Unit(benchmark::kMillisecond);
BENCHMARK(Completion)->Arg(10)->Arg(100'000)->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
