#pragma once

// A directory of one node in memory that can be changed. It records what it is asked, and each operation can be made to
// fail. It is the default session's only node while the object exists.

#include "platform/directory/Directory.h"
#include "platform/directory/LocalAccounts.h"

#include <algorithm>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace adminhost::test {

class MemoryDirectory {
  public:
    struct Content {
        std::vector<DirectoryRecord> records;
        std::vector<std::string> asked;  ///< "create USER", "query ATTRIBUTE=VALUE max N", "password USER", ...
        std::string administrator = "diradmin";
        std::string administratorsPassword = "diradmin secret";
        std::string setPassword;  ///< the last one that was set
        // What fails.
        std::optional<Error> opening;
        std::optional<Error> authentication;
        std::optional<Error> nameQuery;
        std::optional<Error> idQuery;
        std::optional<Error> deletion;
        std::optional<Error> creation;
        std::optional<Error> passwordSetting;
        bool refusesWithoutError = false;
        bool losesNewRecord = false;
    };

    explicit MemoryDirectory(std::string name = "/Memory") : _name(std::move(name)) {
        setDirectoryNodes({{_name, [content = _content, nodeName = _name]() -> OpenedDirectoryNode {
                                content->asked.push_back("open");
                                if (content->opening) {
                                    return failure(*content->opening);
                                }
                                return std::make_unique<Node>(nodeName, content);
                            }}});
    }
    MemoryDirectory(const MemoryDirectory&) = delete;
    MemoryDirectory& operator=(const MemoryDirectory&) = delete;
    ~MemoryDirectory() { setDirectoryNodes({localAccounts()}); }

    Content& operator*() noexcept { return *_content; }
    Content* operator->() noexcept { return _content.get(); }

    void addUser(const std::string& name, const std::string& id, std::vector<std::string> authorities = {}) {
        DirectoryRecord record;
        record.type = directory::users;
        record.node = _name;
        record.attributes[std::string(directory::recordName)] = {name};
        record.attributes[std::string(directory::uniqueID)] = {id};
        if (!authorities.empty()) {
            record.attributes[std::string(directory::authenticationAuthority)] = std::move(authorities);
        }
        _content->records.push_back(std::move(record));
    }

  private:
    class Node final : public DirectoryNode {
      public:
        Node(std::string name, std::shared_ptr<Content> content)
            : _name(std::move(name)), _content(std::move(content)) {}
        [[nodiscard]] const std::string& name() const noexcept override { return _name; }
        [[nodiscard]] Result<std::vector<DirectoryRecord>> records(const DirectoryQuery& query) override {
            for (const std::string& value : query.values) {
                _content->asked.push_back("query " + query.attribute.substr(query.attribute.find(':') + 1) + '=' +
                                          value + " max " + std::to_string(query.maximum));
            }
            const auto& error = query.attribute == directory::uniqueID ? _content->idQuery : _content->nameQuery;
            if (error) {
                return failure(*error);
            }
            std::vector<DirectoryRecord> found;
            std::copy_if(_content->records.begin(), _content->records.end(), std::back_inserter(found),
                         [&](const DirectoryRecord& record) {
                             const std::string* value = record.first(query.attribute);
                             return value != nullptr && query.recordTypes == std::vector{record.type} &&
                                    std::find(query.values.begin(), query.values.end(), *value) != query.values.end();
                         });
            return found;
        }
        [[nodiscard]] Result<std::vector<DirectoryRecord>> groupsOf(const DirectoryRecord&,
                                                                    const std::vector<std::string>&) override {
            return std::vector<DirectoryRecord>();
        }
        [[nodiscard]] Result<bool> authenticate(std::string_view username, std::string_view password) override {
            _content->asked.push_back("authenticate " + std::string(username));
            if (_content->authentication) {
                return failure(*_content->authentication);
            }
            if (username != _content->administrator || password != _content->administratorsPassword) {
                return failure({std::string(directory::ldapErrorDomain), 49, "Invalid credentials"});
            }
            return !_content->refusesWithoutError;
        }
        [[nodiscard]] Result<std::optional<DirectoryRecord>> createRecord(
            std::string_view type, std::string_view name, const DirectoryAttributes& attributes) override {
            _content->asked.push_back("create " + std::string(name));
            if (_content->creation) {
                return failure(*_content->creation);
            }
            DirectoryRecord record{std::string(type), _name, attributes};
            record.attributes[std::string(directory::recordName)] = {std::string(name)};
            _content->records.push_back(record);
            return _content->losesNewRecord ? std::nullopt : std::optional(std::move(record));
        }
        [[nodiscard]] Result<void> deleteRecord(std::string_view type, std::string_view name) override {
            _content->asked.push_back("delete " + std::string(name));
            if (_content->deletion) {
                return failure(*_content->deletion);
            }
            std::erase_if(_content->records, [&](const DirectoryRecord& record) {
                return record.type == type && *record.first(directory::recordName) == name;
            });
            return {};
        }
        [[nodiscard]] Result<void> setPassword(std::string_view, std::string_view name,
                                               std::string_view password) override {
            _content->asked.push_back("password " + std::string(name));
            if (_content->passwordSetting) {
                return failure(*_content->passwordSetting);
            }
            _content->setPassword = password;
            return {};
        }

      private:
        std::string _name;
        std::shared_ptr<Content> _content;
    };

    std::string _name;
    std::shared_ptr<Content> _content = std::make_shared<Content>();
};

}  // namespace adminhost::test
