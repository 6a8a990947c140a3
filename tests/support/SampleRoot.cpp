#include "tests/support/SampleRoot.h"

#include "tests/support/Eventually.h"
#include "tests/support/Program.h"

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>
#include <system_error>

#include <nlohmann/json.hpp>
#include <unistd.h>

namespace adminhost::test {

namespace fs = std::filesystem;

namespace {

std::string run(const std::vector<std::string>& command) {
    const ProgramResult result = runProgram(command);
    if (result.status != 0) {
        throw std::runtime_error(command[0] + " ended with status " + std::to_string(result.status));
    }
    return result.output;
}

const char* const callsLog = "/var/log/tool-calls.log";

}  // namespace

SampleRoot::SampleRoot(const SampleSizes& sizes) {
    std::string pattern = (fs::temp_directory_path() / "sample-XXXXXX").string();
    if (::mkdtemp(pattern.data()) == nullptr) {
        throw std::system_error(errno, std::generic_category(), "mkdtemp " + pattern);
    }
    _base = fs::canonical(pattern).string();
    _path = _base + "/root";
    std::vector<std::string> command{SOURCE_DIR "/demo/make-root", _path};
    const auto add = [&command](const char* option, const std::optional<int>& size) {
        if (size) {
            command.insert(command.end(), {option, std::to_string(*size)});
        }
    };
    add("--cameras", sizes.cameras);
    add("--workflows", sizes.workflows);
    add("--properties", sizes.properties);
    add("--jobs", sizes.jobs);
    add("--access-entries", sizes.accessEntries);
    add("--accounts", sizes.accounts);
    try {
        run(command);
    } catch (...) {
        std::error_code ignored;
        fs::remove_all(_base, ignored);
        throw;
    }
}

SampleRoot::~SampleRoot() {
    std::error_code ignored;
    try {
        clearSwitches();
        for (const auto* name : {"setup_preferences", "setup_library", "lumioctl", "lumioconfig", "nimbo"}) {
            if (const auto daemon = daemonLeftBy(name)) {
                ::kill(*daemon, SIGKILL);
            }
        }
        if (fs::exists(disk("/var/run/lumioserverd.pid"))) {
            run({disk("/usr/sbin/lumioctl"), "server", "stop"});
        }
    } catch (const std::exception&) {
        // The daemon ends by itself when its pid file is removed with the directory.
    }
    fs::remove_all(_base, ignored);
}

std::string SampleRoot::databasePath() const {
    return disk("/var/lumio/server/db/lumio.sqlite3");
}

std::string SampleRoot::sharedFilesystemPath() const {
    return disk("/Library/SorvaneProducer/Shared");
}

std::string SampleRoot::memberPreferencesPath() const {
    return sharedFilesystemPath() + "/Server/member_preferences_" + uuidOf("member", "media1") + ".plist";
}

std::string SampleRoot::clusterPreferencesPath() const {
    return sharedFilesystemPath() + "/Server/cluster_preferences.plist";
}

std::string SampleRoot::identityPreferencesPath() const {
    return disk("/Library/Preferences/com.brenn.lumioserverd.plist");
}

std::string SampleRoot::sql(const std::string& statements) const {
    return run({"sqlite3", "-batch", "-init", "/dev/null", "-list", "-noheader", databasePath(), statements});
}

std::string SampleRoot::read(const std::string& hostPath) const {
    std::ifstream file(disk(hostPath), std::ios::binary);
    std::ostringstream content;
    if (!file || !(content << file.rdbuf() || file.peek() == std::ifstream::traits_type::eof())) {
        throw std::runtime_error("cannot read " + hostPath);
    }
    return content.str();
}

void SampleRoot::write(const std::string& hostPath, const std::string& content) const {
    const fs::path file = disk(hostPath);
    fs::create_directories(file.parent_path());
    if (fs::is_symlink(file)) {
        fs::remove(file);  // it leads out of the root, to this machine's own tool
    }
    std::ofstream out(file, std::ios::binary | std::ios::trunc);
    if (!(out << content << std::flush)) {
        throw std::runtime_error("cannot write " + hostPath);
    }
}

void SampleRoot::remove(const std::string& hostPath) const {
    fs::remove_all(disk(hostPath));
}

void SampleRoot::removeAccount(const std::string& name) const {
    std::istringstream all(read("/etc/passwd"));
    std::string left;
    for (std::string line; std::getline(all, line);) {
        left += line.starts_with(name + ':') ? "" : line + '\n';
    }
    write("/etc/passwd", left);
}

void SampleRoot::setSwitch(const std::string& name, const std::string& content) const {
    write("/etc/demo/" + name, content);
}

void SampleRoot::clearSwitches() const {
    remove("/etc/demo");
    fs::create_directories(disk("/etc/demo"));
}

void SampleRoot::hold(const std::string& tool) const {
    remove("/etc/demo/" + tool + ".held");
    setSwitch(tool + ".hold", "");
}

void SampleRoot::release(const std::string& tool) const {
    remove("/etc/demo/" + tool + ".hold");
}

bool SampleRoot::waitForHeld(const std::string& tool) const {
    return eventually([&] { return fs::exists(disk("/etc/demo/" + tool + ".held")); }, std::chrono::seconds(30));
}

std::optional<int> SampleRoot::daemonLeftBy(const std::string& switchName) const {
    std::ifstream file(disk("/var/run/" + switchName + ".daemon.pid"));
    int pid = 0;
    std::string command;
    // By then another process may have that id.
    if (file >> pid && std::ifstream("/proc/" + std::to_string(pid) + "/comm") >> command && command == "sleep") {
        return pid;
    }
    return std::nullopt;
}

void SampleRoot::recordToolCalls() const {
    write(callsLog, "");
}

std::vector<ToolCall> SampleRoot::toolCalls() const {
    std::vector<ToolCall> calls;
    std::istringstream lines(read(callsLog));
    for (std::string line; std::getline(lines, line);) {
        const auto call = nlohmann::json::parse(line);
        calls.push_back(
            {call.at("tool"), call.at("arguments"), call.value("environment", std::map<std::string, std::string>{})});
    }
    return calls;
}

std::string SampleRoot::uuidOf(const std::string& kind, const std::string& name) {
    static std::map<std::pair<std::string, std::string>, std::string> known;
    auto& uuid = known[{kind, name}];
    if (uuid.empty()) {
        const char* const program =
            "import sys; sys.path.insert(0, sys.argv[1]); import names; print(names.uuid_of(*sys.argv[2:]), end='')";
        uuid = run({"/usr/bin/python3", "-B", "-S", "-c", program, SOURCE_DIR "/demo/sample", kind, name});
    }
    return uuid;
}

}  // namespace adminhost::test
