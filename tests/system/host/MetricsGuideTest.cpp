// docs/metrics.md: its table and its line for the node exporter, compared with the daemon.

#include "tests/support/Program.h"
#include "tests/support/PrometheusText.h"
#include "tests/system/host/Host.h"

#include <csignal>
#include <filesystem>
#include <fstream>
#include <map>
#include <set>
#include <sstream>
#include <string>
#include <vector>

namespace adminhost::test {
namespace {

struct Described {
    std::string type;
    std::set<std::string> labels;
    std::string meaning;

    bool operator==(const Described&) const = default;
};

void PrintTo(const Described& one, std::ostream* out) {
    *out << one.type << " {";
    for (const std::string& label : one.labels) {
        *out << label << ' ';
    }
    *out << "} " << one.meaning;
}

std::vector<std::string> linesOf(const std::string& text) {
    std::vector<std::string> lines;
    std::istringstream stream(text);
    for (std::string line; std::getline(stream, line);) {
        lines.push_back(line);
    }
    return lines;
}

std::string guide() {
    std::ostringstream text;
    text << std::ifstream(std::string(SOURCE_DIR) + "/docs/metrics.md").rdbuf();
    return text.str();
}

/// The texts between backticks.
std::set<std::string> quotedIn(const std::string& cell) {
    std::set<std::string> all;
    for (std::size_t begin = cell.find('`'); begin != std::string::npos; begin = cell.find('`', begin)) {
        const std::size_t end = cell.find('`', begin + 1);
        all.insert(cell.substr(begin + 1, end - begin - 1));
        begin = end + 1;
    }
    return all;
}

std::map<std::string, Described> guideTable() {
    std::map<std::string, Described> table;
    for (const std::string& line : linesOf(guide())) {
        if (!line.starts_with("| `")) {
            continue;
        }
        std::vector<std::string> cells;
        std::istringstream stream(line.substr(1));
        for (std::string cell; std::getline(stream, cell, '|');) {
            const std::size_t begin = cell.find_first_not_of(' ');
            cells.push_back(begin == std::string::npos ? ""
                                                       : cell.substr(begin, cell.find_last_not_of(' ') - begin + 1));
        }
        EXPECT_EQ(cells.size(), 4U) << line;
        cells.resize(4);
        table[*quotedIn(cells[0]).begin()] = {cells[1], quotedIn(cells[2]), cells[3]};
    }
    return table;
}

class MetricsGuide : public ::testing::Test {
  protected:
    DaemonProcess daemon{withFixture()};
};

TEST_F(MetricsGuide, TableNamesEveryMetricWithTypeLabelsAndMeaning) {
    UnixHttp client = daemon.connect();
    EXPECT_EQ(client.post("/v1/fixture/tool", R"({"seconds": 0})").status, 200);
    EXPECT_EQ(client.post("/v1/fixture/tool?check=1", R"({"seconds": 0})").status, 200);
    const std::string body = client.get("/v1/metrics").body;
    const PrometheusText text = parsePrometheusText(body);
    std::map<std::string, Described> served;
    for (const auto& [name, type] : text.types) {
        served[name].type = type;
    }
    for (const auto& [name, samples] : text.samples) {
        std::string family = name;
        for (const std::string suffix : {"_bucket", "_sum", "_count"}) {
            const std::string without = name.substr(0, name.size() - std::min(suffix.size(), name.size()));
            family = name.ends_with(suffix) && text.types.contains(without) ? without : family;
        }
        for (const auto& [labels, value] : samples) {
            for (const auto& [label, content] : labels) {
                served[family].labels.insert(label);
            }
        }
    }
    for (const std::string& line : linesOf(body)) {
        const std::string help = "# HELP ";
        if (line.starts_with(help)) {
            const std::size_t blank = line.find(' ', help.size());
            served[line.substr(help.size(), blank - help.size())].meaning = line.substr(blank + 1);
        }
    }
    EXPECT_GT(served.size(), 5U);
    EXPECT_EQ(guideTable(), served);
}

TEST_F(MetricsGuide, LineForTheNodeExporterReplacesTheFileOnlyByAWholeOne) {
    const std::string folder = daemon.directory() / "textfile";
    std::filesystem::create_directory(folder);
    std::string command;
    for (const std::string& line : linesOf(guide())) {
        command = line.starts_with("    curl ") ? line : command;
    }
    for (const auto& [there, here] : {std::pair<std::string, std::string>{"/var/lib/prometheus/node-exporter", folder},
                                      {"/run/adminhostd/adminhostd.sock", daemon.socket()}}) {
        ASSERT_NE(command.find(there), std::string::npos) << command;
        for (std::size_t at = 0; (at = command.find(there, at)) != std::string::npos; at += here.size()) {
            command.replace(at, there.size(), here);
        }
    }
    const std::string file = folder + "/adminhost.prom";
    const ProgramResult written = runProgram({"sh", "-c", command}, Errors::merge, "");
    EXPECT_EQ(written.status, 0) << written.output;
    const auto content = [&] {
        std::ostringstream text;
        text << std::ifstream(file).rdbuf();
        return text.str();
    };
    const std::string before = content();
    EXPECT_EQ(parsePrometheusText(before).at("adminhost_worker_starts_total"), 1);
    EXPECT_FALSE(std::filesystem::exists(file + ".new"));

    daemon.signal(SIGTERM);
    EXPECT_EQ(daemon.wait(), 0);
    EXPECT_NE(runProgram({"sh", "-c", command}, Errors::merge, "").status, 0);
    EXPECT_EQ(content(), before);
}

}  // namespace
}  // namespace adminhost::test
