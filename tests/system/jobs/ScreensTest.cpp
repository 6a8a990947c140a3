// The screens of docs/adminhostctl.md are what the program prints.

#include "tests/system/jobs/Jobs.h"

#include <fstream>
#include <regex>

namespace adminhost::test {
namespace {

constexpr const char* page = SOURCE_DIR "/docs/adminhostctl.md";
constexpr const char* section = "\n## Screens\n";

/// A command of the page, and what follows it there.
struct Screen {
    std::string command;
    std::string output;
};

/// The section of the page that holds the screens.
std::string screensOfPage() {
    const std::string text = contentOf(page);
    const std::size_t begin = text.find(section) + 1;
    return text.substr(begin, text.find("\n## ", begin) + 1 - begin);
}

std::vector<Screen> screensIn(const std::string& text) {
    const std::string indent(4, ' ');
    std::vector<Screen> screens;
    std::string blank;
    for (const std::string& line : linesOf(text)) {
        if (line.starts_with(indent + "$ ")) {
            screens.push_back({line.substr(indent.size() + 2), {}});
            blank.clear();
        } else if (line.empty()) {
            blank += '\n';
        } else if (line.starts_with(indent) && !screens.empty()) {
            screens.back().output += blank + line.substr(indent.size()) + '\n';
            blank.clear();
        }
    }
    return screens;
}

/// Without what differs from run to run: dates, ages, UUIDs, accounts, and the widths of columns with them.
std::string withoutAccidents(std::string text) {
    for (const auto& [pattern, word] : std::initializer_list<std::pair<const char*, const char*>>{
             {"[0-9]{1,2} [A-Z][a-z]{2} [0-9]{4}, [0-9:]{5,8}( [A-Z]{3,4})?", "DATE"},
             {"[0-9]+ (second|minute)s? ago, (DATE|[0-9:]{8})", "AGE"},
             {"[0-9A-F]{8}(-[0-9A-F]{4}){3}-[0-9A-F]{12}", "UUID"},
             {"[^ ]+ \\(uid [0-9]+\\)(, as [^ ]+ \\(uid [0-9]+\\))?", "WHO"},
             {" {2,}", "  "}}) {
        text = std::regex_replace(text, std::regex(pattern), word);
    }
    return text;
}

TEST(Screens, PageShowsWhatTheProgramPrints) {
    const SampleRoot root;
    const DaemonProcess daemon(
        {{"--root", root.path(), "--plugin", BINARY_DIR "/lib/adminhost_lumio.so"}, {}, {}, true, {}, 0, -1});
    std::ofstream(root.directory() + "/new-password") << "another password\n";
    std::ofstream(root.directory() + "/host2.toml")
        << "[settings]\nserver_host = \"media2.example.org\"\nserver_port = 8171\n";
    std::string actual = screensOfPage();
    std::vector<Screen> screens = screensIn(actual);
    EXPECT_GE(screens.size(), 12U);
    for (Screen& screen : screens) {
        // The failure that the page explains.
        const bool fails = screen.command == "adminhostctl camera allow 'Studio B' carla";
        if (fails) {
            root.setSwitch("lumioconfig.error", "cannot connect to the service's database");
            root.setSwitch("lumioconfig.exit", "3");
        }
        const std::string script = "exec 2>&1; cd '" + root.directory() + "'; adminhostctl() { " + ctlProgram +
                                   " --socket '" + daemon.socket() + "' \"$@\"; }\n" + screen.command + "\n";
        const Ran ran = runBare({"COLUMNS=200", "PATH=/usr/bin:/bin", "TZ=UTC", "/bin/sh", "-c", script});
        if (fails) {
            root.clearSwitches();
        }
        EXPECT_EQ(withoutAccidents(ran.out), withoutAccidents(screen.output)) << screen.command;
        std::string block = "    $ " + screen.command + '\n';
        const std::size_t at = actual.find(block);
        std::string shown = block;
        for (const std::string& line : linesOf(ran.out)) {
            shown += line.empty() ? "\n" : "    " + line + '\n';
        }
        std::string old = block;
        for (const std::string& line : linesOf(screen.output)) {
            old += line.empty() ? "\n" : "    " + line + '\n';
        }
        actual.replace(at, old.size(), shown);
    }
    if (HasFailure()) {
        std::ofstream(BINARY_DIR "/screens.md") << actual;
        ADD_FAILURE() << "The section as the program prints it is in screens.md in the build directory.";
    }
}

}  // namespace
}  // namespace adminhost::test
