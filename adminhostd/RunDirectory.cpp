#include "adminhostd/RunDirectory.h"

#include <filesystem>
#include <system_error>

namespace adminhost {

std::string socketPath(const Options& options) {
    if (options.socket) {
        return options.socket->text();
    }
    const std::string directory = diskPath(options.runDirectory).text();
    std::error_code ignored;
    // A failure is reported when the socket is created.
    std::filesystem::create_directories(directory, ignored);
    return directory + "/adminhostd.sock";
}

std::string privateParent(const Options& options) {
    return options.socket ? std::filesystem::absolute(options.socket->text()).parent_path().string()
                          : diskPath(options.runDirectory).text();
}

}  // namespace adminhost
