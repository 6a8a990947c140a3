#pragma once

// A daemon with the fixture plug-in beside a journal of its own.

#include "platform/json/Json.h"
#include "tests/support/DaemonProcess.h"
#include "tests/support/Journal.h"
#include "tests/support/OwnMounts.h"
#include "tests/support/Program.h"
#include "tests/support/SampleRoot.h"
#include "tests/system/host/Host.h"

#include <chrono>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <iterator>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {

using test::dictionaryOf;
using test::eventually;

class AuditTest : public testing::Test {
  protected:
    AuditTest() { start(); }

    void start() {
        test::DaemonProcess::Options options;
        options.arguments = {"--root", root.path(), "--plugin", test::pluginFile("fixture_good")};
        options.configuration =
            "queue_limit_per_account = 2\n[[permission]]\nusers = [\"bert\"]\nclasses = [\"write\", \"read\"]\n"
            "[[permission]]\nusers = [\"emil\"]\nclasses = [\"audit\"]\n";
        daemon.emplace(options);
        ::chmod(daemon->directory().c_str(), 0755);
        ::chmod(daemon->socket().c_str(), 0666);
    }

    static std::vector<pid_t> childrenOf(pid_t pid) {
        std::ifstream file(fmt::format("/proc/{}/task/{}/children", pid, pid));
        return {std::istream_iterator<pid_t>(file), {}};
    }
    /// Kills all processes of the daemon, so that none sees the end of another.
    void killAll() {
        std::vector<pid_t> processes = childrenOf(daemon->pid());
        processes.push_back(daemon->pid());
        for (const int number : {SIGSTOP, SIGKILL}) {
            for (const pid_t process : processes) {
                ::kill(process, number);
            }
        }
        daemon->wait();
    }

    /// A page of the audit, or all entries of a request.
    [[nodiscard]] Dictionary page(const std::string& arguments) const {
        return dictionaryOf(daemon->connect().get("/v1/audit?" + arguments));
    }
    [[nodiscard]] Array entriesOf(const std::string& request) const {
        Array found;
        std::string after;
        for (bool more = true; more;) {
            const Dictionary one = page("after=" + after);
            for (const Value& entry : *one.get("entries").array()) {
                if (entry.dictionary()->text("request") == request) {
                    found.push_back(entry);
                }
            }
            after = one.text("next");
            more = one.get("more") == Value(true);
        }
        return found;
    }
    /// The entries of a request, once the journal has so many.
    std::vector<Dictionary> awaitEntries(const std::string& request, std::size_t count) const {
        eventually([&] { return entriesOf(request).size() >= count; });
        std::vector<Dictionary> entries;
        for (const Value& entry : entriesOf(request)) {
            entries.push_back(*entry.dictionary());
        }
        EXPECT_THAT(entries, testing::SizeIs(count));
        entries.resize(count);
        return entries;
    }
    /// The number of entries of a request, once the journal has everything that was recorded so far.
    [[nodiscard]] std::size_t settledCount(const std::string& request) const {
        awaitEntries(daemon->connect().post("/v1/fixture/echo").headers.at("request-id"), 1);
        return entriesOf(request).size();
    }
    [[nodiscard]] test::ProgramResult ctl(std::vector<std::string> words) const {
        words.insert(words.begin(), {std::string(BINARY_DIR) + "/bin/adminhostctl", "--socket", daemon->socket()});
        return test::runProgram(words, test::Errors::merge);
    }
    static std::string journalctl(std::vector<std::string> words) {
        words.insert(words.begin(), {"journalctl", "--no-pager"});
        return test::runProgram(words, test::Errors::merge).output;
    }
    /// A write that reports two changes and then waits. Returns its id once it has reported.
    std::string beginWrite(test::UnixHttp& client, int milliseconds) const {
        const std::string id = fmt::format("01234567-89ab-cdef-0123-{:012x}", ++ids + ::getpid() * 1000LL);
        client.begin("POST", "/v1/fixture/reportWrite",
                     fmt::format(R"({{"changes": 1, "text": "443", "milliseconds": {}}})", milliseconds),
                     {"Request-Id: " + id});
        EXPECT_TRUE(eventually([&] {
            const Dictionary record = dictionaryOf(daemon->connect().get("/v1/requests/" + id));
            return record.get("changes").array() != nullptr && record.get("changes").array()->size() == 2;
        }));
        return id;
    }

    const test::SampleRoot root;
    std::optional<test::DaemonProcess> daemon;
    static inline long long ids = 0;
};

}  // namespace adminhost
