#include "resources/Resource.h"

#include "platform/bundle/Bundle.h"
#include "platform/text/LocalDate.h"
#include "platform/value/ValueText.h"

namespace lumio {

using adminhost::Dictionary;
using adminhost::Value;

std::unique_ptr<Resource> Resource::initWithGUID(std::optional<std::string> guid) {
    auto resource = init();
    resource->setGuid(std::move(guid));
    return resource;
}

std::unique_ptr<Resource> Resource::initWithDictionary(Dictionary row) {
    auto resource = init();
    resource->readRow(std::move(row));
    return resource;
}

std::unique_ptr<Resource> Resource::resourceWithDictionary(Dictionary dictionary) {
    return initWithDictionary(std::move(dictionary));
}

std::optional<Dictionary> Resource::localizationsForResourceNamed(std::string_view name,
                                                                  const adminhost::Bundle& bundle,
                                                                  const std::vector<std::string>& preferredLanguages) {
    return adminhost::localizedTable(bundle, name, preferredLanguages);
}

std::vector<std::string_view> Resource::listOfResourceDateKeys() const {
    return {"updated_at", "created_at", "used_at"};
}

void Resource::readRow(Dictionary row) {
    _data = std::move(row);
    for (const std::string_view key : listOfResourceDateKeys()) {
        Value* value = _data->find(key);
        if (value == nullptr || value->string() == nullptr) {
            continue;
        }
        if (const auto date = adminhost::localDateOf(*value->string())) {
            *value = *date;
        }
    }
    if (_data->contains("uuid")) {
        _data->set("_id_", _data->get("uuid"));
    }
}

const std::optional<std::string>& Resource::guid() {
    if (!_guid && _data && _data->contains("uuid")) {
        _guid = textOf(_data->get("uuid"));
    }
    return _guid;
}

const Dictionary* Resource::data() {
    if (!_data && guid()) {
        std::optional<adminhost::Error> error;
        auto rows = querySorvaneDatabase<Dictionary>(
            std::string("select * from ").append(resourceType()) + "s where uuid=\"" + *guid() + "\"", error);
        if (rows && rows->size() == 1) {
            _data = std::move(rows->front());
        }
    }
    return _data ? &*_data : nullptr;
}

const Dictionary* Resource::dictionary() {
    if (!_aclsAreExpanded) {
        expandACLs();
    }
    return _data ? &*_data : nullptr;
}

std::string Resource::description() const {
    return std::string(className()) + " - guid: " + adminhost::textOf(_guid) + ", \n" +
           adminhost::textOf(_data ? Value(*_data) : Value());
}

}  // namespace lumio
