// Passes the grid password through the real command line, daemon, worker and tools. Its plain text is in no file, log
// line, reply, argument list or environment, whether the request succeeds or fails.

#include "platform/json/Json.h"
#include "platform/value/Value.h"
#include "tests/support/DaemonProcess.h"
#include "tests/support/Program.h"
#include "tests/support/SampleRoot.h"
#include "tests/system/secrets/Searches.h"

#include <array>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <thread>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

namespace fs = std::filesystem;
using testing::AllOf;
using testing::Contains;
using testing::HasSubstr;
using testing::IsEmpty;

constexpr const char* writeSettings = "/v1/lumio/writeSettings";
const std::string scripts = "/usr/share/sorvaneproducer/lumioserverd/script/";

/// The tools that a write of settings runs.
const std::array<std::string, 4> tools{scripts + "setup_lumioserverd_preferences",
                                       scripts + "setup_lumioserverd_library", "/usr/bin/lumioconfig",
                                       "/usr/bin/sqlite3"};

std::string bytesOf(const fs::path& file) {
    std::ifstream in(file, std::ios::binary);
    return {std::istreambuf_iterator<char>(in), {}};
}

/// The directory of the file from which the command line reads the password: the only place where it may be.
class PasswordFile {
  public:
    PasswordFile() {
        std::string pattern = fs::temp_directory_path() / "given-XXXXXX";
        if (::mkdtemp(pattern.data()) == nullptr) {
            throw std::runtime_error("no directory");
        }
        _directory = pattern;
        std::ofstream(path()) << planted << '\n';
    }
    PasswordFile(const PasswordFile&) = delete;
    PasswordFile& operator=(const PasswordFile&) = delete;
    ~PasswordFile() { fs::remove_all(_directory); }

    [[nodiscard]] std::string path() const { return _directory / "password"; }

  private:
    fs::path _directory;
};

class GridPassword : public testing::Test {
  protected:
    void SetUp() override {
        // Each run of a tool records its arguments and environment before it does its work.
        for (std::size_t i = 0; i < tools.size(); ++i) {
            const std::string record =
                "{ /usr/bin/tr '\\0' '\\n' </proc/$$/cmdline; /usr/bin/tr '\\0' '\\n' "
                "</proc/$$/environ; } >>'" +
                recordOf(i) + "'\n";
            const bool isScript = tools[i] != "/usr/bin/sqlite3";
            std::string text = isScript ? root.read(tools[i]) : "#!/bin/sh\nexec /usr/bin/sqlite3 \"$@\"\n";
            text.insert(text.find('\n') + 1, record);
            root.write(tools[i], text);
            fs::permissions(root.disk(tools[i]), fs::perms(0755));
        }
        root.recordToolCalls();
        daemon.emplace(DaemonProcess::Options{
            {"--root", root.path(), "--plugin", std::string(BINARY_DIR) + "/lib/adminhost_lumio.so"},
            "",
            {},
            true,
            {}});
    }
    /// After every test, the password is in no file and no process.
    void TearDown() override {
        checkProcesses();
        for (const fs::path& directory : {fs::path(root.directory()), daemon->directory()}) {
            const FileSearch search = searchBelow(directory);
            EXPECT_GT(search.files, 0U) << directory;
            EXPECT_THAT(search.holding, IsEmpty());
        }
        EXPECT_FALSE(daemon->log().empty());
        for (std::size_t i : {0U, 3U}) {
            EXPECT_THAT(bytesOf(recordOf(i)), AllOf(HasSubstr(tools[i]), HasSubstr("PATH="))) << "it was recorded";
        }
    }
    void checkProcesses() const {
        for (const pid_t pid : processesFrom(daemon->pid())) {
            EXPECT_FALSE(holdsPlanted(argumentsAndEnvironmentOf(pid))) << pid;
        }
        EXPECT_THAT(argumentsAndEnvironmentOf(daemon->pid()), HasSubstr("--root"));
        EXPECT_THAT(argumentsAndEnvironmentOf(daemon->workerPid()), HasSubstr("worker"));
        for (const pid_t pid : {daemon->pid(), daemon->workerPid()}) {
            // Only root can look: to other accounts, the daemon's own included, its environment is closed.
            EXPECT_EQ(argumentsAndEnvironmentOf(pid).find("TMPDIR=") != std::string::npos, ::geteuid() == 0) << pid;
        }
    }

    [[nodiscard]] std::string recordOf(std::size_t tool) const {
        return root.directory() + "/recorded." + std::to_string(tool);
    }
    /// Checks a reply, the daemon's record of the request, and its other answers.
    HttpReply checked(HttpReply reply) const {
        EXPECT_FALSE(holdsPlanted(reply.body)) << reply.body;
        for (const auto& [name, value] : reply.headers) {
            EXPECT_FALSE(holdsPlanted(value)) << name;
        }
        UnixHttp client = daemon->connect();
        for (const std::string& target : {"/v1/requests/" + reply.headers.at("request-id"), std::string("/v1/"),
                                          std::string("/v1/lumio"), std::string("/v1/lumio/history")}) {
            const HttpReply other = client.get(target);
            EXPECT_EQ(other.status, 200) << target;
            EXPECT_FALSE(holdsPlanted(other.body)) << target;
        }
        const HttpReply read = client.post("/v1/lumio/readSettings");
        EXPECT_FALSE(holdsPlanted(read.body));
        return reply;
    }
    [[nodiscard]] HttpReply post(const std::string& body, const UnixHttp::Headers& headers = {},
                                 const std::string& target = writeSettings) const {
        return checked(UnixHttp(daemon->socket(), std::chrono::seconds(60)).post(target, body, headers));
    }
    [[nodiscard]] static std::string bodyWith(const std::string& more = "") {
        return std::string(R"({"configuration":{"nimbo_client_password":")") + planted + '"' + more +
               R"(},"optionalArguments":{"variant":"getConfig"}})";
    }
    [[nodiscard]] ProgramResult ctl(std::vector<std::string> words) const {
        words.insert(words.begin(), {std::string(BINARY_DIR) + "/bin/adminhostctl", "--socket", daemon->socket()});
        ProgramResult result = runProgram(words, Errors::merge);
        EXPECT_FALSE(holdsPlanted(result.output)) << result.output;
        return result;
    }

    const SampleRoot root;
    const PasswordFile password;
    std::optional<DaemonProcess> daemon;
};

TEST(Searches, PlantedValueIsFoundInFilesNamesArgumentsAndEnvironments) {
    const SampleRoot root;
    EXPECT_THAT(searchBelow(root.directory()).holding, IsEmpty());
    root.write("/a/deep/file", std::string("\0before ", 8) + planted);
    root.write("/a/base64", "xx cGxhbnRlZC1ncmlkLXNlY3JldC03MjYx");
    root.write("/a/" + std::string(planted), "");
    EXPECT_EQ(searchBelow(root.directory()).holding.size(), 3U);

    ::setenv("CONTROL", planted, 1);
    int ends[2];
    ASSERT_EQ(::pipe(ends), 0);
    const pid_t inEnvironment = ::fork();
    if (inEnvironment == 0) {  // ends with the pipe
        ::dup2(ends[0], STDIN_FILENO);
        ::close(ends[1]);
        ::execl("/bin/cat", "cat", nullptr);
        ::_exit(127);
    }
    ::unsetenv("CONTROL");
    for (int tries = 0; !argumentsAndEnvironmentOf(inEnvironment).starts_with("cat") && tries < 1000; ++tries) {
        ::usleep(10'000);
    }
    EXPECT_TRUE(holdsPlanted(argumentsAndEnvironmentOf(inEnvironment)));
    ::close(ends[0]);
    ::close(ends[1]);
    EXPECT_EQ(::waitpid(inEnvironment, nullptr, 0), inEnvironment);
    const DaemonProcess inArguments({{"--plugin", std::string("/nowhere/") + planted}, "", {}, true, {}});
    EXPECT_TRUE(holdsPlanted(argumentsAndEnvironmentOf(inArguments.pid())));
    EXPECT_THAT(processesFrom(inArguments.pid()), Contains(inArguments.workerPid()));
}

TEST_F(GridPassword, AcceptedOneIsStoredOnlyInItsProtectedFormAndHistoryHoldsNoOther) {
    const std::string before = bytesOf(root.clusterPreferencesPath());
    const std::string changes =
        R"(,"server_port":8171,"nimbo_controller":"unknown-controller",)"
        R"("properties":[{"_newid_":true,"name":"n","value":"v","protect":true}],)"
        R"("cameras":[{"_id_":")" +
        SampleRoot::uuidOf("camera", "Main hall") +
        R"(","access_control_enabled":true,"allowedUsersAndGroups":[{"_newid_":true,"type":"user","shortName":"ben"}]}])";
    const HttpReply reply = post(bodyWith(changes));
    ASSERT_EQ(reply.status, 200) << reply.body;
    EXPECT_THAT(reply.body, HasSubstr("\"writeStatus\":0"));
    const std::string after = bytesOf(root.clusterPreferencesPath());
    EXPECT_NE(after, before);
    EXPECT_THAT(after, HasSubstr("nimbo_client_password"));

    // The same request again, so that the password is stored already when the newest entry is made; as a property list.
    EXPECT_EQ(post(bodyWith(R"(,"server_port":8172)")).status, 200);
    EXPECT_EQ(bytesOf(root.clusterPreferencesPath()), after);
    const HttpReply list =
        post(std::string("<plist><dict><key>configuration</key><dict><key>nimbo_client_password"
                         "</key><string>") +
                 planted + "</string><key>server_port</key><integer>8173</integer></dict></dict></plist>",
             {"Content-Type: application/x-plist", "Accept: application/x-plist"});
    EXPECT_EQ(list.status, 200);
    std::size_t entries = 0;
    for (const auto& entry : fs::directory_iterator(root.disk("/var/lib/adminhostd/history/lumio"))) {
        entries += fs::exists(entry.path() / "about.plist") ? 1U : 0U;
    }
    EXPECT_EQ(entries, 3U);
    for (std::size_t i = 0; i < tools.size(); ++i) {
        EXPECT_THAT(bytesOf(recordOf(i)), HasSubstr(tools[i])) << "every tool has run";
    }
}

TEST_F(GridPassword, OneThatCannotBeProtectedIsLost) {
    root.write("/Library/SorvaneProducer/Shared/Server/Secrets/kek.plist", "no property list");
    EXPECT_EQ(post(bodyWith()).status, 200);
    EXPECT_THAT(daemon->log(), HasSubstr("nimbo_client_password encryption failed"));
}

TEST_F(GridPassword, WritesThatFailShowNothingOfIt) {
    root.setSwitch("setup_library.exit", "7");
    EXPECT_EQ(post(bodyWith()).status, 200);
    root.clearSwitches();
    fs::remove(root.clusterPreferencesPath());
    fs::create_directory(root.clusterPreferencesPath());
    EXPECT_THAT(post(bodyWith()).body, HasSubstr("\"writeStatus\":400"));
    root.setSwitch("setup_preferences.exit", "7");
    EXPECT_EQ(post(bodyWith()).status, 200);
}

TEST_F(GridPassword, RefusedRequestsShowNothingOfIt) {
    EXPECT_EQ(post(bodyWith(R"(,"properties":[{"_newid_":true,"name":"a\"b"}])")).status, 422);
    EXPECT_EQ(post(bodyWith(), {"If-Match: \"stale\""}).status, 412);
    EXPECT_EQ(post(bodyWith(), {"If-Match: stale"}).status, 400);
    EXPECT_EQ(post(bodyWith(), {"Content-Type: text/plain"}).status, 415);
    EXPECT_EQ(post(bodyWith(), {}, "/v1/lumio/writeSetting").status, 404);
    // "@" stands for the password.
    const auto filled = [](std::string text) {
        for (std::size_t at = text.find('@'); at != std::string::npos; at = text.find('@')) {
            text.replace(at, 1, planted);
        }
        return text;
    };
    for (const char* broken :
         {"@", "\"@\"", "\"@", R"({"configuration":@)", R"({"configuration":{"nimbo_client_password":"@"}}@)",
          R"({"configuration":{"nimbo_client_password":'@'}})",
          "{\"configuration\":{\"nimbo_client_password\":\"@\xFF\"}}",
          "{\"configuration\":{\"nimbo_client_password\":\"@\n\"}}",
          R"({"configuration":{"nimbo_client_password":"@","nimbo_client_password":"@"}})",
          R"({"configuration":{"nimbo_client_password":{"$data":"@"}}})",
          R"({"configuration":{"nimbo_client_password":{"$date":"@"}}})"}) {
        EXPECT_EQ(post(filled(broken)).status, 400) << broken;
    }
    EXPECT_EQ(post(filled(R"({"configuration":{"nimbo_client_password":["@"]}})")).status, 422);
    for (const char* element : {"<integer>@</integer>", "<real>@</real>", "<date>@</date>", "<data>@</data>",
                                "<true>@</true>", "<dict>@</dict>", "<array>@</array>", "<string>@"}) {
        const std::string list =
            filled(std::string("<plist><dict><key>configuration</key><dict><key>nimbo_client_password</key>") +
                   element + "</dict></dict></plist>");
        EXPECT_EQ(post(list, {"Content-Type: application/x-plist"}).status, 400) << element;
    }
}

TEST_F(GridPassword, CommandLineReadsItFromFilesAndShowsItNowhere) {
    const std::string desired = root.directory() + "/desired.toml";
    EXPECT_EQ(ctl({"export", desired}).status, 0);
    EXPECT_EQ(ctl({"plan", desired, "--password-file", password.path()}).status, 0);
    EXPECT_EQ(ctl({"apply", desired, "--password-file", password.path()}).status, 0);
    EXPECT_EQ(ctl({"settings", "set", "nimbo_client_password", '@' + password.path()}).status, 0);
    EXPECT_EQ(ctl({"writeSettings", "configuration.nimbo_client_password@" + password.path()}).status, 0);
    EXPECT_EQ(ctl({"export", desired}).status, 0);
    EXPECT_EQ(ctl({"history"}).status, 0);
    EXPECT_EQ(ctl({"rollback", "1"}).status, 0);
    EXPECT_EQ(ctl({"settings", "get"}).status, 0);
    root.write("/Library/SorvaneProducer/Shared/Server/Secrets/kek.plist", "no property list");
    EXPECT_EQ(ctl({"apply", desired, "--password-file", password.path()}).status, 1);
}

TEST_F(GridPassword, NothingShowsItWhileTheRequestRuns) {
    root.hold("setup_library");
    UnixHttp client(daemon->socket(), std::chrono::seconds(60));
    client.begin("POST", writeSettings, bodyWith());
    ASSERT_TRUE(root.waitForHeld("setup_library"));
    EXPECT_TRUE(fs::exists(recordOf(1)));
    EXPECT_GE(processesFrom(daemon->pid()).size(), 3U) << "the front, the worker and the script";
    checkProcesses();
    const HttpReply overview = daemon->connect().get("/v1/");
    EXPECT_THAT(overview.body, HasSubstr("\"running\""));
    EXPECT_FALSE(holdsPlanted(overview.body));
    root.release("setup_library");
    EXPECT_EQ(checked(client.reply()).status, 200);
}

}  // namespace
}  // namespace adminhost::test
