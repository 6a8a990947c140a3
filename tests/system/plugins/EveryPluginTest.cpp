// Tests what the host does for every plug-in with each of two plug-ins.

#include "adminhostd/PluginFile.h"
#include "platform/json/Json.h"
#include "tests/support/DaemonProcess.h"
#include "tests/support/Program.h"
#include "tests/support/SampleRoot.h"

#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <functional>
#include <set>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace adminhost::test {
namespace {

using ::testing::HasSubstr;
using ::testing::Not;

/// The plug-in in tests/support/smallplugin, or another build of it that the environment names.
std::string smallPlugin() {
    const char* other = std::getenv("ADMINHOST_TEST_SMALL_PLUGIN");
    return other == nullptr ? std::string(BINARY_DIR) + "/tests/plugins/small_plugin.so" : other;
}

/// One plug-in, and requests that it serves.
struct Subject {
    std::string name;
    std::string file;
    std::string read;          ///< a command that shows the revision
    std::string write;         ///< a command that takes it
    std::string firstRequest;  ///< for writing, with a secret in it
    std::string secondRequest;
    std::string firstValue;  ///< that only the first writes
    std::string secret;      ///< that the first writes
    std::string badRequest;  ///< for writing
    std::string badKeyPath;  ///< of the finding
    std::string leftover;    ///< host path of a file that an interrupted operation may leave
};

void PrintTo(const Subject& subject, std::ostream* out) {
    *out << subject.name;
}

std::vector<Subject> subjects() {
    return {{"lumio", std::string(BINARY_DIR) + "/lib/adminhost_lumio.so", "readSettings", "writeSettings",
             R"({"configuration": {"submissions_groupname": "first value", "nimbo_client_password": "sesame"}})",
             R"({"configuration": {"submissions_groupname": "another"}})", "first value", "sesame",
             R"({"configuration": {"shared_filesystem": 7}})", "configuration.shared_filesystem",
             "/Library/Preferences/.com.brenn.lumioserverd.plist.adminhost-0123456789abcdef"},
            {"small", smallPlugin(), "show", "set", R"({"greeting": "first value", "passphrase": "sesame"})",
             R"({"greeting": "another"})", "first value", "sesame", R"({"greeting": 7})", "greeting",
             "/etc/beacon.conf.unfinished"}};
}

class EveryPlugin : public ::testing::TestWithParam<Subject> {
  protected:
    [[nodiscard]] DaemonProcess::Options options() const {
        DaemonProcess::Options options;
        options.arguments = {"--root", root.path(), "--plugin", GetParam().file};
        options.configuration = "languages = [\"de\", \"fr\"]\n";
        return options;
    }
    [[nodiscard]] HttpReply get(const std::string& rest) const {
        return daemon.connect().get("/v1/" + GetParam().name + rest);
    }
    [[nodiscard]] HttpReply post(const std::string& command, const std::string& body,
                                 const UnixHttp::Headers& headers = {}) const {
        return daemon.connect().post("/v1/" + GetParam().name + "/" + command, body, headers);
    }
    [[nodiscard]] static Value valueOf(const HttpReply& reply) {
        const auto value = parseJson(reply.body);
        EXPECT_TRUE(value) << reply.body;
        return value ? *value : Value();
    }
    [[nodiscard]] std::string revision() const {
        const HttpReply reply = post(GetParam().read, "{}");
        EXPECT_EQ(reply.status, 200) << reply.body;
        EXPECT_TRUE(reply.headers.contains("etag"));
        return reply.headers.contains("etag") ? reply.headers.at("etag") : "";
    }

    const SampleRoot root;
    const DaemonProcess daemon{options()};
};

TEST_P(EveryPlugin, IsDescribedAsItDescribesItself) {
    const auto loaded = loadPlugin(DiskPath(GetParam().file));
    ASSERT_TRUE(loaded);
    const Value described = valueOf(get(""));
    ASSERT_NE(described.array(), nullptr);
    ASSERT_EQ(described.array()->size(), loaded->commands.size());
    const std::set<std::string> rights{"read", "write", "control", "account"};
    for (std::size_t i = 0; i < loaded->commands.size(); ++i) {
        const Dictionary& command = *(*described.array())[i].dictionary();
        EXPECT_EQ(command.get("name"), Value(loaded->commands[i].name));
        EXPECT_TRUE(rights.contains(*command.get("access").string()));
        EXPECT_EQ(command.get("showsRevision"), Value(loaded->commands[i].showsRevision));
        EXPECT_EQ(command.get("takesRevision"), Value(loaded->commands[i].takesRevision));
        EXPECT_EQ(command.get("needs").array()->size(), loaded->commands[i].needs.size());
        EXPECT_EQ(command.contains("deadlineSeconds"), loaded->commands[i].deadline.count() > 0);
        EXPECT_NE(command.get("summary").string(), nullptr);
    }
    const Value overview = valueOf(daemon.connect().get("/v1/"));
    const Dictionary& plugin = *overview.dictionary()->get("plugins").array()->front().dictionary();
    EXPECT_EQ(plugin.get("name"), Value(GetParam().name));
    EXPECT_EQ(plugin.get("version"), Value(loaded->version));
}

TEST_P(EveryPlugin, UnknownCommandIs404AndNamesTheKnownOnes) {
    const HttpReply reply = post("no-such-command", "{}");
    EXPECT_EQ(reply.status, 404);
    EXPECT_THAT(reply.body, HasSubstr("UNKNOWN_COMMAND"));
    EXPECT_THAT(reply.body, HasSubstr(GetParam().write));
}

TEST_P(EveryPlugin, RequestThatItsCheckRefusesIs422AndChangesNothing) {
    const std::string before = revision();
    const HttpReply reply = post(GetParam().write, GetParam().badRequest);
    EXPECT_EQ(reply.status, 422) << reply.body;
    const Value answer = valueOf(reply);
    ASSERT_NE(answer.dictionary()->get("findings").array(), nullptr) << reply.body;
    EXPECT_EQ(answer.dictionary()->get("findings").array()->front().dictionary()->get("keyPath"),
              Value(GetParam().badKeyPath));
    EXPECT_EQ(revision(), before);
}

TEST_P(EveryPlugin, WriteChangesTheRevisionThatReadingShows) {
    const std::string before = revision();
    EXPECT_EQ(post(GetParam().write, GetParam().firstRequest, {"If-Match: " + before}).status, 200);
    const std::string after = revision();
    EXPECT_NE(after, before);
    EXPECT_EQ(revision(), after);
    EXPECT_THAT(post(GetParam().read, "{}").body, HasSubstr(GetParam().firstValue));
}

TEST_P(EveryPlugin, WriteThatNamesAnOldRevisionIs412AndChangesNothing) {
    const std::string before = revision();
    ASSERT_EQ(post(GetParam().write, GetParam().firstRequest, {"If-Match: " + before}).status, 200);
    const std::string after = revision();
    const HttpReply reply = post(GetParam().write, GetParam().secondRequest, {"If-Match: " + before});
    EXPECT_EQ(reply.status, 412);
    EXPECT_THAT(reply.body, HasSubstr("REVISION_CHANGED"));
    EXPECT_EQ(revision(), after);
}

TEST_P(EveryPlugin, RevisionForACommandThatAcceptsNoneIs400) {
    const HttpReply reply = post(GetParam().read, "{}", {"If-Match: \"r\""});
    EXPECT_EQ(reply.status, 400);
    EXPECT_THAT(reply.body, HasSubstr("PRECONDITION_NOT_UNDERSTOOD"));
}

TEST_P(EveryPlugin, HistoryHasTheValuesBeforeAWriteAndNoSecret) {
    ASSERT_EQ(post(GetParam().write, GetParam().firstRequest).status, 200);
    ASSERT_EQ(post(GetParam().write, GetParam().secondRequest).status, 200);
    const HttpReply reply = get("/history");
    ASSERT_EQ(reply.status, 200) << reply.body;
    EXPECT_THAT(reply.body, HasSubstr(GetParam().firstValue));
    EXPECT_THAT(reply.body, HasSubstr("(secret)"));
    EXPECT_THAT(reply.body, Not(HasSubstr(GetParam().secret)));
    EXPECT_THAT(daemon.log(), Not(HasSubstr(GetParam().secret)));
}

TEST_P(EveryPlugin, LeftoverOfAnInterruptedOperationIsRemovedByTheNextWriteAtTheLatest) {
    root.write(GetParam().leftover, "half");
    ASSERT_EQ(::kill(daemon.workerPid(), SIGKILL), 0);
    ASSERT_TRUE(daemon.waitForLog("was killed by signal 9"));
    EXPECT_EQ(post(GetParam().write, GetParam().firstRequest).status, 200);
    EXPECT_THROW(static_cast<void>(root.read(GetParam().leftover)), std::runtime_error);
}

INSTANTIATE_TEST_SUITE_P(Plugins, EveryPlugin, ::testing::ValuesIn(subjects()),
                         [](const auto& about) { return about.param.name; });

class Needs : public ::testing::Test {
  protected:
    [[nodiscard]] HttpReply flash() const { return daemon.connect().post("/v1/small/flash", "{}"); }

    const SampleRoot root;
    const DaemonProcess daemon{{{"--root", root.path(), "--plugin", smallPlugin()}, "", {}}};
};

TEST_F(Needs, CommandRunsIfWhatItNeedsIsUsable) {
    EXPECT_EQ(flash().status, 204);
}

TEST_F(Needs, CommandIsRefusedWithReasonAndFixWhileWhatItNeedsIsUnusable) {
    root.write("/etc/beacon.broken", "");
    const HttpReply reply = flash();
    EXPECT_EQ(reply.status, 500);
    EXPECT_EQ(
        reply.body,
        R"({"error":"REQUIREMENT_NOT_MET","message":"The command needs \"lamp\": the lamp is broken; replace it."})"
        "\n");
    EXPECT_TRUE(daemon.waitForLog("adminhostd: small/flash needs \"lamp\": the lamp is broken; replace it\n"));
    EXPECT_EQ(daemon.connect().post("/v1/small/show", "{}").status, 200) << "other commands are served";
    root.remove("/etc/beacon.broken");
    EXPECT_EQ(flash().status, 204);
}

TEST_F(Needs, CommandIsToBeSentAgainWhileItIsUnknownWhetherWhatItNeedsIsUsable) {
    root.write("/etc/beacon.dark", "");
    const HttpReply reply = flash();
    EXPECT_EQ(reply.status, 503);
    EXPECT_TRUE(reply.headers.contains("retry-after"));
    EXPECT_THAT(reply.body, HasSubstr("\"REQUIREMENT_UNKNOWN\""));
    EXPECT_THAT(reply.body, HasSubstr("it is too dark to see the lamp; wait for the morning."));
    root.remove("/etc/beacon.dark");
    EXPECT_EQ(flash().status, 204);
}

TEST_F(Needs, CheckNamesWhatIsNotUsable) {
    root.write("/etc/beacon.broken", "");
    const ProgramResult result =
        runProgram({std::string(BINARY_DIR) + "/bin/adminhostd", "--check", "--root", root.path(), "--plugin",
                    smallPlugin(), "--socket", root.directory() + "/socket"},
                   Errors::merge);
    EXPECT_EQ(result.status, 1);
    EXPECT_EQ(result.output, "small: commands that need \"lamp\" are refused: the lamp is broken; replace it\n");
}

/// The service's own plug-in, whose need is a tool.
class DatabaseNeed : public ::testing::Test {
  protected:
    [[nodiscard]] DaemonProcess::Options options() const {
        return {{"--root", root.path(), "--plugin", std::string(BINARY_DIR) + "/lib/adminhost_lumio.so"}, "", {}};
    }
    static HttpReply read(const DaemonProcess& daemon) { return daemon.connect().post("/v1/lumio/getCameras", "{}"); }

    const SampleRoot root;
};

TEST_F(DatabaseNeed, ToolThatIsMissingRefusesCommandsThatNeedItUntilItIsThere) {
    root.remove("/usr/bin/sqlite3");
    const DaemonProcess daemon(options());
    const HttpReply reply = read(daemon);
    EXPECT_EQ(reply.status, 500);
    EXPECT_THAT(reply.body, HasSubstr("REQUIREMENT_NOT_MET"));
    EXPECT_THAT(reply.body, HasSubstr("/usr/bin/sqlite3 cannot be run ("));
    EXPECT_THAT(reply.body, HasSubstr("install the package sqlite3."));
    EXPECT_EQ(daemon.connect().post("/v1/lumio/recycleService", "{}").status, 204) << "the others are served";
    std::filesystem::create_symlink("/usr/bin/sqlite3", root.disk("/usr/bin/sqlite3"));
    EXPECT_EQ(read(daemon).status, 200) << "without a restart";
}

TEST_F(DatabaseNeed, ToolThatDoesNotFinishOnceIsTriedAgain) {
    root.remove("/usr/bin/sqlite3");
    root.write("/usr/bin/sqlite3",
               "#!/bin/sh\n[ -e '" + root.disk("/slow") + "' ] && exec sleep 60\nexec /usr/bin/sqlite3 \"$@\"\n");
    std::filesystem::permissions(root.disk("/usr/bin/sqlite3"), std::filesystem::perms::owner_all);
    root.write("/slow", "");
    const DaemonProcess daemon(options());
    const HttpReply reply = read(daemon);
    EXPECT_EQ(reply.status, 503) << reply.body;
    EXPECT_THAT(reply.body, HasSubstr("REQUIREMENT_UNKNOWN"));
    root.remove("/slow");
    EXPECT_EQ(read(daemon).status, 200);
}

TEST_F(DatabaseNeed, MissingDatabaseRefusesNothing) {
    root.remove("/usr/bin/sqlite3");
    std::filesystem::remove(root.databasePath());
    const DaemonProcess daemon(options());
    EXPECT_EQ(daemon.connect().post("/v1/lumio/readSettings", "{}").status, 200);
}

TEST_F(DatabaseNeed, StartFileInTheHomeDirectoryOfTheAccountIsNamedBeforeEachRequest) {
    ASSERT_EQ(namespaceProblem(), "");
    // The account database of a mount namespace has another home directory for the account. It is the one directory in
    // which a confined tool could read the file.
    const std::string home = root.disk("/var/lumio/server/db");
    const std::string accounts = root.disk("/passwd");
    root.write("/passwd", "root:x:0:0::" + home + ":/bin/sh\n");
    root.write("/var/lumio/server/db/.sqliterc", ".nullvalue NULL\n");
    const std::string command = "mount --bind '" + accounts + "' /etc/passwd && exec '" + BINARY_DIR +
                                "/bin/adminhostd' --check --root '" + root.path() + "' --plugin '" + BINARY_DIR +
                                "/lib/adminhost_lumio.so' --socket '" + root.directory() + "/socket'";
    const ProgramResult result =
        runProgram({"/usr/bin/unshare", "--map-root-user", "--mount", "/bin/sh", "-c", command}, Errors::merge);
    EXPECT_EQ(result.output,
              "lumio: commands that need \"database\" are refused: " + home +
                  "/.sqliterc can change what /usr/bin/sqlite3 prints; remove the file, or move it away\n");
}

}  // namespace
}  // namespace adminhost::test
