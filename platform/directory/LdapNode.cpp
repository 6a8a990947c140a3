#include "platform/directory/LdapNode.h"

#include "platform/directory/DirectoryRequest.h"
#include "platform/directory/LdapLookUps.h"

#include <utility>

namespace adminhost {
namespace {

class LdapNode : public DirectoryNode {
  public:
    explicit LdapNode(std::shared_ptr<LdapLookUps> lookUps) : _lookUps(std::move(lookUps)) {}

    const std::string& name() const noexcept override { return _lookUps->settings().name; }

    Result<std::vector<DirectoryRecord>> records(const DirectoryQuery& query) override {
        return _lookUps->records(query);
    }

    Result<void> reach(std::chrono::milliseconds limit) override { return _lookUps->reach(limit); }

  private:
    std::shared_ptr<LdapLookUps> _lookUps;
};

}  // namespace

DirectoryNodeSource ldapNode(LdapNodeSettings settings) {
    std::string name = settings.name;
    auto lookUps = std::make_shared<LdapLookUps>(std::move(settings));
    return {std::move(name), [lookUps] { return std::make_unique<LdapNode>(lookUps); }};
}

}  // namespace adminhost
