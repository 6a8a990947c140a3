#include "handler/LumioRequestHandler.h"
#include "resources/Camera.h"

namespace lumio {

using adminhost::Array;
using adminhost::Dictionary;
using adminhost::Error;
using adminhost::Response;

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

}  // namespace

Response LumioRequestHandler::getCamerasWithRequest(const Dictionary&) {
    std::optional<Error> error;
    const auto cameras = Camera::allCamerasWithError(error);
    if (!cameras) {
        return failedListing(error);
    }
    Array list;
    list.reserve(cameras->size());
    for (const auto& camera : *cameras) {
        list.emplace_back(*camera->dictionary());
    }
    return listing("getCameras", "cameras", std::move(list));
}

Response LumioRequestHandler::getWorkflowsWithRequest(const Dictionary&) {
    return responseForError("NOT_AVAILABLE");
}
Response LumioRequestHandler::getPropertiesWithRequest(const Dictionary&) {
    return responseForError("NOT_AVAILABLE");
}

Response LumioRequestHandler::setWorkflowACLWithRequest(const Array*) {
    return responseForError("NOT_AVAILABLE");
}
Response LumioRequestHandler::processCameraChangesWithRequest(const Array*) {
    return responseForError("NOT_AVAILABLE");
}
Response LumioRequestHandler::processPropertyChangesWithRequest(const Array*) {
    return responseForError("NOT_AVAILABLE");
}

}  // namespace lumio
