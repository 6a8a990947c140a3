#include "handler/LumioRequestHandler.h"

namespace lumio {

using adminhost::Response;

Response LumioRequestHandler::recycleServiceWithVariant(const Value&) {
    return nullptr;
}

std::vector<std::string_view> LumioRequestHandler::listOfResourceDateKeys() {
    return {"updated_at", "created_at", "used_at"};
}

}  // namespace lumio
