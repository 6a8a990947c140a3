#include "platform/directory/DirectoryRequest.h"

#include "platform/directory/Directory.h"
#include "platform/framework/Report.h"
#include "platform/task/TaskBounds.h"

#include <algorithm>
#include <map>
#include <set>

#include <fmt/format.h>

namespace adminhost {
namespace {

using Clock = std::chrono::steady_clock;

struct Request {
    Clock::time_point end = Clock::time_point::max();
    std::map<std::string, Error, std::less<>> failures;
    std::set<std::string, std::less<>> reported;  ///< nodes whose failure has been reported
    std::vector<std::shared_ptr<void>> kept;
};

std::optional<Request>& request() {
    static std::optional<Request> current;
    return current;
}

std::uint64_t lookUps = 0;

}  // namespace

void beginDirectoryRequest(std::optional<std::chrono::milliseconds> budget) {
    endDirectoryRequest();
    Request& begun = request().emplace();
    if (budget) {
        begun.end = Clock::now() + *budget;
    }
}

void endDirectoryRequest() noexcept {
    request().reset();
}

std::vector<UnreachableNode> unreachableDirectoryNodes(std::chrono::milliseconds limit) {
    std::vector<UnreachableNode> unreachable;
    const auto& sources = DirectorySession::defaultSession().nodes();
    const Clock::time_point end = Clock::now() + limit;
    for (std::size_t i = 0; i < sources.size(); ++i) {
        const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(end - Clock::now());
        // An equal share for each node that is left, so that one that does not respond cannot use the time of the
        // others.
        const auto share = std::max(left, std::chrono::milliseconds(0)) / static_cast<int>(sources.size() - i);
        const auto node = sources[i].open();
        const Result<void> reached = node ? (*node)->reach(share) : Result<void>(failure(node.error()));
        if (!reached) {
            unreachable.push_back({sources[i].name, reached.error().description.value_or("it cannot be reached")});
        }
    }
    return unreachable;
}

Clock::time_point directoryDeadline() noexcept {
    const Clock::time_point deadline = taskDeadline();
    return request() ? std::min(deadline, request()->end) : deadline;
}

bool isDirectoryTimeUsedUp() noexcept {
    constexpr auto tooLittle = std::chrono::milliseconds(10);
    return directoryDeadline() - tooLittle <= Clock::now();
}

std::optional<Error> failureInRequest(std::string_view node) {
    if (!request()) {
        return std::nullopt;
    }
    const auto found = request()->failures.find(node);
    return found == request()->failures.end() ? std::nullopt : std::optional(found->second);
}

void rememberFailure(std::string_view node, const Error& error) {
    if (request()) {
        request()->failures.insert_or_assign(std::string(node), error);
    }
}

void reportFailure(std::string_view node, const Error& error) {
    if (request() && !request()->reported.emplace(node).second) {
        return;
    }
    reportNotDone(
        {"",
         fmt::format("the directory node \"{}\" failed: people and groups may be missing, and lists of them empty",
                     node),
         error.description.value_or("")});
}

void keepForRequest(std::shared_ptr<void> object) {
    if (request()) {
        request()->kept.push_back(std::move(object));
    }
}

void dropFromRequest(const void* object) noexcept {
    if (request()) {
        std::erase_if(request()->kept, [&](const std::shared_ptr<void>& kept) { return kept.get() == object; });
    }
}

bool inDirectoryRequest() noexcept {
    return request().has_value();
}

std::uint64_t directoryLookups() noexcept {
    return lookUps;
}

void noteDirectoryLookup() noexcept {
    ++lookUps;
}

}  // namespace adminhost
