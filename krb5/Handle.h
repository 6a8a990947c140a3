#pragma once

// Sole owner of one handle of the Kerberos library.

#include <utility>

#include <krb5.h>

namespace lumio {

/// Frees its handle with Free and the context that the handle was created with; that context must outlive it.
/// Move-only; a moved-from owner is empty.
template <class Native, auto Free>
class Handle {
  public:
    explicit Handle(krb5_context context, Native native = nullptr) noexcept : _context(context), _native(native) {}
    Handle(Handle&& other) noexcept : _context(other._context), _native(other.release()) {}
    Handle(const Handle&) = delete;
    Handle& operator=(const Handle&) = delete;
    Handle& operator=(Handle&&) = delete;
    ~Handle() { reset(); }

    [[nodiscard]] Native get() const noexcept { return _native; }
    /// For a library call that creates the handle; the one owned before is freed.
    [[nodiscard]] Native* receive() noexcept {
        reset();
        return &_native;
    }
    /// Releases the handle without freeing it.
    [[nodiscard]] Native release() noexcept { return std::exchange(_native, nullptr); }
    void reset() noexcept {
        if (_native != nullptr) {
            static_cast<void>(Free(_context, release()));
        }
    }

  private:
    krb5_context _context;
    Native _native;
};

using PrincipalHandle = Handle<krb5_principal, krb5_free_principal>;
using UnparsedName = Handle<char*, krb5_free_unparsed_name>;

}  // namespace lumio
