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
    return Response::error(code, messageForError(code));
}

std::string PluginRequestHandler::messageForError(std::string_view code) const {
    if (code == "INTERNAL_ERROR") {
        return "The operation failed inside the plug-in. The log lines of this request give the reason.";
    }
    return "The plug-in returned an error.";
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
