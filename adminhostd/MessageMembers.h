#pragma once

// The members of the messages between front and worker, and their names: for Protocol.cpp only.

#include "adminhostd/Protocol.h"

#include <cstddef>
#include <tuple>

namespace adminhost::protocol {

template <class Owner, class T>
struct Member {
    const char* name;
    T Owner::*place;
};

template <class Owner, class T>
consteval Member<Owner, T> member(const char* name, T Owner::*place) {
    return {name, place};
}

/// A message's members and their names. The names occur nowhere else: scripts/message_members.py looks for them.
template <class T>
constexpr std::nullptr_t members = nullptr;

template <>
constexpr auto members<Caller> = std::tuple(member("caller.uid", &Caller::uid), member("caller.pid", &Caller::pid),
                                            member("caller.login", &Caller::login),
                                            member("caller.unit", &Caller::unit));
template <>
constexpr auto members<Configure> = std::tuple(
    member("configure.build", &Configure::build), member("configure.root", &Configure::root),
    member("configure.accountUuids", &Configure::accountUuids),
    member("configure.serviceManager", &Configure::serviceManager), member("configure.plugins", &Configure::plugins),
    member("configure.refused", &Configure::refused), member("configure.languages", &Configure::languages),
    member("configure.toolEnvironment", &Configure::toolEnvironment),
    member("configure.directory", &Configure::directory),
    member("configure.directoryMilliseconds", &Configure::directoryMilliseconds),
    member("configure.frontAccount", &Configure::frontAccount), member("configure.tryOnly", &Configure::tryOnly),
    member("configure.probeDirectory", &Configure::probeDirectory));
template <>
constexpr auto members<DirectoryNodeOptions> = std::tuple(member("node.local", &DirectoryNodeOptions::local),
                                                          member("node.settings", &DirectoryNodeOptions::settings),
                                                          member("node.places", &DirectoryNodeOptions::places));
template <>
constexpr auto members<LdapNodeSettings> = std::tuple(
    member("ldap.name", &LdapNodeSettings::name), member("ldap.uris", &LdapNodeSettings::uris),
    member("ldap.base", &LdapNodeSettings::base), member("ldap.userBase", &LdapNodeSettings::userBase),
    member("ldap.groupBase", &LdapNodeSettings::groupBase), member("ldap.userFilter", &LdapNodeSettings::userFilter),
    member("ldap.groupFilter", &LdapNodeSettings::groupFilter), member("ldap.bindDn", &LdapNodeSettings::bindDn),
    member("ldap.bindPasswordFile", &LdapNodeSettings::bindPasswordFile),
    member("ldap.bindPasswordCredential", &LdapNodeSettings::bindPasswordCredential),
    member("ldap.sasl", &LdapNodeSettings::sasl), member("ldap.certFile", &LdapNodeSettings::certFile),
    member("ldap.keyFile", &LdapNodeSettings::keyFile), member("ldap.keytab", &LdapNodeSettings::keytab),
    member("ldap.principal", &LdapNodeSettings::principal), member("ldap.startTls", &LdapNodeSettings::startTls),
    member("ldap.caFile", &LdapNodeSettings::caFile), member("ldap.verify", &LdapNodeSettings::verify),
    member("ldap.schema", &LdapNodeSettings::schema), member("ldap.uuidForm", &LdapNodeSettings::uuidForm),
    member("ldap.kerberosRealm", &LdapNodeSettings::kerberosRealm), member("ldap.userMap", &LdapNodeSettings::userMap),
    member("ldap.groupMap", &LdapNodeSettings::groupMap), member("ldap.timeout", &LdapNodeSettings::timeout),
    member("ldap.createBase", &LdapNodeSettings::createBase),
    member("ldap.objectClasses", &LdapNodeSettings::objectClasses),
    member("ldap.createAttributes", &LdapNodeSettings::createAttributes));
template <>
constexpr auto members<Perform> = std::tuple(
    member("perform.request", &Perform::request), member("perform.plugin", &Perform::plugin),
    member("perform.command", &Perform::command), member("perform.caller", &Perform::caller),
    member("perform.received", &Perform::received), member("perform.arguments", &Perform::arguments),
    member("perform.revisions", &Perform::revisions), member("perform.showsRevision", &Perform::showsRevision),
    member("perform.keepsHistory", &Perform::keepsHistory), member("perform.checkOnly", &Perform::checkOnly),
    member("perform.milliseconds", &Perform::milliseconds), member("perform.form", &Perform::form));
template <>
constexpr auto members<FindAccounts> = std::tuple(member("findAccounts.match", &FindAccounts::match),
                                                  member("findAccounts.is", &FindAccounts::is),
                                                  member("findAccounts.form", &FindAccounts::form));
template <>
constexpr auto members<ReadHistory> = std::tuple(member("readHistory.plugin", &ReadHistory::plugin),
                                                 member("readHistory.form", &ReadHistory::form));
template <>
constexpr auto members<Diagnose> = std::tuple(member("diagnose.milliseconds", &Diagnose::milliseconds));
template <>
constexpr auto members<ReadLog> = std::tuple(member("readLog.plugin", &ReadLog::plugin),
                                             member("readLog.name", &ReadLog::name),
                                             member("readLog.inode", &ReadLog::inode),
                                             member("readLog.offset", &ReadLog::offset),
                                             member("readLog.milliseconds", &ReadLog::milliseconds),
                                             member("readLog.form", &ReadLog::form));
template <>
constexpr auto members<Command> = std::tuple(
    member("command.name", &Command::name), member("command.access", &Command::access),
    member("command.showsRevision", &Command::showsRevision), member("command.takesRevision", &Command::takesRevision),
    member("command.needs", &Command::needs), member("command.deadline", &Command::deadline),
    member("command.served", &Command::served), member("command.description", &Command::description));
template <>
constexpr auto members<OfferedPlugin> = std::tuple(member("offered.name", &OfferedPlugin::name),
                                                   member("offered.version", &OfferedPlugin::version),
                                                   member("offered.file", &OfferedPlugin::file),
                                                   member("offered.commands", &OfferedPlugin::commands));
template <>
constexpr auto members<RefusedPlugin> = std::tuple(member("refused.file", &RefusedPlugin::file),
                                                   member("refused.reason", &RefusedPlugin::reason));
template <>
constexpr auto members<Hello> = std::tuple(member("hello.plugins", &Hello::plugins),
                                           member("hello.refused", &Hello::refused),
                                           member("hello.problems", &Hello::problems));
template <>
constexpr auto members<ReadAudit> = std::tuple(member("readAudit.since", &ReadAudit::since),
                                               member("readAudit.user", &ReadAudit::user),
                                               member("readAudit.key", &ReadAudit::key),
                                               member("readAudit.after", &ReadAudit::after),
                                               member("readAudit.milliseconds", &ReadAudit::milliseconds),
                                               member("readAudit.form", &ReadAudit::form));
template <>
constexpr auto members<Proceed> = std::tuple(member("proceed.request", &Proceed::request));
template <>
constexpr auto members<Recorded> = std::tuple(member("recorded.request", &Recorded::request));
template <>
constexpr auto members<Begun> = std::tuple(member("begun.request", &Begun::request), member("begun.user", &Begun::user),
                                           member("begun.loginUser", &Begun::loginUser),
                                           member("begun.problem", &Begun::problem));
template <>
constexpr auto members<Unfinished> = std::tuple(
    member("unfinished.request", &Unfinished::request), member("unfinished.plugin", &Unfinished::plugin),
    member("unfinished.command", &Unfinished::command), member("unfinished.access", &Unfinished::access),
    member("unfinished.caller", &Unfinished::caller), member("unfinished.user", &Unfinished::user),
    member("unfinished.loginUser", &Unfinished::loginUser), member("unfinished.changes", &Unfinished::changes),
    member("unfinished.notDone", &Unfinished::notDone), member("unfinished.end", &Unfinished::end));
template <>
constexpr auto members<Log> = std::tuple(member("log.event", &Log::event));
template <>
constexpr auto members<Change> = std::tuple(member("change.section", &Change::section),
                                            member("change.identity", &Change::identity),
                                            member("change.name", &Change::name), member("change.key", &Change::key),
                                            member("change.from", &Change::from), member("change.to", &Change::to),
                                            member("change.secret", &Change::secret),
                                            member("change.undo", &Change::undo),
                                            member("change.unverified", &Change::unverified));
template <>
constexpr auto members<NotDone> = std::tuple(member("notDone.keyPath", &NotDone::keyPath),
                                             member("notDone.reason", &NotDone::reason),
                                             member("notDone.toolMessage", &NotDone::toolMessage));
template <>
constexpr auto members<SecretPart> = std::tuple(member("secretPart.section", &SecretPart::section),
                                                member("secretPart.identity", &SecretPart::identity),
                                                member("secretPart.key", &SecretPart::key));
template <>
constexpr auto members<Finding> = std::tuple(member("finding.keyPath", &Finding::keyPath),
                                             member("finding.rule", &Finding::rule),
                                             member("finding.advice", &Finding::advice));
template <>
constexpr auto members<Diagnosis> = std::tuple(member("check.health", &Diagnosis::health),
                                               member("check.name", &Diagnosis::name),
                                               member("check.found", &Diagnosis::found),
                                               member("check.fix", &Diagnosis::fix));
/// Answer::bytes is not among them: it follows the dictionary in the frame.
template <>
constexpr auto members<Answer> =
    std::tuple(member("answer.outcome", &Answer::outcome), member("answer.error", &Answer::error),
               member("answer.message", &Answer::message), member("answer.findings", &Answer::findings),
               member("answer.checks", &Answer::checks), member("answer.revision", &Answer::revision),
               member("answer.form", &Answer::form), member("answer.toolRuns", &Answer::toolRuns),
               member("answer.directoryLookups", &Answer::directoryLookups),
               member("answer.residentBytes", &Answer::residentBytes));

}  // namespace adminhost::protocol
