// Which plug-in files are loaded, and what the log and --check report about the others.

#include "adminhostd/PluginFile.h"
#include "platform/release/Release.h"
#include "tests/support/Program.h"
#include "tests/system/host/Host.h"

#include <fstream>
#include <iterator>

#include <dirent.h>
#include <gmock/gmock.h>
#include <sys/prctl.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;

struct BadFile {
    const char* name;      ///< of the fixture
    const char* expected;  ///< part of the reason
};

const BadFile badFiles[] = {
    {"fixture_other_build",
     " is for \"adminhost interface 0, libstdc++ cxx11\", and this daemon loads plug-ins for \""},
    {"fixture_other_flavour",
     " is for \"" ADMINHOST_BUILD_IDENTITY ", of another flavour\", and this daemon loads plug-ins for \""},
    {"fixture_no_note", " has no build note: it is not a plug-in for this daemon"},
    {"fixture_no_entry_point", " has no entry point adminhost_plugin"},
    {"fixture_null", " has an entry point that returns no plug-in"},
    {"fixture_bad_name", " has the name \"a/b\", which cannot be part of an address"},
    {"fixture_reserved_name", " has the name \"directory\", which cannot be part of an address"},
    {"fixture_bad_command", " describes a command \"echo/two\", which"},
    {"fixture_reserved_command", " describes a command \"history\", which"},
    {"fixture_command_twice",
     " describes a command \"twice\", which cannot be part of an address or is described twice"},
    {"fixture_garbage", " describes its command \"work\" in a form that clients cannot be sent"},
    {"fixture_crashing", " crashed while it was loaded, by signal 6 (Aborted); install it again"},
    {"fixture_bus_error", " crashed while it was loaded, by signal 7 (Bus error); install it again"},
    {"fixture_exiting", " ended its process with status 0 while it was loaded"},
    {"fixture_looping", " did not finish loading in time and was ended"},
};

class PluginLoading : public ::testing::Test {
  protected:
    PluginLoading() {
        std::string path = (fs::temp_directory_path() / "loading.XXXXXX").string();
        EXPECT_NE(::mkdtemp(path.data()), nullptr);
        directory = path;
    }
    ~PluginLoading() override { fs::remove_all(directory); }
    PluginLoading(const PluginLoading&) = delete;
    PluginLoading& operator=(const PluginLoading&) = delete;

    /// Options that name every bad file, and the good one last.
    static std::vector<std::string> all() {
        std::vector<std::string> arguments;
        for (const BadFile& file : badFiles) {
            arguments.insert(arguments.end(), {"--plugin", pluginFile(file.name)});
        }
        arguments.insert(arguments.end(), {"--plugin", pluginFile("fixture_good")});
        return arguments;
    }
    ProgramResult check(const std::vector<std::string>& plugins) const {
        std::vector<std::string> arguments{std::string(BINARY_DIR) + "/bin/adminhostd", "--check", "--socket",
                                           directory / "socket"};
        arguments.insert(arguments.end(), plugins.begin(), plugins.end());
        return runProgram(arguments, Errors::merge);
    }
    /// A copy of the good plug-in, cut to so many bytes.
    std::string cut(std::uintmax_t size) const {
        const fs::path file = directory / "cut.so";
        fs::copy_file(pluginFile("fixture_good"), file, fs::copy_options::overwrite_existing);
        fs::resize_file(file, size);
        return file;
    }

    fs::path directory;
};

/// The descendants of a process whose command line holds the text.
std::vector<std::string> descendantsWith(const std::string& text, pid_t process) {
    std::vector<std::string> found;
    for (const pid_t child : childrenOf(process)) {
        std::ifstream file("/proc/" + std::to_string(child) + "/cmdline");
        const std::string line{std::istreambuf_iterator<char>(file), {}};
        if (line.find(text) != std::string::npos) {
            found.push_back(line);
        }
        const std::vector<std::string> further = descendantsWith(text, child);
        found.insert(found.end(), further.begin(), further.end());
    }
    return found;
}

TEST_F(PluginLoading, CheckNamesEveryBadFileAndWhatIsWrongWithIt) {
    const ProgramResult result = check(all());
    EXPECT_EQ(result.status, 1);
    for (const BadFile& file : badFiles) {
        EXPECT_THAT(result.output, HasSubstr(pluginFile(file.name) + file.expected));
    }
}

TEST_F(PluginLoading, LogNamesEveryBadFileAndTheOthersAreServed) {
    ASSERT_EQ(::prctl(PR_SET_CHILD_SUBREAPER, 1), 0);  // a trial that has lost its parent stays a descendant
    const DaemonProcess daemon({all(), "", {}});
    EXPECT_EQ(daemon.connect().post("/v1/fixture/echo", "{}").status, 200);
    const std::string log = daemon.log();
    for (const BadFile& file : badFiles) {
        EXPECT_THAT(log, HasSubstr("adminhostd: a plug-in is refused: " + pluginFile(file.name) + file.expected));
    }
    EXPECT_THAT(log, HasSubstr("serves with the plug-ins fixture\n"));
    EXPECT_THAT(descendantsWith("adminhostd-worker", ::getpid()), ::testing::SizeIs(1)) << "of the daemon";
    EXPECT_THAT(descendantsWith("--try", ::getpid()), ::testing::IsEmpty()) << "no trial is left";
    ::prctl(PR_SET_CHILD_SUBREAPER, 0);
}

TEST_F(PluginLoading, FileThatIsNotAPluginIsRefused) {
    const std::string missing = directory / "missing.so";
    const std::string program = std::string(BINARY_DIR) + "/bin/adminhostd";
    const std::string text = std::string(SOURCE_DIR) + "/README.md";
    const ProgramResult result = check({"--plugin", missing, "--plugin", program, "--plugin", text});
    EXPECT_EQ(result.status, 1);
    EXPECT_THAT(result.output, HasSubstr(missing + ": No such file or directory; install it or correct its name\n"));
    EXPECT_THAT(result.output, HasSubstr(program + " has no build note: it is not a plug-in for this daemon\n"));
    EXPECT_THAT(result.output, HasSubstr(text + " is not a shared object for this kind of machine\n"));
}

TEST_F(PluginLoading, FileThatIsGivenTwiceIsLoadedOnce) {
    const ProgramResult result =
        check({"--plugin", pluginFile("fixture_good"), "--plugin", pluginFile("fixture_good")});
    EXPECT_THAT(result.output, HasSubstr("a plug-in of the name \"fixture\" is already loaded\n"));
}

TEST_F(PluginLoading, NoCodeOfAPluginForAnotherInterfaceRuns) {
    const fs::path mark = directory / "mark";
    const DaemonProcess daemon({{"--plugin", pluginFile("fixture_other_build"), "--plugin",
                                 pluginFile("fixture_other_flavour"), "--plugin", pluginFile("fixture_good")},
                                "",
                                {"ADMINHOST_TEST_MARK=" + mark.string()}});
    EXPECT_EQ(daemon.connect().post("/v1/fixture/echo", "{}").status, 200);
    EXPECT_FALSE(fs::exists(mark));
}

TEST_F(PluginLoading, PluginOfAnotherReleaseIsLoadedIfItsInterfaceIsTheSame) {
    const auto loaded = loadPlugin(DiskPath(pluginFile("fixture_good")));
    ASSERT_TRUE(loaded);
    EXPECT_NE(loaded->version, ADMINHOST_RELEASE);
    EXPECT_EQ(std::string_view(ADMINHOST_BUILD_IDENTITY).find(ADMINHOST_RELEASE), std::string_view::npos);
}

TEST_F(PluginLoading, TruncatedFileIsRefusedBeforeItRuns) {
    // The first pages hold the note; the code comes after them.
    const ProgramResult result = check({"--plugin", cut(8192), "--plugin", pluginFile("fixture_throwing")});
    EXPECT_THAT(result.output, HasSubstr("cut.so is truncated; install it again\n"));
}

TEST_F(PluginLoading, FileThatIsCutAtAnyLengthNeverEndsTheWorker) {
    const auto whole = fs::file_size(pluginFile("fixture_good"));
    for (std::uintmax_t part = 0; part < 16; ++part) {
        const DaemonProcess daemon(
            {{"--plugin", cut(whole * part / 16), "--plugin", pluginFile("fixture_throwing")}, "", {}});
        EXPECT_EQ(daemon.connect().post("/v1/throwing/work", "{}").status, 200) << part;
        const bool served = daemon.connect().post("/v1/fixture/echo", "{}").status == 200;
        const bool refused = std::string::npos !=
                             daemon.log().find("adminhostd: a plug-in is refused: " + (directory / "cut.so").string());
        EXPECT_NE(served, refused) << part;
        EXPECT_EQ(daemon.log().find("the worker was killed"), std::string::npos) << daemon.log();
    }
}

struct Throwing {
    const char* function;
    int status;        ///< of the command; 404 if the plug-in is refused
    const char* line;  ///< part of the log
};

class ThrowingFunction : public ::testing::TestWithParam<Throwing> {};

TEST_P(ThrowingFunction, CostsItsOwnCallAndIsLogged) {
    const DaemonProcess daemon({{"--plugin", pluginFile("fixture_throwing"), "--plugin", pluginFile("fixture_good")},
                                "",
                                {std::string("ADMINHOST_TEST_THROW=") + GetParam().function}});
    const pid_t worker = daemon.workerPid();
    EXPECT_EQ(daemon.connect().post("/v1/throwing/work", "{}").status, GetParam().status);
    static_cast<void>(daemon.connect().get("/v1/throwing/history"));
    EXPECT_EQ(daemon.connect().get("/v1/logs").status, 200) << "those of the other plug-ins";
    EXPECT_TRUE(daemon.waitForLog(GetParam().line)) << daemon.log();
    EXPECT_TRUE(daemon.waitForLog(std::string(GetParam().function) + " throws")) << daemon.log();
    EXPECT_EQ(daemon.connect().post("/v1/fixture/echo", "{}").status, 200);
    EXPECT_EQ(daemon.workerPid(), worker) << "the worker lives on";
}

INSTANTIATE_TEST_SUITE_P(
    EachOne, ThrowingFunction,
    ::testing::Values(
        Throwing{"constructor", 404, "a plug-in is refused"}, Throwing{"name", 404, "a plug-in is refused"},
        Throwing{"version", 404, "a plug-in is refused"}, Throwing{"commands", 404, "a plug-in is refused"},
        Throwing{"configure", 404, "a plug-in is refused"}, Throwing{"toolFiles", 404, "a plug-in is refused"},
        Throwing{"probe", 503, "adminhostd: throwing/work needs \"thing\": the plug-in failed: "},
        Throwing{"check", 500, "adminhostd: throwing/work failed: "},
        Throwing{"perform", 500, "adminhostd: throwing/work failed: "},
        Throwing{"revision", 200, "adminhostd: throwing failed to give its revision: "},
        Throwing{"settingsFiles", 200, "could not be kept: "}, Throwing{"settingKeys", 200, "could not be kept: "},
        Throwing{"settings", 200, "could not be kept: "},
        Throwing{"leftovers", 200, "failed to name what interrupted operations left: "},
        Throwing{"logs", 200, "adminhostd: the plug-in throwing failed to name its log files: "}),
    [](const auto& about) { return about.param.function; });

}  // namespace
}  // namespace adminhost::test
