// The grid's account through the command line, in a real LDAP server and with a real Kerberos server.

#include "tests/support/AdministratorTree.h"
#include "tests/support/DaemonProcess.h"
#include "tests/support/Kdc.h"
#include "tests/support/Program.h"
#include "tests/support/SampleRoot.h"
#include "tests/support/SilentServer.h"
#include "tests/support/Slapd.h"

#include <chrono>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <future>
#include <iterator>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::Not;

constexpr const char* administratorsPassword = "planted-password";

class AccountVerb : public testing::Test {
  protected:
    void SetUp() override {
        server.add(administratorTree(administratorsPassword));
        kdc.admin("addprinc -randkey nimbo/grid1.example.org");
        root.write("/etc/demo/nimbo.service", "nimbo/grid1.example.org");
        startDaemon("kerberos_realm = \"NIMBO.TEST\"\n");
    }
    void TearDown() override { EXPECT_THAT(daemon->log(), Not(HasSubstr(administratorsPassword))); }

    void startDaemon(const std::string& more) {
        daemon.reset();
        daemon.emplace(DaemonProcess::Options{
            {"--root", root.path(), "--plugin", std::string(BINARY_DIR) + "/lib/adminhost_lumio.so"},
            "[[directory.node]]\nname = \"/LDAP\"\nuri = [\"" + server.localUri() +
                "\"]\nbase = \"dc=nimbo,dc=test\"\ncreate_base = \"ou=people,dc=nimbo,dc=test\"\n" + more,
            {},
            true,
            {}});
    }
    [[nodiscard]] ProgramResult ctl(std::vector<std::string> words) const {
        words.insert(words.begin(), {std::string(BINARY_DIR) + "/bin/adminhostctl", "--socket", daemon->socket()});
        return runProgram(words, Errors::merge, "");
    }
    [[nodiscard]] ProgramResult create(const std::vector<std::string>& more = {},
                                       const std::string& password = administratorsPassword) const {
        const std::string file = root.directory() + "/password";
        std::ofstream(file) << password << '\n';
        std::vector<std::string> words{"account", "create", "/LDAP", "writer", "--password-file", file};
        words.insert(words.end(), more.begin(), more.end());
        ProgramResult result = ctl(words);
        EXPECT_THAT(result.output, Not(HasSubstr(administratorsPassword)));
        return result;
    }
    /// The word after a heading of the output.
    static std::string after(const std::string& output, const std::string& heading) {
        const std::size_t begin = output.find(heading);
        const std::size_t word =
            begin == std::string::npos ? begin : output.find_first_not_of(' ', begin + heading.size());
        return word == std::string::npos ? "" : output.substr(word, output.find('\n', word) - word);
    }

    const support::Kdc kdc;
    const support::ScopedEnvironment environment{kdc.environment()};
    const support::Slapd server;
    const SampleRoot root;
    std::optional<DaemonProcess> daemon;
};

TEST_F(AccountVerb, AccountIsShownOnceAndTheMissingPrincipalIsNamed) {
    const ProgramResult result = create();
    EXPECT_EQ(result.status, 0) << result.output;
    const std::string name = after(result.output, "username ");
    EXPECT_EQ(name, "sorvanenimbo_" + SampleRoot::uuidOf("server", "library"));
    EXPECT_EQ(after(result.output, "password ").size(), 20U) << result.output;
    EXPECT_THAT(result.output,
                AllOf(HasSubstr("Left to do: "), HasSubstr("create the principal " + name + "@NIMBO.TEST")));
}

TEST_F(AccountVerb, SavedAccountIsShownNowhereAndAcceptedOnceItsPrincipalExists) {
    const ProgramResult saved = create({"--save", "--yes"});
    EXPECT_EQ(saved.status, 0) << saved.output;
    const std::string name = "sorvanenimbo_" + SampleRoot::uuidOf("server", "library");
    EXPECT_THAT(saved.output, AllOf(HasSubstr("settings.nimbo_client_username: \"lumiogrid\" -> \"" + name + '"'),
                                    HasSubstr("settings.nimbo_client_password: (secret) -> (secret)"),
                                    Not(HasSubstr("password  ")), HasSubstr("Left to do: ")));
    EXPECT_EQ(ctl({"settings", "get", "nimbo_client_username"}).output, name + '\n');

    const ProgramResult shown = create();
    const std::string password = after(shown.output, "password ");
    std::string quoted;
    for (const char c : password) {
        quoted.append(c == '"' ? 2 : 1, c);
    }
    kdc.admin("addprinc -pw \"" + quoted + "\" " + name);
    const std::string file = root.directory() + "/account-password";
    std::ofstream(file) << password << '\n';
    const ProgramResult tried =
        ctl({"settings", "set", "nimbo_controller", "grid1.example.org", "--validate", "--password-file", file});
    EXPECT_EQ(tried.status, 0) << tried.output;
    EXPECT_THAT(tried.output, AllOf(HasSubstr("grid controller: passed\n"), Not(HasSubstr(password))));
    ASSERT_EQ(ctl({"settings", "set", "nimbo_client_password", "@" + file}).status, 0);
    EXPECT_THAT(ctl({"status"}).output, HasSubstr("grid controller     grid1.example.org: available\n"));
}

TEST_F(AccountVerb, AccountWithoutAKerberosAuthorityIsNamed) {
    startDaemon("");
    EXPECT_THAT(create().output, HasSubstr("Left to do: the account has no Kerberos authority"));
}

TEST_F(AccountVerb, AccountThatCannotBeStoredIsAnErrorAndHasToBeCreatedAgain) {
    const std::filesystem::path preferences = root.memberPreferencesPath();
    std::filesystem::remove(preferences);
    std::filesystem::create_directories(preferences / "in the way");
    const ProgramResult result = create({"--save", "--yes"});
    EXPECT_EQ(result.status, 1) << result.output;
    EXPECT_THAT(result.output, AllOf(HasSubstr("the account was created, but its name and password were not stored; "
                                               "run account create again\n"),
                                     Not(HasSubstr("Left to do"))));
}

TEST_F(AccountVerb, CheckWhoseAnswerIsLostIsNotSaidToRejectTheAccount) {
    const SilentServer silent;
    std::ofstream(kdc.configuration()) << support::Kdc::clientConfiguration(kdc.realm(), silent.port());
    auto created = std::async(std::launch::async, [this] { return create(); });
    const auto isChecked = [this] {
        return daemon->connect().get("/v1/").body.find("\"command\":\"validateSettings\"") != std::string::npos;
    };
    for (int tries = 0; tries < 500 && !isChecked(); ++tries) {
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    EXPECT_EQ(::kill(daemon->workerPid(), SIGKILL), 0);
    const ProgramResult result = created.get();
    EXPECT_EQ(result.status, 0) << result.output;
    EXPECT_THAT(result.output, AllOf(HasSubstr("Left to do: whether the account can sign in could not be checked: "),
                                     Not(HasSubstr("does not accept"))));
}

TEST_F(AccountVerb, WrongPasswordIsTheDirectorysErrorAndNothingIsChecked) {
    const ProgramResult result = create({}, "wrong");
    EXPECT_EQ(result.status, 1);
    EXPECT_THAT(result.output, AllOf(HasSubstr("errorCode is 49"), Not(HasSubstr("Left to do"))));
}

}  // namespace
}  // namespace adminhost::test
