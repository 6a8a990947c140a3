#include "adminhostd/PluginSelection.h"

#include "adminhostd/PluginFile.h"

#include <cerrno>
#include <cstring>
#include <string>

namespace adminhost {
namespace {

protocol::RefusedPlugin refusedFile(const DiskPath& file, const std::string& reason) {
    return {file.text(), reason};
}

}  // namespace

PluginSelection selectPlugins(const Options& options) {
    PluginSelection selection;
    if (!options.plugins.empty()) {
        for (const DiskPath& file : options.plugins) {
            if (const auto reason = distrustNamed(file)) {
                selection.refused.push_back(refusedFile(file, *reason));
            } else {
                selection.files.push_back(file);
            }
        }
        return selection;
    }
    const DiskPath directory = diskPath(options.pluginDirectory);
    if (const auto reason = distrust(directory)) {
        selection.refused.push_back(refusedFile(directory, *reason));
        return selection;
    }
    const auto files = pluginsIn(directory);
    if (!files) {
        selection.refused.push_back(refusedFile(directory, directory.text() + ": " + std::strerror(errno)));
        return selection;
    }
    for (const DiskPath& file : *files) {
        if (const auto reason = distrust(file)) {
            selection.refused.push_back(refusedFile(file, *reason));
        } else {
            selection.files.push_back(file);
        }
    }
    return selection;
}

}  // namespace adminhost
