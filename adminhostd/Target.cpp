#include "adminhostd/Target.h"

namespace adminhost {

Target targetOf(std::string_view path) {
    using Kind = Target::Kind;
    constexpr std::string_view root = "/v1";
    if (path == root) {
        path = "/v1/";
    }
    if (!path.starts_with("/v1/")) {
        return {};
    }
    path.remove_prefix(root.size() + 1);
    if (path.empty()) {
        return {Kind::overview, {}, {}};
    }
    const std::size_t slash = path.find('/');
    const std::string first(path.substr(0, slash));
    const std::string second(slash == std::string_view::npos ? std::string_view() : path.substr(slash + 1));
    if (first == "requests") {
        return {second.empty() ? Kind::unknown : Kind::request, {}, second};
    }
    if (path == "directory") {
        return {Kind::directory, {}, first};
    }
    if (path == "doctor") {
        return {Kind::doctor, {}, first};
    }
    if (path == "events") {
        return {Kind::events, {}, first};
    }
    if (path == "metrics") {
        return {Kind::metrics, {}, first};
    }
    if (path == "audit") {
        return {Kind::audit, {}, first};
    }
    if (first == "logs") {
        return {Kind::logs, {}, second};
    }
    if (second == "history") {
        return {Kind::history, first, second};
    }
    return {second.empty() ? Kind::plugin : Kind::command, first, second};
}

}  // namespace adminhost
