#include "platform/directory/Directory.h"

#include "platform/directory/LocalAccounts.h"

#include <utility>

#include <fmt/format.h>

namespace adminhost {
namespace {

Error noSuchNodeError(std::string_view node) {
    return {directory::errorDomain, directory::noSuchNode, fmt::format("there is no directory node {}", node)};
}

void report(Error* place, Error error) {
    if (place != nullptr) {
        *place = std::move(error);
    }
}

/// All nodes of a session as one.
class SearchNode : public DirectoryNode {
  public:
    explicit SearchNode(std::vector<std::unique_ptr<DirectoryNode>> nodes) : _nodes(std::move(nodes)) {}

    const std::string& name() const noexcept override { return _name; }

    std::optional<std::vector<DirectoryRecord>> records(const DirectoryQuery& query, Error* error) override {
        std::vector<DirectoryRecord> all;
        DirectoryQuery rest = query;
        for (const auto& node : _nodes) {
            auto some = node->records(rest, error);
            if (!some) {
                return std::nullopt;
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

std::optional<Error> DirectoryNode::authenticate(std::string_view /*username*/, std::string_view /*password*/) {
    return unsupported("signing in");
}

std::optional<Error> DirectoryNode::createRecord(std::string_view /*type*/, std::string_view /*name*/,
                                                 const DirectoryAttributes& /*attributes*/) {
    return unsupported("creating records");
}

std::optional<Error> DirectoryNode::deleteRecord(std::string_view /*type*/, std::string_view /*name*/) {
    return unsupported("deleting records");
}

std::optional<Error> DirectoryNode::setPassword(std::string_view /*type*/, std::string_view /*name*/,
                                                std::string_view /*password*/) {
    return unsupported("setting passwords");
}

DirectorySession& DirectorySession::defaultSession() {
    static DirectorySession session({localAccounts()});
    return session;
}

std::unique_ptr<DirectoryNode> DirectorySession::openNode(std::uint32_t nodeType, Error* error) const {
    if (nodeType != authenticationSearchNode) {
        report(error, noSuchNodeError(fmt::format("of type {:#x}", nodeType)));
        return nullptr;
    }
    std::vector<std::unique_ptr<DirectoryNode>> nodes;
    for (const DirectoryNodeSource& source : _nodes) {
        auto node = source.open(error);
        if (!node) {
            return nullptr;
        }
        nodes.push_back(std::move(node));
    }
    return std::make_unique<SearchNode>(std::move(nodes));
}

std::unique_ptr<DirectoryNode> DirectorySession::openNode(std::string_view name, Error* error) const {
    if (name == authenticationSearchNodeName) {
        return openNode(authenticationSearchNode, error);
    }
    for (const DirectoryNodeSource& source : _nodes) {
        if (source.name == name) {
            return source.open(error);
        }
    }
    report(error, noSuchNodeError(fmt::format("named \"{}\"", name)));
    return nullptr;
}

void setDirectoryNodes(std::vector<DirectoryNodeSource> nodes) {
    DirectorySession::defaultSession()._nodes = std::move(nodes);
}

}  // namespace adminhost
