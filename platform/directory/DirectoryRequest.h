#pragma once

// What the directory keeps for one request of a client: when its time is used up, the nodes that failed, and sign-ins.
//
// The worker serves one request at a time, so there is one such state in the process. Outside a request there is no
// budget, and a node that failed is tried again by the next query.

#include "platform/framework/Export.h"
#include "platform/value/Error.h"

#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost {

/// Begins a request. All directory work until endDirectoryRequest() has this much time together, counted from now;
/// without a budget only the deadline of the request counts. A Kerberos exchange cannot be interrupted: it may end
/// later. Ends a request that is still open.
ADMINHOST_EXPORT void beginDirectoryRequest(std::optional<std::chrono::milliseconds> budget);

/// Ends the request: sign-ins are dropped, and nodes that failed may be tried again.
ADMINHOST_EXPORT void endDirectoryRequest() noexcept;

/// beginDirectoryRequest() and endDirectoryRequest() for a scope.
class ADMINHOST_EXPORT DirectoryRequestScope {
  public:
    explicit DirectoryRequestScope(std::optional<std::chrono::milliseconds> budget) { beginDirectoryRequest(budget); }
    DirectoryRequestScope(const DirectoryRequestScope&) = delete;
    DirectoryRequestScope& operator=(const DirectoryRequestScope&) = delete;
    ~DirectoryRequestScope() { endDirectoryRequest(); }
};

struct ADMINHOST_EXPORT UnreachableNode {
    std::string name;
    std::string reason;  ///< in words for people, without secrets
};

/// Tries to connect to every node of the default session, for at most the limit for all nodes together, and returns
/// those that cannot be used. A node that still has time left for it is tried even if one before it does not respond.
[[nodiscard]] ADMINHOST_EXPORT std::vector<UnreachableNode> unreachableDirectoryNodes(
    std::chrono::milliseconds limit = std::chrono::seconds(5));

/// How many look-ups this process has made in the nodes of the directory.
[[nodiscard]] ADMINHOST_EXPORT std::uint64_t directoryLookups() noexcept;

// For back ends.

/// Counts a look-up.
void noteDirectoryLookup() noexcept;

/// When directory work must end: the end of the budget or the deadline of the request's tools, whichever comes first;
/// the maximum for none.
[[nodiscard]] std::chrono::steady_clock::time_point directoryDeadline() noexcept;

/// True when that moment has come, or is so near that nothing more can be done: the library's waits end a little early.
[[nodiscard]] bool isDirectoryTimeUsedUp() noexcept;

/// The error with which the node failed in this request, if it is not to be tried again.
[[nodiscard]] std::optional<Error> failureInRequest(std::string_view node);
/// Remembers that the node is not to be tried again in this request. Does nothing outside a request.
void rememberFailure(std::string_view node, const Error& error);

/// Reports as not carried out that the node failed (platform/framework/Report.h), once for each node in a request:
/// what it knows is missing in the response, which looks as if nobody had access.
void reportFailure(std::string_view node, const Error& error);

/// Keeps the object until the end of the request, or outside a request not at all.
void keepForRequest(std::shared_ptr<void> object);
/// Drops an object that keepForRequest() keeps.
void dropFromRequest(const void* object) noexcept;
[[nodiscard]] bool inDirectoryRequest() noexcept;

}  // namespace adminhost
