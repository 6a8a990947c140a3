#include "adminhostctl/DoctorVerb.h"

#include "adminhostctl/Width.h"
#include "platform/release/Release.h"
#include "platform/value/Value.h"

#include <algorithm>
#include <cerrno>
#include <cstring>

#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost::ctl {
namespace {

constexpr std::string_view okState = "ok";
constexpr std::string_view warningState = "warning";
constexpr std::string_view failureState = "failure";
constexpr std::string_view ownRelease = ADMINHOST_RELEASE;

Dictionary check(std::string_view name, std::string_view state, const std::string& found, const std::string& fix) {
    return {{"name", name}, {"state", state}, {"found", found}, {"fix", fix}};
}

Dictionary releaseCheck(const Value& overview) {
    const std::string release(overview.dictionary() == nullptr ? "" : overview.dictionary()->text("release"));
    if (release == ownRelease) {
        return check("command line", okState,
                     fmt::format("The command line and the daemon have the release {}.", ownRelease), "");
    }
    return check("command line", warningState,
                 fmt::format("The command line has the release {}, and the daemon {}.", ownRelease, release),
                 "install the same release of both, and restart the daemon (systemctl restart adminhostd)");
}

/// What can be seen of the socket without the daemon.
Dictionary socketCheck(const std::string& path) {
    struct stat status {};
    if (::stat(path.c_str(), &status) != 0) {
        const int number = errno;
        return check("socket", failureState, path + ": " + std::strerror(number) + '.',
                     number == EACCES
                         ? "run the command as root"
                         : "start the daemon (systemctl start adminhostd), or name its socket with --socket");
    }
    if (!S_ISSOCK(status.st_mode)) {
        return check("socket", failureState, path + " is not a socket.", "remove it, and restart the daemon");
    }
    const std::string found = fmt::format("{} belongs to uid {}, gid {}, mode {:04o}.", path, status.st_uid,
                                          status.st_gid, status.st_mode & 07777U);
    if (::access(path.c_str(), R_OK | W_OK) != 0) {
        return check("socket", failureState, found + " This account may not open it.", "run the command as root");
    }
    return check("socket", okState, found, "");
}

/// The checks that remain if the daemon does not serve them.
Array ownChecks(const Context& context, const std::string& why) {
    const std::string where = context.service.isRemote() ? "on " + context.service.place() + " " : "";
    Array checks{check("daemon", failureState, why,
                       "see its log " + where + "(journalctl -u adminhostd); adminhostd --check shows more")};
    if (!context.service.isRemote()) {
        checks.emplace_back(socketCheck(context.service.place()));
    }
    checks.emplace_back(
        check("command line", okState, fmt::format("The command line has the release {}.", ownRelease), ""));
    return checks;
}

/// A state that this release does not know is a failure: it must not look as if everything were in order.
std::string_view stateOf(const Value& check) {
    const std::string* state = check.dictionary() == nullptr ? nullptr : check.dictionary()->get("state").string();
    return state != nullptr && (*state == okState || *state == warningState) ? std::string_view(*state) : failureState;
}

std::size_t countOf(const Array& checks, std::string_view state) {
    return static_cast<std::size_t>(
        std::count_if(checks.begin(), checks.end(), [&](const Value& one) { return stateOf(one) == state; }));
}

void printPage(const Context& context, const Array& checks) {
    constexpr std::size_t stateWidth = 9;
    constexpr std::size_t widestName = 32;  // a longer one has a line of its own
    std::size_t nameWidth = 0;
    for (const Value& one : checks) {
        const std::size_t width = widthOf(shown(one.dictionary()->text("name")));
        nameWidth = width > widestName ? nameWidth : std::max(nameWidth, width);
    }
    const TextPlace place{stateWidth + nameWidth + 2, stateWidth, context.options.width};
    for (const Value& one : checks) {
        const std::string_view state = stateOf(one);
        std::string name = state == okState ? "ok" : state == warningState ? "WARNING" : "FAILURE";
        name.append(stateWidth - name.size(), ' ').append(shown(one.dictionary()->text("name")));
        context.out << beside(name, shown(one.dictionary()->text("found")), place);
        if (const std::string fix = shown(one.dictionary()->text("fix")); !fix.empty()) {
            context.out << beside(std::string(stateWidth, ' '), "fix: " + fix, place);
        }
    }
    context.out << fmt::format("{} checks: {} ok, {} warnings, {} failures\n", checks.size(), countOf(checks, okState),
                               countOf(checks, warningState), countOf(checks, failureState));
}

}  // namespace

ExitStatus doctor(const Context& context, std::span<const std::string>) {
    Array checks;
    bool asked = true;
    try {
        const Value overview = context.service.overview();
        const Value answer = context.service.get("/v1/doctor");
        const Array* list = answer.dictionary() == nullptr ? nullptr : answer.dictionary()->get("checks").array();
        for (const Value& one : list == nullptr ? Array{} : *list) {
            if (one.dictionary() != nullptr) {
                checks.push_back(one);
            }
        }
        checks.emplace_back(releaseCheck(overview));
    } catch (const Failure& failure) {
        checks = ownChecks(context, failure.what());
        asked = false;
    }
    if (context.options.format == Format::text) {
        printPage(context, checks);
    } else {
        writeValue(context, Dictionary{{"checks", checks}}, Description());
    }
    return !asked                                     ? ExitStatus::notChecked
           : countOf(checks, failureState) > 0        ? ExitStatus::failures
           : countOf(checks, okState) < checks.size() ? ExitStatus::warnings
                                                      : ExitStatus::done;
}

}  // namespace adminhost::ctl
