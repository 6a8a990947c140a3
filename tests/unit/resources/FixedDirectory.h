#pragma once

// A directory with a fixed answer, in place of the machine's accounts.

#include "platform/directory/Directory.h"

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace lumio {

using adminhost::DirectoryRecord;
using adminhost::Error;

/// A directory that returns the given records for every query.
class FixedNode final : public adminhost::DirectoryNode {
  public:
    explicit FixedNode(std::optional<std::vector<DirectoryRecord>> records) : _records(std::move(records)) {}
    [[nodiscard]] const std::string& name() const noexcept override { return _name; }
    [[nodiscard]] adminhost::Result<std::vector<DirectoryRecord>> records(const adminhost::DirectoryQuery&) override {
        if (!_records) {
            return adminhost::failure(Error{"directory", 9, "the directory is away"});
        }
        return *_records;
    }

  private:
    std::string _name = "/Fixed";
    std::optional<std::vector<DirectoryRecord>> _records;
};

inline DirectoryRecord record(std::string_view type, std::string_view name, std::optional<std::string_view> uuid) {
    DirectoryRecord made;
    made.type = type;
    made.attributes[std::string(adminhost::directory::recordName)] = {std::string(name)};
    if (uuid) {
        made.attributes[std::string(adminhost::directory::generatedUID)] = {std::string(*uuid)};
    }
    return made;
}

/// The directory returns these records for every query; without records, queries fail. Set the nodes again afterwards.
inline void useDirectory(std::optional<std::vector<DirectoryRecord>> records) {
    adminhost::setDirectoryNodes(
        {{"/Fixed", [records = std::move(records)] { return std::make_unique<FixedNode>(records); }}});
}

}  // namespace lumio
