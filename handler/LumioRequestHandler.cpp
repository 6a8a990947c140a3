#include "handler/LumioRequestHandler.h"

namespace lumio {

using adminhost::Response;

// Operations that this release declares but does not offer yet fail with an error, and never pretend to have succeeded.

Response LumioRequestHandler::getStateWithRequest(const Dictionary&) {
    return responseForError("NOT_AVAILABLE");
}
Response LumioRequestHandler::getLogPathsWithRequest(const Dictionary&) {
    return responseForError("NOT_AVAILABLE");
}
Response LumioRequestHandler::startServiceWithVariant(const Value&) {
    return responseForError("NOT_AVAILABLE");
}
Response LumioRequestHandler::stopServiceWithVariant(const Value&) {
    return responseForError("NOT_AVAILABLE");
}
Response LumioRequestHandler::validateSettingsWithRequest(const Dictionary&) {
    return responseForError("NOT_AVAILABLE");
}
Response LumioRequestHandler::createNimboAccountWithRequest(const Dictionary&) {
    return responseForError("NOT_AVAILABLE");
}

Response LumioRequestHandler::recycleServiceWithVariant(const Value&) {
    return nullptr;
}

std::vector<std::string_view> LumioRequestHandler::listOfResourceDateKeys() {
    return {"updated_at", "created_at", "used_at"};
}

}  // namespace lumio
