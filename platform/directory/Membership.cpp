#include "platform/directory/Membership.h"

#include "platform/directory/Directory.h"

#include <charconv>

namespace adminhost {
namespace {

/// The number of which this is the decimal text.
std::optional<std::uint32_t> numberOf(const std::string* text) {
    if (text == nullptr) {
        return std::nullopt;
    }
    std::uint32_t number = 0;
    const char* end = text->data() + text->size();
    const auto [last, status] = std::from_chars(text->data(), end, number);
    return status == std::errc() && last == end ? std::optional(number) : std::nullopt;
}

}  // namespace

std::optional<Uuid> mbr_string_to_uuid(std::string_view text) noexcept {
    return uuidOf(text);
}

Result<std::optional<PosixId>> mbr_uuid_to_id(const Uuid& uuid) {
    DirectoryQuery query;
    query.recordTypes = {std::string(directory::users), std::string(directory::groups)};
    query.attribute = directory::generatedUID;
    query.values = {textOf(uuid)};
    query.attributes = {std::string(directory::uniqueID), std::string(directory::primaryGroupID)};
    query.maximum = 1;
    std::optional<Error> error;
    for (const DirectoryNodeSource& source : DirectorySession::defaultSession().nodes()) {
        const auto node = source.open();
        const auto records = node ? (*node)->records(query) : failure(node.error());
        if (!records) {
            error = error ? error : records.error();
            continue;
        }
        if (records->empty()) {
            continue;
        }
        const DirectoryRecord& record = records->front();
        const bool isUser = record.type == directory::users;
        const auto id = numberOf(record.first(isUser ? directory::uniqueID : directory::primaryGroupID));
        if (!id) {
            return std::nullopt;
        }
        return PosixId{*id, isUser ? PosixId::Kind::user : PosixId::Kind::group, source.name};
    }
    if (error) {
        return failure(*error);
    }
    return std::nullopt;
}

Result<std::optional<std::string>> nameOf(const PosixId& id) {
    const bool isUser = id.kind == PosixId::Kind::user;
    DirectoryQuery query;
    query.recordTypes = {std::string(isUser ? directory::users : directory::groups)};
    query.attribute = isUser ? directory::uniqueID : directory::primaryGroupID;
    query.values = {std::to_string(id.id)};
    query.attributes = {std::string(directory::recordName)};
    query.maximum = 1;
    const auto node = DirectorySession::defaultSession().openNode(id.node);
    const auto records = node ? (*node)->records(query) : failure(node.error());
    if (!records) {
        return failure(records.error());
    }
    const std::string* name = records->empty() ? nullptr : records->front().first(directory::recordName);
    return name == nullptr ? std::nullopt : std::optional(*name);
}

}  // namespace adminhost
