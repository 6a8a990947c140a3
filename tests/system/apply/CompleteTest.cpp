// "complete": what can stand at a place of a command line, as all completions ask for it.

#include "tests/system/apply/ControlledService.h"

#include <chrono>
#include <filesystem>

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::IsSupersetOf;
using testing::Not;

class Complete : public ControlledService {
  protected:
    /// The candidates for the last word. The bound of 100 ms is for people, not for a busy machine.
    [[nodiscard]] std::vector<std::string> candidates(std::vector<std::string> words) const {
        words.insert(words.begin(), {"complete", "--", "--socket", daemon.socket(), "--timeout", "60"});
        const ProgramResult result = ctl(words);
        EXPECT_EQ(result.status, 0) << result.output;
        return linesOf(result.output);
    }
    [[nodiscard]] static std::vector<std::string> linesOf(const std::string& text) {
        std::vector<std::string> all;
        std::istringstream lines(text);
        for (std::string line; std::getline(lines, line);) {
            all.push_back(line);
        }
        return all;
    }
};

TEST_F(Complete, VerbsAndCommandsAreOffered) {
    EXPECT_THAT(candidates({"s"}), AllOf(IsSupersetOf({"status", "settings", "start", "stop", "startService"}),
                                         Not(Contains("complete")), Not(Contains("camera"))));
    EXPECT_THAT(candidates({"settings", ""}), ElementsAre("get", "set"));
    EXPECT_THAT(candidates({"help", "cam"}), ElementsAre("camera"));
    EXPECT_THAT(candidates({"nothing", ""}), IsEmpty());
}

TEST_F(Complete, NamesComeFromTheDaemon) {
    EXPECT_THAT(candidates({"camera", "show", "Lecture"}),
                ElementsAre("Lecture hall 1", "Lecture hall 2", "Lecture hall 3"));
    EXPECT_THAT(candidates({"camera", "allow", "Roof", "an"}), ElementsAre("anna"));
    EXPECT_THAT(candidates({"camera", "access", "Roof", ""}), ElementsAre("on", "off"));
    EXPECT_THAT(candidates({"--languages", "de", "workflow", "show", "Im"}), ElementsAre("Im Katalog ver\xC3\xB6"
                                                                                         "ffentlichen"));
    EXPECT_THAT(candidates({"property", "remove", "mail_"}), ElementsAre("mail_sender", "mail_password"));
    EXPECT_THAT(candidates({"access", "lec"}), ElementsAre("lecturers"));
    EXPECT_THAT(candidates({"camera", "allow", "Roof", "--group", "s"}),
                AllOf(Contains("studio"), Not(Contains("stefan"))));
    EXPECT_THAT(candidates({"whois", "an"}), ElementsAre("anna"));
    ASSERT_EQ(ctl({"settings", "set", "server_port", "8180"}).status, 0);
    ASSERT_EQ(ctl({"property", "set", "watermark", "left"}).status, 0);
    EXPECT_THAT(candidates({"rollback", ""}), ElementsAre("r1", "1"));
}

TEST_F(Complete, KeysAndValuesAreOffered) {
    EXPECT_THAT(candidates({"settings", "set", "server_"}), ElementsAre("server_host", "server_port"));
    EXPECT_THAT(candidates({"settings", "get", "web_"}), ElementsAre("web_app_url"));
    EXPECT_THAT(candidates({"settings", "set", "sorvane_capture_web_enabled", ""}), ElementsAre("yes", "no"));
    EXPECT_THAT(candidates({"readSettings", "optionalArguments.variant=getC"}),
                ElementsAre("optionalArguments.variant=getConfig", "optionalArguments.variant=getCameras"));
    EXPECT_THAT(candidates({"writeSettings", "configuration.nimbo_client_p"}),
                ElementsAre("configuration.nimbo_client_password@"));
}

TEST_F(Complete, OptionsAreThoseOfTheVerb) {
    EXPECT_THAT(candidates({"camera", "list", "--"}),
                AllOf(IsSupersetOf({"--match", "--names", "--format", "--help"}), Not(Contains("--validate"))));
    EXPECT_THAT(candidates({"--format", "j"}), ElementsAre("json"));
}

TEST_F(Complete, FilesAreOfferedWhereAFileBelongs) {
    (void)file("host one.toml", "");
    const std::string beginning = root.directory() + "/host";
    EXPECT_THAT(candidates({"plan", beginning}), ElementsAre(root.directory() + "/host one.toml"));
    EXPECT_THAT(candidates({"settings", "set", "server_host", "@" + beginning}),
                ElementsAre("@" + root.directory() + "/host one.toml"));
    EXPECT_THAT(candidates({"writeSettings", "--file", beginning}), ElementsAre(root.directory() + "/host one.toml"));
}

TEST_F(Complete, NameThatATerminalWouldActOnIsNotOffered) {
    root.sql("update cameras set name = 'Roof' || char(27) || '[31m' where name = 'Roof'");
    EXPECT_THAT(candidates({"camera", "show", "Roof"}), IsEmpty());
}

TEST_F(Complete, NamesThatTheServiceReadsTooSlowlyAreLeftOut) {
    const std::vector<std::string> line{"complete", "--", "--socket", daemon.socket(), "camera", "show", "Ro"};
    const std::string tool = root.disk("/usr/bin/sqlite3");
    std::filesystem::remove(tool);
    std::ofstream(tool) << "#!/bin/sh\n/bin/sleep 0.5\nexec /usr/bin/sqlite3 \"$@\"\n";
    std::filesystem::permissions(tool, std::filesystem::perms(0755));
    const ProgramResult slow = ctl(line);
    EXPECT_EQ(slow.status, 0);
    EXPECT_EQ(slow.output, "") << "0.5 s are more than the bound of 100 ms";
    EXPECT_THAT(candidates({"camera", "show", "Ro"}), ElementsAre("Roof")) << "with a bound of 60 s";
}

TEST_F(Complete, DaemonThatDoesNotAnswerIsLeftOutAfterTheBound) {
    // A socket that accepts connections and never answers.
    const std::string path = root.directory() + "/silent";
    const int listener = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    ASSERT_LT(path.size(), sizeof address.sun_path);
    path.copy(address.sun_path, path.size());
    ASSERT_EQ(::bind(listener, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    ASSERT_EQ(::listen(listener, 1), 0);
    const auto start = std::chrono::steady_clock::now();
    const ProgramResult result = ctl({"complete", "--", "--socket", path, "st"});
    const auto duration = std::chrono::steady_clock::now() - start;
    ::close(listener);
    EXPECT_EQ(result.status, 0);
    EXPECT_THAT(linesOf(result.output), ElementsAre("status", "start", "stop")) << "what needs no daemon";
    EXPECT_LT(duration, std::chrono::seconds(5)) << "100 ms, and room for a busy machine";
    const ProgramResult without = ctl({"complete", "--", "--socket", "/nowhere/socket", "camera", "show", ""});
    EXPECT_EQ(without.status, 0);
    EXPECT_EQ(without.output, "");
}

}  // namespace
}  // namespace adminhost::test
