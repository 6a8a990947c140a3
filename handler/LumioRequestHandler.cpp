#include "handler/LumioRequestHandler.h"

namespace lumio {

using adminhost::Response;

Response LumioRequestHandler::recycleServiceWithVariant(const Value&) {
    return nullptr;
}

std::string LumioRequestHandler::messageForError(std::string_view code) const {
    if (code == "CANNOT_START_SERVICE_ERR") {
        return "The service cannot be started. Its startup log gives the reason.";
    }
    if (code == "CANNOT_STOP_SERVICE_ERR") {
        return "The service cannot be stopped. Its log gives the reason.";
    }
    return PluginRequestHandler::messageForError(code);
}

std::vector<std::string_view> LumioRequestHandler::listOfResourceDateKeys() {
    return {"updated_at", "created_at", "used_at"};
}

}  // namespace lumio
