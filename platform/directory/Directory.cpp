#include "platform/directory/Directory.h"

#include "platform/directory/DirectoryRequest.h"
#include "platform/directory/LocalAccounts.h"

#include <utility>

#include <fmt/format.h>

namespace adminhost {
namespace {

Error noSuchNodeError(std::string_view node) {
    return {directory::errorDomain, directory::noSuchNode, fmt::format("directory node not found: {}", node)};
}

/// All nodes of a session as one.
class SearchNode : public DirectoryNode {
  public:
    explicit SearchNode(std::vector<std::unique_ptr<DirectoryNode>> nodes) : _nodes(std::move(nodes)) {}

    const std::string& name() const noexcept override { return _name; }

    Result<std::vector<DirectoryRecord>> records(const DirectoryQuery& query) override {
        std::vector<DirectoryRecord> all;
        DirectoryQuery rest = query;
        for (const auto& node : _nodes) {
            noteDirectoryLookup();
            auto some = node->records(rest);
            if (!some) {
                reportFailure(node->name(), some.error());
                return some;
            }
            all.insert(all.end(), std::make_move_iterator(some->begin()), std::make_move_iterator(some->end()));
            if (query.maximum != 0) {
                if (all.size() >= query.maximum) {
                    break;
                }
                rest.maximum = query.maximum - all.size();
            }
        }
        return all;
    }

    Result<std::vector<DirectoryRecord>> groupsOf(const DirectoryRecord& person,
                                                  const std::vector<std::string>& attributes) override {
        for (const auto& node : _nodes) {
            if (node->name() == person.node) {
                noteDirectoryLookup();
                return node->groupsOf(person, attributes);
            }
        }
        return failure(noSuchNodeError(fmt::format("named \"{}\"", person.node)));
    }

  private:
    std::string _name{DirectorySession::authenticationSearchNodeName};
    std::vector<std::unique_ptr<DirectoryNode>> _nodes;
};

}  // namespace

const std::vector<std::string>& DirectoryRecord::values(std::string_view attribute) const noexcept {
    static const std::vector<std::string> none;
    const auto found = attributes.find(attribute);
    return found == attributes.end() ? none : found->second;
}

const std::string* DirectoryRecord::first(std::string_view attribute) const noexcept {
    const auto& all = values(attribute);
    return all.empty() ? nullptr : &all.front();
}

Error DirectoryNode::unsupported(std::string_view operation) const {
    return {directory::errorDomain, directory::notSupported,
            fmt::format("{} is not supported by the directory node {}", operation, name())};
}

Result<std::vector<DirectoryRecord>> DirectoryNode::groupsOf(const DirectoryRecord& /*person*/,
                                                             const std::vector<std::string>& /*attributes*/) {
    return failure(unsupported("finding the groups of a person"));
}

Result<void> DirectoryNode::reach(std::chrono::milliseconds /*limit*/) {
    return {};
}

Result<bool> DirectoryNode::authenticate(std::string_view /*username*/, std::string_view /*password*/) {
    return failure(unsupported("signing in"));
}

Result<std::optional<DirectoryRecord>> DirectoryNode::createRecord(std::string_view /*type*/, std::string_view /*name*/,
                                                                   const DirectoryAttributes& /*attributes*/) {
    return failure(unsupported("creating records"));
}

Result<void> DirectoryNode::deleteRecord(std::string_view /*type*/, std::string_view /*name*/) {
    return failure(unsupported("deleting records"));
}

Result<void> DirectoryNode::setPassword(std::string_view /*type*/, std::string_view /*name*/,
                                        std::string_view /*password*/) {
    return failure(unsupported("setting passwords"));
}

DirectorySession& DirectorySession::defaultSession() {
    static DirectorySession session({localAccounts()});
    return session;
}

OpenedDirectoryNode DirectorySession::openNode(std::uint32_t nodeType) const {
    if (nodeType != authenticationSearchNode) {
        return failure(noSuchNodeError(fmt::format("of type {:#x}", nodeType)));
    }
    std::vector<std::unique_ptr<DirectoryNode>> nodes;
    for (const DirectoryNodeSource& source : _nodes) {
        auto node = source.open();
        if (!node) {
            reportFailure(source.name, node.error());
            return node;
        }
        nodes.push_back(*std::move(node));
    }
    return std::make_unique<SearchNode>(std::move(nodes));
}

OpenedDirectoryNode DirectorySession::openNode(std::string_view name) const {
    if (name == authenticationSearchNodeName) {
        return openNode(authenticationSearchNode);
    }
    for (const DirectoryNodeSource& source : _nodes) {
        if (source.name == name) {
            return source.open();
        }
    }
    return failure(noSuchNodeError(fmt::format("named \"{}\"", name)));
}

Result<std::vector<DirectoryRecord>> searchDirectory(const DirectoryQuery& query) {
    const auto node = DirectorySession::defaultSession().openNode(DirectorySession::authenticationSearchNode);
    if (!node) {
        return failure(node.error());
    }
    return (*node)->records(query);
}

void setDirectoryNodes(std::vector<DirectoryNodeSource> nodes) {
    DirectorySession::defaultSession()._nodes = std::move(nodes);
}

}  // namespace adminhost
