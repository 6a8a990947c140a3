#include "tests/system/jobs/Jobs.h"

#include "platform/task/Task.h"

#include <filesystem>
#include <fstream>
#include <sstream>

namespace adminhost::test {

std::unique_ptr<SampleRoot> Jobs::root;
std::unique_ptr<DaemonProcess> Jobs::daemon;

Ran runBare(const std::vector<std::string>& command) {
    std::vector<std::string> words{"-i"};
    words.insert(words.end(), command.begin(), command.end());
    Ran ran;
    ran.status = launch_task_with_input_and_environment(DiskPath("/usr/bin/env"), words, {}, &ran.out, &ran.err, {});
    return ran;
}

std::vector<std::string> linesOf(const std::string& text) {
    std::vector<std::string> lines;
    std::istringstream in(text);
    for (std::string line; std::getline(in, line);) {
        lines.push_back(line);
    }
    return lines;
}

std::string contentOf(const std::string& path) {
    std::ostringstream content;
    content << std::ifstream(path).rdbuf();
    return content.str();
}

std::string valueIn(const std::string& propertyList, const std::string& key) {
    const char* const program =
        "import plistlib, sys; print(plistlib.load(open(sys.argv[1], 'rb')).get(sys.argv[2]), end='')";
    return runProgram({"/usr/bin/python3", "-S", "-c", program, propertyList, key}).output;
}

std::string decipheredText(const std::string& value) {
    // Key and vector of the sample service, which demo/README.md names.
    const char* const program =
        "import base64, subprocess, sys\n"
        "subprocess.run(['openssl', 'enc', '-d', '-aes-128-cbc', '-K', b'lumio-sample-key'.hex(), '-iv',\n"
        "                b'LumioPropertyIV1'.hex()], input=base64.b64decode(sys.argv[1]), check=True)";
    return runProgram({"/usr/bin/python3", "-S", "-c", program, value}).output;
}

void Jobs::SetUpTestSuite() {
    SampleSizes sizes;
    sizes.cameras = 1000;
    root = std::make_unique<SampleRoot>(sizes);
    const auto addTo = [](const std::string& kind, const std::string& name, const char* cameras) {
        return "insert into access_control_entries (record_uuid, record_type, resource_type, resource_id) select '" +
               SampleRoot::uuidOf(kind, name) + "', '" + kind + "', 'Camera', id from cameras where id > 12 and " +
               cameras + ';';
    };
    root->sql(addTo("user", "ben", "id % 20 = 1") + addTo("group", "lecturers", "id % 25 = 3") +
              addTo("user", "kiosk", "id % 100 = 13"));
    DaemonProcess::Options options;
    options.arguments = {"--root", root->path(), "--plugin", BINARY_DIR "/lib/adminhost_lumio.so"};
    daemon = std::make_unique<DaemonProcess>(options);
}

void Jobs::TearDownTestSuite() {
    daemon.reset();
    root.reset();
}

Ran Jobs::ctl(std::vector<std::string> words) {
    words.insert(words.begin(), {ctlProgram, "--socket", daemon->socket()});
    return runBare(words);
}

Ran Jobs::history(const std::string& key, const std::string& since) {
    return runBare(
        {"COLUMNS=200", ctlProgram, "--socket", daemon->socket(), "history", "--since", since, "--key", key});
}

Ran Jobs::script(const std::string& text) {
    return runBare(
        {"/bin/sh", "-c", "CTL='" + std::string(ctlProgram) + " --socket " + daemon->socket() + "'\n" + text});
}

std::string Jobs::file(const std::string& name, const std::string& content) {
    std::string path = root->directory() + '/' + name;
    std::ofstream(path) << content;
    std::filesystem::permissions(path, std::filesystem::perms(0600));
    return path;
}

std::vector<std::string> Jobs::sql(const std::string& statement) {
    return linesOf(root->sql(statement));
}

std::set<std::string> Jobs::camerasListing(const std::vector<std::string>& uuids) {
    std::string list;
    for (const std::string& uuid : uuids) {
        list += (list.empty() ? "'" : ", '") + uuid + '\'';
    }
    const std::vector<std::string> names =
        sql("select distinct name from cameras join access_control_entries on resource_type = 'Camera' and "
            "resource_id = cameras.id where record_uuid in (" +
            list + ")");
    return {names.begin(), names.end()};
}

}  // namespace adminhost::test
