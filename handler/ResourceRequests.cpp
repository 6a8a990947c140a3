#include "handler/LumioRequestHandler.h"
#include "platform/framework/Report.h"
#include "platform/log/Log.h"
#include "platform/value/ValueText.h"
#include "resources/AccessOverview.h"
#include "resources/Camera.h"
#include "resources/Property.h"
#include "resources/ToolWords.h"
#include "resources/Workflow.h"

namespace lumio {

using adminhost::Array;
using adminhost::Dictionary;
using adminhost::Error;
using adminhost::logEvent;
using adminhost::Response;
using adminhost::Value;

namespace {

/// The response of a listing that failed: the status alone, neither command nor list. The reason is reported.
Response failedListing(std::string_view what, const std::optional<Error>& error) {
    if (error) {
        adminhost::reportNotDone({"", "not read: the " + std::string(what), toolWords(*error)});
    }
    return Dictionary{{"readStatus", error ? error->code : -1}};
}

Response listing(std::string_view command, std::string_view key, Array list) {
    Dictionary answer{{"command", command}};
    answer.set(key, std::move(list));
    answer.set("readStatus", 0);
    return answer;
}

/// Applies each change entry of the configuration's list in order, with its key path; an element that is not a
/// dictionary is skipped.
template <class Apply>
void forEachEntry(std::string_view list, const Array* changes, Apply apply) {
    if (changes == nullptr) {
        return;
    }
    for (std::size_t index = 0; index < changes->size(); ++index) {
        const std::string keyPath = "configuration." + std::string(list) + '.' + std::to_string(index);
        if (const Dictionary* entry = (*changes)[index].dictionary()) {
            apply(*entry, keyPath);
        } else {
            adminhost::reportNotDone({keyPath, "ignored: the entry is not a dictionary", {}});
        }
    }
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
        return failedListing("cameras", error);
    }
    Resource::expandAll(*cameras);
    Array list;
    list.reserve(cameras->size());
    for (const auto& camera : *cameras) {
        list.emplace_back(*std::move(*camera).takeDictionary());
    }
    return listing("getCameras", "cameras", std::move(list));
}

Response LumioRequestHandler::getAccessWithRequest(const Dictionary& request) {
    auto resources = accessOverview(languagesOf(request));
    if (!resources) {
        logEvent("adminhost_lumio: could not read who may use what: " + textOf(resources.error()));
        return failedListing("cameras and workflows", resources.error());
    }
    return Dictionary{{"resources", *std::move(resources)}, {"readStatus", 0}};
}

Response LumioRequestHandler::removeAccessWithRequest(const Dictionary& request) {
    std::vector<std::string> resources;
    const Array* named = request.get("resources").array();
    for (const Value& resource : named != nullptr ? *named : Array()) {
        resources.push_back(textOf(resource));
    }
    if (named != nullptr && resources.empty()) {
        return Dictionary{{"removed", 0}, {"writeStatus", 0}};  // without names, all would be meant
    }
    const auto outcome = removeUnknownAccount(textOf(request.get("uuid")), resources);
    if (!outcome) {
        logEvent("adminhost_lumio: could not remove access: " + textOf(outcome.error()));
        return Dictionary{{"removed", 0},
                          {"writeStatus", 1},
                          {"errorDescription", outcome.error().description.value_or(textOf(outcome.error()))}};
    }
    return Dictionary{{"removed", outcome->removed}, {"writeStatus", outcome->left == 0 ? 0 : 1}};
}

Response LumioRequestHandler::processCameraChangesWithRequest(const Array* changes) {
    forEachEntry("cameras", changes, [](const Dictionary& entry, const std::string& keyPath) {
        const auto camera = Camera::initWithGUID(identifierOf(entry));
        camera->setKeyPath(keyPath);
        if (flagOf(entry.get("_obsoleteid_"))) {
            if (const auto error = camera->delete_()) {
                logEvent("adminhost_lumio: could not delete camera with uuid: " + textOf(entry.get("_id_")) +
                         ", error: " + textOf(*error));
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
        return failedListing("workflows", error);
    }
    const std::vector<std::string> languages = languagesOf(request);
    Array list;
    list.reserve(workflows->size());
    for (const auto& workflow : *workflows) {
        workflow->localizeUsingLanguages(languages);
        list.emplace_back(*std::move(*workflow).takeDictionary());
    }
    return listing("getWorkflows", "workflows", std::move(list));
}

Response LumioRequestHandler::getPropertiesWithRequest(const Dictionary& request) {
    std::optional<Error> error;
    auto records = Property::recordsUsingLocalizations(languagesOf(request), error);
    if (!records) {
        return failedListing("properties", error);
    }
    return listing("getProperties", "properties", *std::move(records));
}

Response LumioRequestHandler::setWorkflowACLWithRequest(const Array* changes) {
    forEachEntry("workflows", changes, [](const Dictionary& entry, const std::string& keyPath) {
        const auto workflow = Workflow::initWithGUID(identifierOf(entry));
        workflow->setKeyPath(keyPath);
        changeAccess(*workflow, entry);
    });
    return nullptr;
}

Response LumioRequestHandler::processPropertyChangesWithRequest(const Array* changes) {
    forEachEntry("properties", changes, [](const Dictionary& entry, const std::string& keyPath) {
        const Value& id = entry.get("_id_");
        // An entry that is both obsolete and new is deleted.
        if (flagOf(entry.get("_obsoleteid_"))) {
            if (const auto error = Property::deletePropertyWithID(id)) {
                logEvent("adminhost_lumio: could not delete property with id: " + textOf(id) +
                         ", error: " + textOf(*error));
                adminhost::reportNotDone({keyPath, "not removed: the database refused it", toolWords(*error)});
            } else if (id.isNull()) {
                adminhost::reportNotDone({keyPath, "not removed: the entry has no \"_id_\"", {}});
            }
        } else if (flagOf(entry.get("_newid_"))) {
            const std::unique_ptr<Property> property = Property::initNewPropertyWithDictionary(entry);
            property->setKeyPath(keyPath);
            if (const auto error = property->write()) {
                logEvent("adminhost_lumio: could not insert new property: " + textOf(*error));
            }
        } else {
            logEvent("adminhost_lumio: update property");
            const std::unique_ptr<Property> property = Property::initWithChangeRequest(entry);
            property->setKeyPath(keyPath);
            logEvent("adminhost_lumio: update property -> write");
            if (const auto error = property->write()) {
                logEvent("adminhost_lumio: could not update property with id: " + textOf(id) +
                         ", error: " + textOf(*error));
            }
        }
    });
    return nullptr;
}

}  // namespace lumio
