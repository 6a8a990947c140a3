#include "platform/framework/PluginRequestHandler.h"

#include "platform/text/Uuid.h"

namespace adminhost {
namespace {

Dictionary& defaults() {
    static Dictionary values;
    return values;
}

}  // namespace

Response Response::error(std::string_view code, std::string_view message) {
    Response response(Dictionary{{"error", code}, {"message", message}});
    response._kind = Kind::error;
    return response;
}

Response PluginRequestHandler::responseForError(std::string_view code) const {
    struct Known {
        std::string_view code;
        std::string_view message;
    };
    constexpr Known known[] = {
        {"CANNOT_START_SERVICE_ERR", "The service could not be started. Its startup log says why."},
        {"CANNOT_STOP_SERVICE_ERR", "The service could not be stopped. Its log says why."},
        {"INTERNAL_ERROR", "The operation failed inside the plug-in. The log lines of this request say why."},
    };
    for (const Known& entry : known) {
        if (entry.code == code) {
            return Response::error(code, entry.message);
        }
    }
    return Response::error(code, "The plug-in answered an error.");
}

const Value& userDefault(std::string_view name) noexcept {
    return defaults().get(name);
}

void setUserDefault(std::string_view name, Value value) {
    defaults().set(name, std::move(value));
}

std::string makeUUIDString() {
    return textOf(randomUuid());
}

}  // namespace adminhost
