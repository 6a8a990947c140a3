#include "krb5/KRB5Object.h"

#include <utility>

namespace lumio {

KRB5Object::KRB5Object(std::shared_ptr<KRB5Context> context) noexcept : _context(std::move(context)) {
    if (nativeContext() == nullptr) {
        _errorCode = _context ? _context->errorCode() : 0;
        recordMissingHandle();
    }
}

std::string KRB5Object::errorMessage() const {
    return KRB5Context::messageOf(nativeContext(), _errorCode);
}

}  // namespace lumio
