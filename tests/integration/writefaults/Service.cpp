#include "tests/integration/writefaults/Service.h"

#include "handler/LumioRequestHandler.h"
#include "platform/task/Task.h"
#include "platform/value/ValueText.h"
#include "tests/support/Traced.h"

#include <algorithm>
#include <csignal>
#include <iostream>

#include <sys/resource.h>

namespace lumio {

namespace fs = std::filesystem;
using adminhost::Dictionary;
using adminhost::Value;

namespace {

constexpr std::string_view marker = "/var/lumio/server/.lumio_setup_done";
const std::string scripts = "/usr/share/sorvaneproducer/lumioserverd/script/";

/// Several pages, so that no file fits into one block.
const std::string filling(20'000, 'x');

Value writeNew() {
    LumioRequestHandler handler;
    const Dictionary configuration{
        {"shared_filesystem", "/shared"},       {"member_uuid", "M"},  {"nimbo_client_username", "second"},
        {"nimbo_controller", "second.example"}, {"server_port", 9000}, {"server_host", "new.example"}};
    return handler.writeSettingsWithRequest(Dictionary{{"configuration", configuration}}).dictionary();
}

}  // namespace

Service::Service() {
    fs::create_directories(root.path(scripts));
    for (const char* script : {"setup_lumioserverd_preferences", "setup_lumioserverd_library"}) {
        fs::create_symlink("/bin/true", root.path(scripts + script));
    }
    makeOld();
}

void Service::makeWithoutFiles() const {
    for (const std::string_view file : settingsFiles) {
        fs::remove_all(root.path(file).parent_path());
        fs::create_directories(root.path(file).parent_path());
    }
    fs::remove_all(root.path("/var/lumio"));
    // Only the superuser can set its owner, so it exists already, with the account of the tests as its owner.
    fs::create_directories(root.path("/var/lumio/server"));
}

void Service::makeOld() const {
    makeWithoutFiles();
    const std::string kept = "<key>kept</key><string>" + filling + "</string>";
    root.writePropertyList(identityFile,
                           "<key>shared_filesystem</key><string>/shared</string><key>member_uuid</key>"
                           "<string>M</string>" +
                               kept);
    root.writePropertyList(clusterFile,
                           "<key>nimbo_client_username</key><string>grid</string>"
                           "<key>nimbo_controller</key><string>grid.example</string>" +
                               kept);
    root.writePropertyList(memberFile, "<key>server_port</key><integer>8170</integer>" + kept);
}

std::vector<std::string> Service::writer() const {
    return {fs::read_symlink("/proc/self/exe"), "--write", root.path("").string()};
}

std::int32_t Service::writeAlone(const std::optional<std::string>& bytes) {
    std::vector<std::string> arguments = writer();
    const adminhost::DiskPath program(arguments.front());
    arguments.erase(arguments.begin());
    if (bytes) {
        arguments.push_back(*bytes);
    }
    return adminhost::launch_task_with_input(program, arguments, std::nullopt, nullptr, &_said);
}

std::int32_t Service::writeTraced(const std::vector<std::string>& options, const std::string& logFile) {
    return adminhost::test::runTraced(options, logFile, writer(), _said);
}

bool Service::writeHere() const {
    return writeNew().dictionary()->get("writeStatus") == Value(0);
}

Contents Service::contents() const {
    Contents contents;
    for (const std::string_view file : settingsFiles) {
        if (fs::is_regular_file(root.path(file))) {
            contents[file] = root.read(file);
        }
    }
    return contents;
}

std::vector<std::string> Service::others() const {
    std::vector<std::string> names;
    for (const std::string_view file : {identityFile, clusterFile}) {
        for (const auto& entry : fs::directory_iterator(root.path(file).parent_path())) {
            const bool known = std::any_of(settingsFiles.begin(), settingsFiles.end(),
                                           [&](std::string_view one) { return root.path(one) == entry.path(); });
            if (!known) {
                names.push_back(entry.path().filename());
            }
        }
    }
    return names;
}

bool Service::marked() const {
    return fs::exists(root.path(marker));
}

int writeBetweenMarks(const std::vector<std::string>& arguments) {
    adminhost::setSystemRoot(arguments.at(0));
    if (arguments.size() > 1) {
        // The limit on the size of files: the write that reaches it is cut short, the next one fails.
        const rlimit limit{std::stoul(arguments[1]), std::stoul(arguments[1])};
        ::setrlimit(RLIMIT_FSIZE, &limit);
        static_cast<void>(::signal(SIGXFSZ, SIG_IGN));
    }
    adminhost::test::markBegin();
    const Value answer = writeNew();
    adminhost::test::markEnd();
    const Value& status = answer.dictionary()->get("writeStatus");
    std::cerr << adminhost::textOf(answer.dictionary()->get("errorDescription")) << '\n';
    return status == Value(0) ? written : status == Value(400) ? refused : otherStatus;
}

}  // namespace lumio
