#pragma once

// The base of every Kerberos object but the context and the credential: its context and the status it recorded last.

#include "krb5/Handle.h"
#include "krb5/KRB5Context.h"

#include <cerrno>
#include <cstdint>
#include <memory>
#include <string>

namespace lumio {

/// Base class only. As the base, it drops the context after the derived object has freed its handle.
class KRB5Object {
  public:
    KRB5Object(const KRB5Object&) = delete;
    KRB5Object& operator=(const KRB5Object&) = delete;
    KRB5Object& operator=(KRB5Object&&) = delete;

    [[nodiscard]] const std::shared_ptr<KRB5Context>& context() const noexcept { return _context; }
    [[nodiscard]] std::int64_t errorCode() const noexcept { return _errorCode; }
    /// The library's text for errorCode(), also for 0.
    [[nodiscard]] std::string errorMessage() const;

  protected:
    /// Records the context's own error if it has no native context.
    explicit KRB5Object(std::shared_ptr<KRB5Context> context) noexcept;
    KRB5Object(KRB5Object&&) noexcept = default;
    ~KRB5Object() = default;

    [[nodiscard]] krb5_context nativeContext() const noexcept { return _context ? _context->nativeContext() : nullptr; }
    /// Returns true if the status is success.
    bool record(krb5_error_code status) const noexcept {
        _errorCode = status;
        return status == 0;
    }
    /// Used in place of a call that would crash the library without a handle. Keeps the error of the failed
    /// construction, which is more specific.
    void recordMissingHandle() const noexcept {
        if (_errorCode == 0) {
            _errorCode = EINVAL;
        }
    }

  private:
    std::shared_ptr<KRB5Context> _context;
    mutable std::int64_t _errorCode = 0;
};

}  // namespace lumio
