#include "platform/directory/Membership.h"

#include "platform/directory/Directory.h"

#include <charconv>

namespace adminhost {
namespace {

/// The first record that any node has; a node that fails is skipped.
std::optional<DirectoryRecord> firstRecord(const DirectoryQuery& query) {
    for (const DirectoryNodeSource& source : DirectorySession::defaultSession().nodes()) {
        const auto node = source.open(nullptr);
        auto records = node ? node->records(query) : std::nullopt;
        if (records && !records->empty()) {
            return std::move(records->front());
        }
    }
    return std::nullopt;
}

std::optional<std::string> nameWithId(std::string_view type, std::string_view attribute, std::uint32_t id) {
    DirectoryQuery query;
    query.recordTypes = {std::string(type)};
    query.attribute = attribute;
    query.values = {std::to_string(id)};
    query.attributes = {std::string(directory::recordName)};
    query.maximum = 1;
    const auto record = firstRecord(query);
    const std::string* name = record ? record->first(directory::recordName) : nullptr;
    return name == nullptr ? std::nullopt : std::optional(*name);
}

}  // namespace

std::optional<Uuid> mbr_string_to_uuid(std::string_view text) noexcept {
    return uuidOf(text);
}

std::optional<PosixId> mbr_uuid_to_id(const Uuid& uuid) {
    DirectoryQuery query;
    query.recordTypes = {std::string(directory::users), std::string(directory::groups)};
    query.attribute = directory::generatedUID;
    query.values = {textOf(uuid)};
    query.attributes = {std::string(directory::uniqueID), std::string(directory::primaryGroupID)};
    query.maximum = 1;
    const auto record = firstRecord(query);
    if (!record) {
        return std::nullopt;
    }
    PosixId result;
    result.kind = record->type == directory::users ? PosixId::Kind::user : PosixId::Kind::group;
    const std::string* text =
        record->first(result.kind == PosixId::Kind::user ? directory::uniqueID : directory::primaryGroupID);
    if (text == nullptr) {
        return std::nullopt;
    }
    const char* end = text->data() + text->size();
    const auto [last, status] = std::from_chars(text->data(), end, result.id);
    return status == std::errc() && last == end ? std::optional(result) : std::nullopt;
}

std::optional<std::string> userNameOf(std::uint32_t userId) {
    return nameWithId(directory::users, directory::uniqueID, userId);
}

std::optional<std::string> groupNameOf(std::uint32_t groupId) {
    return nameWithId(directory::groups, directory::primaryGroupID, groupId);
}

}  // namespace adminhost
