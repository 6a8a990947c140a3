// Every kind of mistake, and the exit status that the manual page has for it.

#include "platform/release/Release.h"
#include "tests/support/OnTerminal.h"
#include "tests/system/apply/OvertakenService.h"

#include <csignal>
#include <set>
#include <thread>

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

namespace fs = std::filesystem;
using testing::HasSubstr;
using Words = std::vector<std::string>;

/// A row of the table: the status, and the verb that it belongs to (empty for all others).
using Row = std::pair<int, std::string>;

std::set<Row> tableOf(const std::string& page) {
    std::set<Row> rows;
    const std::size_t begin = page.find("\n.Sh EXIT STATUS\n");
    std::istringstream lines(begin == std::string::npos ? ""
                                                        : page.substr(begin, page.find("\n.Sh ", begin + 1) - begin));
    for (std::string line; std::getline(lines, line);) {
        std::istringstream words(line);
        std::string macro;
        int status = 0;
        if (words >> macro >> status && macro == ".It") {
            std::string verb;
            words >> macro >> macro >> verb;  // "Pq Cm VERB"
            rows.emplace(status, verb);
        }
    }
    return rows;
}

/// A daemon that replies to every request with the same few documents.
class CannedDaemon {
  public:
    CannedDaemon(std::string path, const std::string& checkState) : _path(std::move(path)) {
        _doctor = R"({"checks":[{"name":"disk","state":")" + checkState + R"(","found":"something","fix":""}]})";
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        _path.copy(address.sun_path, sizeof address.sun_path - 1);
        EXPECT_EQ(::bind(_listener, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
        EXPECT_EQ(::listen(_listener, 8), 0);
        _thread = std::thread([this] { serve(); });
    }
    ~CannedDaemon() {
        ::shutdown(_listener, SHUT_RDWR);
        _thread.join();
        ::close(_listener);
        fs::remove(_path);
    }
    CannedDaemon(const CannedDaemon&) = delete;
    CannedDaemon& operator=(const CannedDaemon&) = delete;

  private:
    void serve() const {
        for (int client = -1; (client = ::accept4(_listener, nullptr, nullptr, SOCK_CLOEXEC)) >= 0; ::close(client)) {
            std::string head;
            char byte = 0;
            while (head.find("\r\n\r\n") == std::string::npos && ::read(client, &byte, 1) == 1) {
                head.push_back(byte);
            }
            const std::string body =
                head.find(" /v1/doctor ") != std::string::npos ? _doctor : R"({"release":")" ADMINHOST_RELEASE R"("})";
            const std::string reply =
                "HTTP/1.1 200 OK\r\nContent-Type: application/json\r\nConnection: close\r\n"
                "Content-Length: " +
                std::to_string(body.size()) + "\r\n\r\n" + body;
            EXPECT_EQ(::write(client, reply.data(), reply.size()), static_cast<ssize_t>(reply.size()));
        }
    }

    std::string _path;
    std::string _doctor;
    int _listener = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    std::thread _thread;
};

class ExitStatuses : public OvertakenService {
  protected:
    ~ExitStatuses() override { static_cast<void>(ctl({"stop"})); }

    /// Every status that occurs must be in the table, in a row of the verb if it has its own.
    void expect(int status, const std::string& verb, const ProgramResult& result) {
        EXPECT_EQ(result.status, status) << result.output;
        const bool isOwn = table.contains({result.status, verb});
        EXPECT_TRUE(isOwn || table.contains({result.status, ""})) << result.status << " is not in the table";
        reached.insert(isOwn ? Row{result.status, verb} : Row{result.status, ""});
    }
    void expect(int status, const Words& words) { expect(status, words.front(), ctl(words)); }
    [[nodiscard]] static ProgramResult at(const std::string& socket, const Words& words) {
        Words all{std::string(BINARY_DIR) + "/bin/adminhostctl", "--socket", socket};
        all.insert(all.end(), words.begin(), words.end());
        return runProgram(all, Errors::merge);
    }

    void wrongUsage() {
        const std::string port = file("port.toml", "[settings]\nserver_port = 8180\n");
        for (const Words& words : {
                 Words{"nothing"},                                   // neither a verb nor a command
                 {"camera"},                                         // a second word is missing
                 {"camera", "dance"},                                //
                 {"settings", "get", "--unknown-option"},            //
                 {"settings", "get", "--group"},                     // an option of other verbs
                 {"settings", "set"},                                // too few arguments
                 {"export", "a", "b"},                               // too many
                 {"--timeout", "0", "daemon"},                       //
                 {"--format", "yaml", "daemon"},                     //
                 {"settings", "get", "no_such"},                     // unknown names
                 {"camera", "show", "no such"},                      //
                 {"camera", "allow", "Roof", "nobody-here"},         //
                 {"camera", "allow", "Roof", "studio"},              // a group without --group
                 {"rollback", "99"},                                 //
                 {"getCameras", "no_such_key=1"},                    //
                 {"history", "--since", "soon"},                     //
                 {"settings", "set", "server_port", "x"},            // values
                 {"settings", "set", "server_port", "99999"},        //
                 {"settings", "set", "http_auth_type", "magic"},     //
                 {"camera", "access", "Roof", "perhaps"},            //
                 {"settings", "set", "nimbo_client_password", "p"},  // a secret on the command line
                 {"settings", "get", "nimbo_client_password"},       //
                 {"settings", "set", "nimbo_client_password", "@/dev/null"},
                 {"plan", "/nowhere/file.toml"},                // files
                 {"plan", file("broken.toml", "[settings\n")},  //
                 {"plan", port, "--only", "no_such"},           //
                 {"apply", file("people.toml", "[cameras.Roof]\nusers = [\"nobody-here\"]\n")},
                 {"export", "/nowhere/file.toml"},  // output
             }) {
            SCOPED_TRACE(testing::PrintToString(words));
            expect(2, words);
        }
        expect(2, "status", ctl({"status", "too", "many"}));
        const std::string full = "exec '" + std::string(BINARY_DIR) + "/bin/adminhostctl' --socket '" +
                                 daemon.socket() + "' settings get > /dev/full";
        expect(2, "settings", runProgram({"/bin/sh", "-c", full}, Errors::merge));
    }

    void failuresOfTheService() {
        expect(1, {"settings", "set", "shared_filesystem", "relative/path"});
        expect(1, {"plan", file("path.toml", "[settings]\nshared_filesystem = \"relative/path\"\n")});
        root.setSwitch("lumioconfig.exit", "3");
        expect(1, {"camera", "allow", "Roof", "ben"});
        expect(1, {"camera", "remove", "Roof"});
        root.setSwitch("setup_preferences.exit", "3");
        expect(1, {"readSettings"});
        root.clearSwitches();
        OnTerminal terminal(Words{std::string(BINARY_DIR) + "/bin/adminhostctl", "--socket", daemon.socket(), "camera",
                                  "remove", "Roof"});
        terminal.showsUntil("[y/N] ");
        terminal.type("n\n");
        expect(1, "camera", {WEXITSTATUS(terminal.wait()), ""});
    }

    void daemonThatIsNotThere() {
        expect(3, "settings", at("/nowhere/socket", {"settings", "get"}));
        expect(3, "settings", at("/nowhere/socket", {"settings", "set", "server_port", "1"}));
        expect(4, "status", at("/nowhere/socket", {"status"}));
        expect(3, "doctor", at("/nowhere/socket", {"doctor"}));
        root.hold("setup_preferences");
        expect(3, "settings", ctl({"--timeout", "0.3", "settings", "get"}));
        root.clearSwitches();
    }

    void accountThatIsNotPermitted() {
        Words words{std::string(BINARY_DIR) + "/bin/adminhostctl", "--socket", daemon.socket(), "daemon"};
        const auto before = fs::status(daemon.socket()).permissions();
        if (::geteuid() == 0) {
            // From a copy: the directories above the build may be closed to others.
            fs::copy_file(words.front(), daemon.directory() / "adminhostctl");
            fs::permissions(daemon.directory(), fs::perms(0755));
            fs::permissions(daemon.socket(), fs::perms(0666));
            words = {"/usr/bin/env",
                     "-C",
                     daemon.directory(),
                     "setpriv",
                     "--reuid=65534",
                     "--regid=65534",
                     "--clear-groups",
                     "./adminhostctl",
                     "--socket",
                     "socket",
                     "daemon"};
        } else {
            fs::permissions(daemon.socket(), fs::perms(0));
        }
        expect(4, "daemon", runProgram(words, Errors::merge));
        fs::permissions(daemon.socket(), before);
    }

    void differences() {
        const std::string port = file("port.toml", "[settings]\nserver_port = 8180\n");
        expect(5, {"plan", port, "--exit-code"});
        expect(5, {"apply", port, "--exit-code"});
        expect(0, {"apply", port, "--exit-code"});
    }

    void otherClient() {
        expect(7, "settings",
               overtaken({"settings", "set", "server_port", "8190"}, R"({"configuration":{"server_port":8191}})"));
    }

    void lostAnswer() {
        holdWrite();
        std::future<ProgramResult> apply = std::async(std::launch::async, [&] {
            return ctl({"apply", file("other.toml", "[settings]\nserver_port = 8200\n")});
        });
        waitForWrite();
        root.sql("alter table access_control_entries rename to gone");
        ::kill(daemon.workerPid(), SIGKILL);
        expect(6, "apply", apply.get());
        root.clearSwitches();
        root.sql("alter table gone rename to access_control_entries");
    }

    void machineThatIsNotThere() {
        expect(8, "daemon",
               runProgram({"/usr/bin/env", "PATH=/nowhere", std::string(BINARY_DIR) + "/bin/adminhostctl", "--host",
                           "studio", "daemon"},
                          Errors::merge));
    }

    void stateOfTheService() {
        expect(3, {"status"});
        expect(0, {"start"});
        expect(0, {"status"});
        root.write("/var/lumio/server/.lumioserverd_startup_status.plist",
                   "<?xml version=\"1.0\"?><plist version=\"1.0\"><dict><key>error</key><integer>69</integer></dict>"
                   "</plist>");
        expect(1, {"status"});
        expect(0, {"stop"});
    }

    void health() {
        const std::string socket = daemon.directory() / "canned";
        for (const auto& [state, status] : {std::pair{"ok", 0}, {"warning", 1}, {"failure", 2}}) {
            const CannedDaemon canned(socket, state);
            expect(status, "doctor", at(socket, {"doctor"}));
        }
    }

    const std::set<Row> table = tableOf(read(SOURCE_DIR "/packaging/man/adminhostctl.1"));
    std::set<Row> reached;
};

TEST_F(ExitStatuses, EveryMistakeHasItsRowInTheManualPageAndEveryRowIsReached) {
    ASSERT_GE(table.size(), 8U) << "the table is read";
    expect(0, {"settings", "get"});
    expect(0, {"help"});
    wrongUsage();
    failuresOfTheService();
    daemonThatIsNotThere();
    accountThatIsNotPermitted();
    differences();
    otherClient();
    lostAnswer();
    machineThatIsNotThere();
    stateOfTheService();
    health();
    EXPECT_EQ(reached, table);
}

}  // namespace
}  // namespace adminhost::test
