#include "adminhostd/AccountNames.h"

#include <cstdio>
#include <memory>

#include <fmt/format.h>
#include <pwd.h>

namespace adminhost {
namespace {

bool sameContent(const struct stat& a, const struct stat& b) {
    return a.st_dev == b.st_dev && a.st_ino == b.st_ino && a.st_size == b.st_size &&
           a.st_mtim.tv_sec == b.st_mtim.tv_sec && a.st_mtim.tv_nsec == b.st_mtim.tv_nsec;
}

}  // namespace

void AccountNames::readIfChanged() {
    const auto time = std::chrono::steady_clock::now();
    if (time < _lookFrom) {
        return;
    }
    _lookFrom = time + _pause;
    struct stat now {};
    if (::stat(_file.c_str(), &now) != 0) {
        _names.clear();
        _seen = {};
        return;
    }
    if (sameContent(now, _seen)) {
        return;
    }
    _seen = now;
    _names.clear();
    const std::unique_ptr<std::FILE, int (*)(std::FILE*)> file(std::fopen(_file.c_str(), "re"), &std::fclose);
    if (!file) {
        return;
    }
    // The C library's parser of the file, without its other sources of accounts. If several lines have one number, the
    // first names the account, as everywhere else.
    while (const passwd* line = ::fgetpwent(file.get())) {
        if (_names.size() < maximum) {
            _names.emplace(line->pw_uid, line->pw_name);
        }
    }
}

const std::string& AccountNames::of(uid_t uid) {
    static const std::string none;
    readIfChanged();
    const auto found = _names.find(uid);
    return found == _names.end() ? none : found->second;
}

std::string uidText(uid_t uid, const std::string& name) {
    return name.empty() ? fmt::format("uid {}", uid) : fmt::format("uid {} ({})", uid, name);
}

}  // namespace adminhost
