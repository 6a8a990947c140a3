#include "platform/directory/LdapLookUps.h"

#include "platform/directory/DirectoryRequest.h"
#include "platform/directory/LdapQuery.h"

namespace adminhost {

Result<std::vector<DirectoryRecord>> LdapLookUps::records(const DirectoryQuery& query) {
    return run<std::vector<DirectoryRecord>>(
        [&](LdapConnection& connection) { return ldapRecords(connection, _mapping, _settings.name, query); });
}

Result<void> LdapLookUps::reach(std::chrono::milliseconds limit) {
    _kept.reset();  // that it was good earlier proves nothing
    return open(Clock::now() + limit);
}

Result<std::unique_ptr<LdapConnection>> LdapLookUps::signIn(const LdapSignIn& user) {
    return LdapConnection::open(_settings, _credential, &user, Clock::time_point::max());
}

Result<void> LdapLookUps::open(Clock::time_point end) {
    if (const auto error = failureInRequest(_settings.name)) {
        return failure(*error);
    }
    if (isDirectoryTimeUsedUp()) {
        return failure(ldapError(LDAP_TIMEOUT, _settings.name, "the time for the directory is used up"));
    }
    if (_kept) {
        return {};
    }
    auto opened = LdapConnection::open(_settings, _credential, nullptr, end);
    if (!opened) {
        // Whatever the reason: a wrong password, tried again by each query of the request, might lock the account.
        rememberFailure(_settings.name, opened.error());
        return failure(opened.error());
    }
    _kept = *std::move(opened);
    return {};
}

bool LdapLookUps::wentAway(const Error& error) noexcept {
    // A server that does not respond in time is not asked again: it has had its time.
    return isUnreachable(error.code) && error.code != LDAP_TIMEOUT;
}

void LdapLookUps::note(const Error& error) {
    if (isUnreachable(error.code)) {
        _kept.reset();
        rememberFailure(_settings.name, error);
    }
}

}  // namespace adminhost
