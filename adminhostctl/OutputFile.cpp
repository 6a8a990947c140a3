#include "adminhostctl/OutputFile.h"

#include "adminhostctl/Failure.h"
#include "platform/files/ReplaceFile.h"

#include <filesystem>
#include <fstream>

namespace adminhost::ctl {

namespace fs = std::filesystem;

namespace {

constexpr mode_t ownersOnly = 0600;

/// The path of the file itself, without symbolic links: replacing a file does not follow all of them.
HostPath placeOf(const std::string& path) {
    std::error_code error;
    const fs::path there = fs::canonical(path, error);
    if (!error) {
        return HostPath(there);
    }
    const fs::path named(path);
    const fs::path parent = fs::canonical(named.has_parent_path() ? named.parent_path() : ".", error);
    return HostPath(error ? named : parent / named.filename());
}

}  // namespace

void writeOutput(const std::string& path, std::string_view bytes) {
    std::error_code ignored;
    const fs::file_status status = fs::status(path, ignored);
    if (fs::is_fifo(status) || fs::is_character_file(status)) {
        std::ofstream file(path, std::ios::binary);
        file << bytes;
        file.close();
        if (!file) {
            throw usageError(path + ": cannot be written");
        }
    } else if (const auto written = replaceFile(bytes, placeOf(path), ownersOnly); !written) {
        throw usageError(written.error().description.value_or(path + " cannot be written"));
    }
}

}  // namespace adminhost::ctl
