// Damaged account files: the directory's entries fit into a property list, each name occurs once, and each account is
// found by its name, its number and its UUID.

#include "platform/directory/AccountFiles.h"
#include "platform/plist/PropertyList.h"

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <set>
#include <string>

namespace {

using adminhost::Account;
using adminhost::AccountKind;

/// A system root for this process only.
class Root {
  public:
    Root() {
        std::string pattern = (std::filesystem::temp_directory_path() / "accounts.XXXXXX").string();
        if (::mkdtemp(pattern.data()) == nullptr) {
            std::abort();
        }
        _directory = pattern;
        std::filesystem::create_directory(_directory / "etc");
        adminhost::setSystemRoot(_directory);
    }
    Root(const Root&) = delete;
    Root& operator=(const Root&) = delete;
    ~Root() {
        std::error_code ignored;
        std::filesystem::remove_all(_directory, ignored);
    }
    void write(const char* name, std::string_view text) const { std::ofstream(_directory / "etc" / name) << text; }

  private:
    std::filesystem::path _directory;
};

void require(bool condition) {
    if (!condition) {
        std::abort();
    }
}

bool holds(const std::vector<std::size_t>& positions, std::size_t position) {
    return std::find(positions.begin(), positions.end(), position) != positions.end();
}

void lookAt(adminhost::AccountFiles& files, AccountKind kind) {
    const auto read = files.table(kind);
    require(read.has_value());
    const auto& table = *read;
    std::set<std::string> names;
    for (std::size_t i = 0; i < table->accounts().size(); ++i) {
        const Account& account = table->accounts()[i];
        adminhost::Array texts{account.name, account.longName, account.home, account.shell};
        texts.insert(texts.end(), account.members.begin(), account.members.end());
        require(adminhost::xmlPropertyList(texts).has_value());
        require(!account.name.empty() && names.insert(account.name).second);
        require(holds(table->named(account.name), i) && holds(table->withId(account.id), i));
        if (const auto uuid = table->uuidTextOf(account)) {
            require(adminhost::uuidOf(*uuid) && holds(table->withUuid(*adminhost::uuidOf(*uuid)), i));
        }
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    static const Root root;
    const std::string_view text(reinterpret_cast<const char*>(data), size);
    for (const char* const name : {"passwd", "group", "uuids"}) {
        root.write(name, text);
    }
    adminhost::AccountFiles computed;
    adminhost::AccountFiles given{adminhost::HostPath("/etc/uuids")};
    for (const AccountKind kind : {AccountKind::user, AccountKind::group}) {
        lookAt(computed, kind);
        lookAt(given, kind);
    }
    return 0;
}
