// The manual pages, compared with the programs: options, verbs, exit statuses and keys of the configuration.

#include "tests/support/Program.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <regex>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace adminhost::test {
namespace {

using Words = std::set<std::string>;

std::string contentOf(const std::string& file) {
    std::ostringstream text;
    text << std::ifstream(std::string(SOURCE_DIR) + '/' + file).rdbuf();
    return text.str();
}

/// The first group of each match.
Words matches(const std::string& text, const char* pattern) {
    const std::regex expression(pattern);
    Words all;
    for (auto match = std::sregex_iterator(text.begin(), text.end(), expression); match != std::sregex_iterator();
         ++match) {
        all.insert((*match)[1]);
    }
    return all;
}

/// What a program of this build prints.
std::string outputOf(const std::string& program, const std::string& words) {
    std::vector<std::string> command{std::string(BINARY_DIR) + "/bin/" + program};
    std::istringstream stream(words);
    for (std::string word; stream >> word;) {
        command.push_back(word);
    }
    const ProgramResult result = runProgram(command, Errors::merge, "");
    EXPECT_EQ(result.status, 0) << words << result.output;
    return result.output;
}

/// The options that a help names at the beginning of a line.
Words optionsOf(const std::string& help) {
    return matches(help, "\n  (?:-[a-z], ?)?(--[a-z-]+)");
}

/// The verbs of the command line, of one or two words.
Words verbs() {
    return matches(outputOf("adminhostctl", "help"), "\n  ([a-z][a-zA-Z]*(?: [a-z]+)?)(?= |\n)");
}

/// The options that a page describes in lists.
Words optionsIn(const std::string& page) {
    Words all;
    std::istringstream lines(contentOf("packaging/man/" + page));
    for (std::string line; std::getline(lines, line);) {
        if (line.starts_with(".It Fl ")) {
            for (const std::string& name : matches(line, "Fl Fl ([a-z-]+)")) {
                all.insert("--" + name);
            }
        }
    }
    return all;
}

TEST(Manual, DescribesEveryOptionOfTheCommandLineAndNoOther) {
    Words options = optionsOf(outputOf("adminhostctl", "--help"));
    EXPECT_GT(options.size(), 5U);
    options.insert("--file");  // of every command: named by the help of a command, which asks the daemon
    for (const std::string& verb : verbs()) {
        options.merge(optionsOf(outputOf("adminhostctl", verb + " --help")));
    }
    EXPECT_EQ(optionsIn("adminhostctl.1"), options);
}

TEST(Manual, DescribesEveryOptionOfTheDaemonAndNoOther) {
    const Words options = optionsOf(outputOf("adminhostd", "--help"));
    EXPECT_GT(options.size(), 5U);
    EXPECT_EQ(optionsIn("adminhostd.8"), options);
}

TEST(Manual, DescribesEveryVerbAndNoOther) {
    EXPECT_GT(verbs().size(), 20U);
    EXPECT_EQ(matches(contentOf("packaging/man/adminhostctl.1"),
                      "\n\\.It Cm ([a-zA-Z]+(?: (?!Ar|Oo|Op|Cm)[a-z]+)?)(?= (?:Ar|Oo|Op|Cm)|\n)"),
              verbs());
}

TEST(Manual, DescribesEveryExitStatusOfTheCommandLine) {
    std::string statuses = contentOf("adminhostctl/Failure.h");
    statuses = statuses.substr(0, statuses.find("// Of \"doctor\""));
    std::string page = contentOf("packaging/man/adminhostctl.1");
    page = page.substr(page.find(".Sh EXIT STATUS"));
    const Words numbers = matches(statuses, "\n    [a-zA-Z]+ = ([0-9]+)");
    EXPECT_GT(numbers.size(), 5U);
    EXPECT_EQ(matches(page, "\n\\.It ([0-9]+)\n"), numbers);
}

class ConfigurationManual : public ::testing::Test {
  protected:
    ConfigurationManual() {
        std::string pattern = (std::filesystem::temp_directory_path() / "manual.XXXXXX").string();
        directory = ::mkdtemp(pattern.data());
    }
    ~ConfigurationManual() override { std::filesystem::remove_all(directory); }

    /// What the daemon's check reports about a configuration.
    [[nodiscard]] std::string checked(const std::string& configuration) const {
        std::ofstream(directory + "/adminhostd.toml") << configuration;
        return runProgram({std::string(BINARY_DIR) + "/bin/adminhostd", "--root", directory, "--config",
                           directory + "/adminhostd.toml", "--check"},
                          Errors::merge, "")
            .output;
    }
    /// The keys that the daemon knows where this one is unknown.
    [[nodiscard]] Words knownKeys(const std::string& configuration) const {
        const std::string mark = "known keys: ";
        const std::string report = checked(configuration);
        const std::size_t at = report.find(mark);
        EXPECT_NE(at, std::string::npos) << report;
        return at == std::string::npos ? Words() : matches(report.substr(at + mark.size() - 1), "[ ,]([a-z_]+)");
    }

    const std::string page = contentOf("packaging/man/adminhostd.toml.5");
    std::string directory;
};

TEST_F(ConfigurationManual, DescribesEveryKeyAndNoOther) {
    Words keys = knownKeys("no_such_key = 1\n");
    EXPECT_GT(keys.size(), 10U);
    keys.erase("directory");
    keys.erase("permission");
    keys.merge(knownKeys("[[permission]]\nno_such_key = 1\n"));
    for (const std::string& key : knownKeys("[directory]\nno_such_key = 1\n")) {
        if (key != "node") {
            keys.insert("directory." + key);
        }
    }
    for (const std::string& key : knownKeys("[[directory.node]]\nno_such_key = 1\n")) {
        if (key != "map") {
            keys.insert(key);
        }
    }
    for (const std::string& key : knownKeys("[[directory.node]]\n[directory.node.map]\nno_such_key = 1\n")) {
        keys.insert("map." + key);
    }
    Words described;
    std::istringstream lines(page);
    for (std::string line; std::getline(lines, line);) {
        if (line.starts_with(".It Va ")) {
            described.merge(matches(line.substr(6), "[ ,]([a-z_.]+)"));
        }
    }
    EXPECT_EQ(described, keys);
}

TEST_F(ConfigurationManual, ExamplesAreAccepted) {
    const std::string begin = ".Bd -literal -offset indent\n";
    std::size_t count = 0;
    for (std::size_t at = page.find(begin); at != std::string::npos; at = page.find(begin, at + 1), ++count) {
        const std::size_t first = at + begin.size();
        const std::string example = page.substr(first, page.find(".Ed", first) - first);
        EXPECT_THAT(checked(example), testing::Not(testing::HasSubstr("adminhostd.toml, line "))) << example;
    }
    EXPECT_GE(count, 2U);
}

}  // namespace
}  // namespace adminhost::test
