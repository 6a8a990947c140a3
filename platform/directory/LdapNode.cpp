#include "platform/directory/LdapNode.h"

#include "platform/directory/LdapAccounts.h"
#include "platform/directory/LdapLookUps.h"
#include "platform/directory/LdapMembers.h"
#include "platform/directory/LdapQuery.h"

#include <utility>

namespace adminhost {
namespace {

class LdapNode : public DirectoryNode {
  public:
    explicit LdapNode(std::shared_ptr<LdapLookUps> lookUps) : _lookUps(std::move(lookUps)), _accounts(_lookUps) {}

    const std::string& name() const noexcept override { return _lookUps->settings().name; }

    Result<std::vector<DirectoryRecord>> records(const DirectoryQuery& query) override {
        // An administrator who has signed in sees with his own rights, and sees his own changes at once.
        if (const auto connection = _accounts.connection()) {
            return ldapRecords(*connection, _lookUps->mapping(), name(), query);
        }
        return _lookUps->records(query);
    }

    Result<std::vector<DirectoryRecord>> groupsOf(const DirectoryRecord& person,
                                                  const std::vector<std::string>& attributes) override {
        return _lookUps->run<std::vector<DirectoryRecord>>([&](LdapConnection& connection) {
            return ldapGroupsOf(connection, _lookUps->mapping(), person, attributes);
        });
    }

    Result<void> reach(std::chrono::milliseconds limit) override { return _lookUps->reach(limit); }

    Result<bool> authenticate(std::string_view username, std::string_view password) override {
        return _accounts.signIn(username, password);
    }

    Result<std::optional<DirectoryRecord>> createRecord(std::string_view type, std::string_view recordName,
                                                        const DirectoryAttributes& attributes) override {
        if (type != directory::users) {
            return failure(unsupported("creating records other than users"));
        }
        return _accounts.create(recordName, attributes);
    }

    Result<void> deleteRecord(std::string_view type, std::string_view recordName) override {
        return _accounts.remove(type, recordName);
    }

    Result<void> setPassword(std::string_view type, std::string_view recordName, std::string_view password) override {
        return _accounts.setPassword(type, recordName, password);
    }

  private:
    std::shared_ptr<LdapLookUps> _lookUps;
    LdapAccounts _accounts;
};

}  // namespace

DirectoryNodeSource ldapNode(LdapNodeSettings settings) {
    std::string name = settings.name;
    auto lookUps = std::make_shared<LdapLookUps>(std::move(settings));
    return {std::move(name), [lookUps] { return std::make_unique<LdapNode>(lookUps); }};
}

}  // namespace adminhost
