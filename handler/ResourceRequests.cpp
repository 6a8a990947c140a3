#include "handler/LumioRequestHandler.h"
#include "platform/framework/Report.h"
#include "platform/log/Log.h"
#include "platform/value/ValueText.h"
#include "resources/Camera.h"
#include "resources/Property.h"
#include "resources/Workflow.h"

namespace lumio {

using adminhost::Array;
using adminhost::Dictionary;
using adminhost::Error;
using adminhost::logEvent;
using adminhost::Response;
using adminhost::Value;

namespace {

/// The answer of a listing that failed: the status alone, neither command nor list.
Response failedListing(const std::optional<Error>& error) {
    return Dictionary{{"readStatus", error ? error->code : -1}};
}

Response listing(std::string_view command, std::string_view key, Array list) {
    Dictionary answer{{"command", command}};
    answer.set(key, std::move(list));
    answer.set("readStatus", 0);
    return answer;
}

/// Applies each change entry in order, with its index; an element that is not a dictionary is passed over.
template <class Change>
void forEachEntry(const Array* changes, Change change) {
    if (changes == nullptr) {
        return;
    }
    for (std::size_t index = 0; index < changes->size(); ++index) {
        if (const Dictionary* entry = (*changes)[index].dictionary()) {
            change(*entry, index);
        }
    }
}

/// Reports that a change entry of the list was not carried out.
void reportEntryNotDone(std::string_view list, std::size_t index, std::string reason, const Error& error) {
    adminhost::reportNotDone(
        {"configuration." + std::string(list) + '.' + std::to_string(index), std::move(reason), textOf(error)});
}

std::optional<std::string> identifierOf(const Dictionary& entry) {
    const Value* identifier = entry.find("_id_");
    return identifier == nullptr ? std::nullopt : std::optional(textOf(*identifier));
}

/// Applies the access switch and the access-list changes of an entry.
void changeAccess(Resource& resource, const Dictionary& entry) {
    if (const Value* enabled = entry.find("access_control_enabled")) {
        resource.setACLEnabled(flagOf(*enabled));
    }
    resource.changeACLsWithRequest(entry.get("allowedUsersAndGroups").array());
}

/// The languages in which texts are wanted, most preferred first: the request's, else the host's.
std::vector<std::string> languagesOf(const Dictionary& request) {
    const Value& requested = request.at("optionalArguments.languages");
    const Value& value = requested.isNull() ? adminhost::userDefault("BrennLanguages") : requested;
    std::vector<std::string> languages;
    if (const Array* array = value.array()) {
        for (const Value& language : *array) {
            if (const std::string* text = language.string()) {
                languages.push_back(*text);
            }
        }
    }
    return languages;
}

}  // namespace

Response LumioRequestHandler::getCamerasWithRequest(const Dictionary&) {
    std::optional<Error> error;
    const auto cameras = Camera::allCamerasWithError(error);
    if (!cameras) {
        return failedListing(error);
    }
    Resource::expandAll(*cameras);
    Array list;
    list.reserve(cameras->size());
    for (const auto& camera : *cameras) {
        list.emplace_back(*std::move(*camera).takeDictionary());
    }
    return listing("getCameras", "cameras", std::move(list));
}

Response LumioRequestHandler::processCameraChangesWithRequest(const Array* changes) {
    forEachEntry(changes, [](const Dictionary& entry, std::size_t index) {
        const auto camera = Camera::initWithGUID(identifierOf(entry));
        if (flagOf(entry.get("_obsoleteid_"))) {
            if (const auto error = camera->delete_()) {
                logEvent("adminhost_lumio: could not delete camera with uuid: " + textOf(entry.get("_id_")) +
                         ", error: " + textOf(*error));
                reportEntryNotDone("cameras", index, "the camera was not removed", *error);
            }
            return;
        }
        changeAccess(*camera, entry);
    });
    return nullptr;
}

Response LumioRequestHandler::getWorkflowsWithRequest(const Dictionary& request) {
    std::optional<Error> error;
    const auto workflows = Workflow::allWorkflowsWithError(error);
    if (!workflows) {
        return failedListing(error);
    }
    const std::vector<std::string> languages = languagesOf(request);
    Array list;
    list.reserve(workflows->size());
    for (const auto& workflow : *workflows) {
        workflow->localizeUsingLanguages(languages);
        list.emplace_back(*workflow->dictionary());
    }
    return listing("getWorkflows", "workflows", std::move(list));
}

Response LumioRequestHandler::getPropertiesWithRequest(const Dictionary& request) {
    std::optional<Error> error;
    const auto properties = Property::allPropertiesUsingLocalizations(languagesOf(request), error);
    if (!properties) {
        return failedListing(error);
    }
    Array list;
    list.reserve(properties->size());
    for (const auto& property : *properties) {
        std::move(*property).addDataDictionaryToMutableArray(list);
    }
    return listing("getProperties", "properties", std::move(list));
}

Response LumioRequestHandler::setWorkflowACLWithRequest(const Array* changes) {
    forEachEntry(changes, [](const Dictionary& entry, std::size_t) {
        changeAccess(*Workflow::initWithGUID(identifierOf(entry)), entry);
    });
    return nullptr;
}

Response LumioRequestHandler::processPropertyChangesWithRequest(const Array* changes) {
    forEachEntry(changes, [](const Dictionary& entry, std::size_t index) {
        const Value& id = entry.get("_id_");
        // An entry that is both obsolete and new is deleted.
        if (flagOf(entry.get("_obsoleteid_"))) {
            if (const auto error = Property::deletePropertyWithID(id)) {
                logEvent("adminhost_lumio: could not delete property with id: " + textOf(id) +
                         ", error: " + textOf(*error));
                reportEntryNotDone("properties", index, "the property was not removed", *error);
            }
        } else if (flagOf(entry.get("_newid_"))) {
            if (const auto error = Property::initNewPropertyWithDictionary(entry)->write()) {
                logEvent("adminhost_lumio: could not insert new property: " + textOf(*error));
                reportEntryNotDone("properties", index, "the property was not added", *error);
            }
        } else {
            logEvent("adminhost_lumio: update property");
            const std::unique_ptr<Property> property = Property::initWithChangeRequest(entry);
            logEvent("adminhost_lumio: update property -> write");
            if (const auto error = property->write()) {
                logEvent("adminhost_lumio: could not update property with id: " + textOf(id) +
                         ", error: " + textOf(*error));
                reportEntryNotDone("properties", index, "the property was not changed", *error);
            }
        }
    });
    return nullptr;
}

}  // namespace lumio
