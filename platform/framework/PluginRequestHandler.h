#pragma once

// What the host gives a request handler: the base class, the forms of a response, the user defaults and random UUID
// texts.

#include "platform/framework/Export.h"
#include "platform/value/Value.h"

#include <string>
#include <string_view>
#include <utility>

namespace adminhost {

/// What an operation returns: a response dictionary, no response, or the framework's error response.
class ADMINHOST_EXPORT Response {
  public:
    enum class Kind { nothing, dictionary, error };

    /// No response.
    Response() noexcept = default;
    Response(std::nullptr_t) noexcept {}
    Response(Dictionary dictionary) noexcept : _kind(Kind::dictionary), _dictionary(std::move(dictionary)) {}
    /// The error response for a code text; a dictionary of "error" (the code) and "message" (a sentence for people).
    [[nodiscard]] static Response error(std::string_view code, std::string_view message);

    [[nodiscard]] Kind kind() const noexcept { return _kind; }
    /// Empty if there is no response.
    [[nodiscard]] const Dictionary& dictionary() const noexcept { return _dictionary; }
    [[nodiscard]] Dictionary& dictionary() noexcept { return _dictionary; }

  private:
    Kind _kind = Kind::nothing;
    Dictionary _dictionary;
};

/// Base of every request handler.
class ADMINHOST_EXPORT PluginRequestHandler {
  public:
    PluginRequestHandler() = default;
    PluginRequestHandler(const PluginRequestHandler&) = delete;
    PluginRequestHandler& operator=(const PluginRequestHandler&) = delete;
    virtual ~PluginRequestHandler() = default;

    /// The framework's standard error response for an error-code text.
    [[nodiscard]] Response responseForError(std::string_view code) const;

  protected:
    /// The sentence for people in that response. A handler overrides it for the codes of its own operations.
    [[nodiscard]] virtual std::string messageForError(std::string_view code) const;
};

/// The process's user defaults: values of the daemon's configuration that plug-ins read. Null for an unknown name.
[[nodiscard]] ADMINHOST_EXPORT const Value& userDefault(std::string_view name) noexcept;
/// Set by the worker before requests are served.
ADMINHOST_EXPORT void setUserDefault(std::string_view name, Value value);

/// A fresh random UUID (RFC 4122, version 4) in its canonical text of 36 characters, upper case.
[[nodiscard]] ADMINHOST_EXPORT std::string makeUUIDString();

}  // namespace adminhost
