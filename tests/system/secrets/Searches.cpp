#include "tests/system/secrets/Searches.h"

#include <algorithm>
#include <fstream>
#include <iterator>
#include <map>

namespace adminhost::test {

namespace fs = std::filesystem;

namespace {

std::string bytesOf(const fs::path& file) {
    std::ifstream in(file, std::ios::binary);
    return {std::istreambuf_iterator<char>(in), {}};
}

}  // namespace

bool holdsPlanted(const std::string& bytes) {
    return std::any_of(plantedForms.begin(), plantedForms.end(),
                       [&](std::string_view form) { return bytes.find(form) != std::string::npos; });
}

FileSearch searchBelow(const fs::path& directory) {
    FileSearch search;
    for (const auto& entry : fs::recursive_directory_iterator(directory)) {
        const bool isFile = entry.is_regular_file() && !entry.is_symlink();
        search.files += isFile ? 1U : 0U;
        if (holdsPlanted(entry.path().filename()) || (isFile && holdsPlanted(bytesOf(entry.path())))) {
            search.holding.push_back(entry.path());
        }
    }
    return search;
}

std::vector<pid_t> processesFrom(pid_t first) {
    std::map<pid_t, pid_t> parents;
    for (const auto& entry : fs::directory_iterator("/proc")) {
        const std::string name = entry.path().filename();
        if (name.find_first_not_of("0123456789") != std::string::npos) {
            continue;
        }
        // "PID (NAME) STATE PARENT ...", where the name may contain any character.
        const std::string status = bytesOf(entry.path() / "stat");
        if (const std::size_t end = status.rfind(')'); end != std::string::npos && end + 4 < status.size()) {
            parents[std::stoi(name)] = std::stoi(status.substr(end + 4));
        }
    }
    std::vector<pid_t> all{first};
    for (std::size_t i = 0; i < all.size(); ++i) {
        for (const auto& [pid, parent] : parents) {
            if (parent == all[i]) {
                all.push_back(pid);
            }
        }
    }
    return all;
}

std::string argumentsAndEnvironmentOf(pid_t pid) {
    const fs::path process = "/proc/" + std::to_string(pid);
    return bytesOf(process / "cmdline") + bytesOf(process / "environ");
}

}  // namespace adminhost::test
