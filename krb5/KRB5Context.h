#pragma once

// The Kerberos library's context, and the rules that all objects of this room share:
//
// - Each object owns exactly one native handle; a handle from elsewhere is copied first, so no handle is shared.
// - Every object holds a shared reference to the context it was created with, dropped after its own handle is freed.
// - Only KRB5CredentialCache::initWithName throws, without name and principal. An operation that fails returns
//   null, nullopt, false or an empty list. errorCode() is then the status of the last library call that the object
//   recorded (0 = success). Reading operations record too, and do so on const objects.
// - No object may be used by two threads at once. That holds for all objects of one context together.
// - Texts of principals and realms are UTF-8; one that is not counts as missing. File names of keytabs and caches are
//   bytes of the file system's own encoding.
//
// Deliberately unlike the library, which crashes or errs silently there:
// - Operations on a missing native handle never reach the library. Texts are null, lists empty, tests false; where a
//   status would be recorded and there is none from the failed construction, it is EINVAL.
// - A text with a NUL byte inside is refused (EINVAL): the library would stop at the NUL and act on another name.

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include <krb5.h>

namespace lumio {

class KRB5CredentialCache;
class KRB5Keytab;

class KRB5Context : public std::enable_shared_from_this<KRB5Context> {
  public:
    /// A new context. If the library could not create it (a malformed krb5.conf), the object has its errorCode set.
    /// Returns null only if the library gave neither a context nor an error.
    [[nodiscard]] static std::shared_ptr<KRB5Context> init();
    /// The same.
    [[nodiscard]] static std::shared_ptr<KRB5Context> context();
    /// One context for the whole process, created by the first call and never freed. Creating it is safe between
    /// threads; using it is not.
    [[nodiscard]] static std::shared_ptr<KRB5Context> defaultContext();

    KRB5Context(const KRB5Context&) = delete;
    KRB5Context& operator=(const KRB5Context&) = delete;
    ~KRB5Context();

    /// Null if none is configured.
    [[nodiscard]] std::optional<std::string> defaultRealm() const;
    void setDefaultRealm(const std::string& realm);

    /// The library's default keytab. Null without a native context.
    [[nodiscard]] std::unique_ptr<KRB5Keytab> defaultKeytab();
    /// Sets KRB5_KTNAME of this process to "TYPE:NAME" of the keytab, or removes it (null). Records no status.
    void setDefaultKeytab(const KRB5Keytab* keytab) const;

    /// The library's default cache; null if it holds no principal yet, and without a native context.
    [[nodiscard]] std::unique_ptr<KRB5CredentialCache> defaultCredentialCache();
    /// Makes the cache the default of this context, by its bare name without the type: the library reads that as a file
    /// cache, so this suits file caches only. Null restores the library's own default.
    void setDefaultCredentialCache(const KRB5CredentialCache* cache);
    /// Makes the cache, by its bare name, the one that GSS-API uses on this thread; null restores the default. Returns
    /// the GSS major status.
    [[nodiscard]] static std::uint32_t setDefaultGSSCredentialCache(const KRB5CredentialCache* cache);

    [[nodiscard]] std::int64_t errorCode() const noexcept { return _errorCode; }
    /// The library's text for errorCode(), also for 0.
    [[nodiscard]] std::string errorMessage() const { return messageOf(_nativeContext, _errorCode); }
    /// The library's text for a code that a call with this context (which may be null) gave.
    [[nodiscard]] static std::string messageOf(krb5_context nativeContext, std::int64_t code);
    [[nodiscard]] krb5_context nativeContext() const noexcept { return _nativeContext; }

  private:
    KRB5Context() = default;

    krb5_context _nativeContext = nullptr;
    mutable std::int64_t _errorCode = 0;
};

}  // namespace lumio
