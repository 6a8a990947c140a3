#pragma once

// The messages between front and worker: one struct for each.
//
// They travel as frames (Frame.h). Dictionaries are only their encoding, which Protocol.cpp alone knows. Decoding is
// strict: an unknown word, a missing or surplus member and a value of another type are errors, and a peer that sent
// them is ended.

#include "adminhostd/DirectoryOptions.h"
#include "adminhostd/Frame.h"
#include "adminhostd/RequestBody.h"
#include "platform/framework/Plugin.h"
#include "platform/framework/Report.h"
#include "platform/service/ServiceState.h"
#include "platform/value/Result.h"
#include "platform/value/Value.h"

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include <sys/types.h>

namespace adminhost::protocol {

/// The outcome of a request in the worker. For the outcomes of requests that no worker finished see OperationQueue.h.
enum class Outcome {
    nothing,   ///< the operation returned nothing
    answered,  ///< bytes: the answer
    error,     ///< error, message; bytes: the error response
    later,     ///< error, message: it was not possible to run it now; the same request may be sent again
    refused,   ///< findings, never empty: the plug-in's check refuses the request
    conflict,  ///< none of the revisions is the present one
    overrun,   ///< the deadline passed
    locked,    ///< message: another process holds the lock for changes; nothing was done
    broken,    ///< message: the worker could not do it
    absent,    ///< error, message: what the request names does not exist
    checked,   ///< checks: of the installation
};

/// Every outcome.
[[nodiscard]] std::vector<Outcome> outcomes();

/// The client, as the kernel knew it when it connected.
struct Caller {
    uid_t uid = 0;
    pid_t pid = 0;
    uid_t login = 0;   ///< of its login session; noLogin: none
    std::string unit;  ///< of the service manager; empty: not known
    bool operator==(const Caller&) const = default;
};

// From the front to the worker.

struct OfferedPlugin {
    std::string name;
    std::string version;
    std::string file;
    std::vector<Command> commands;
    bool operator==(const OfferedPlugin&) const = default;
};
struct RefusedPlugin {
    std::string file;
    std::string reason;
    bool operator==(const RefusedPlugin&) const = default;
};

/// First, and once. The nodes have no credentialsDirectory: the worker knows it.
struct Configure {
    std::string build;  ///< the front's; must be the worker's
    std::string root;
    std::string accountUuids;                      ///< host path of a file; empty: none
    std::optional<ServiceManager> serviceManager;  ///< nullopt: the platform's default
    std::vector<std::string> plugins;
    std::vector<RefusedPlugin> refused;  ///< plug-ins that the monitor does not offer, for Hello
    std::vector<std::string> languages;
    std::map<std::string, std::string> toolEnvironment;
    std::vector<DirectoryNodeOptions> directory;  ///< empty: the accounts of this machine
    std::uint64_t directoryMilliseconds = 0;      ///< for all directory work of a request
    std::uint64_t frontAccount = 0;               ///< whose entries of the journal are the audit
    bool tryOnly = false;                         ///< only to see what loads: nothing is cleaned up
    bool probeDirectory = false;                  ///< only to log the nodes that cannot be reached: no Hello
    bool operator==(const Configure&) const = default;
};

/// One operation of a plug-in.
struct Perform {
    std::string request;  ///< its id
    std::string plugin;
    std::string command;
    Caller caller;
    Date received;
    Dictionary arguments;
    std::vector<std::string> revisions;  ///< one of them must be the present one; empty: no condition
    bool showsRevision = false;          ///< the answer is to carry the revision
    bool keepsHistory = false;           ///< the settings are to be kept before it runs
    bool checkOnly = false;              ///< only the plug-in's check is to run
    std::uint64_t milliseconds = 0;      ///< until its deadline
    BodyForm form = BodyForm::json;      ///< that the client prefers
    bool operator==(const Perform&) const = default;
};

/// People and groups by the beginning of their names or, if `is` is not empty, those with exactly that name or UUID.
struct FindAccounts {
    std::string match;
    std::string is;
    BodyForm form = BodyForm::json;
    bool operator==(const FindAccounts&) const = default;
};

/// The history of a plug-in's settings.
struct ReadHistory {
    std::string plugin;
    BodyForm form = BodyForm::json;
    bool operator==(const ReadHistory&) const = default;
};

/// Checks of the installation: the worker's own and those of its plug-ins.
struct Diagnose {
    std::uint64_t milliseconds = 0;  ///< until its deadline
    bool operator==(const Diagnose&) const = default;
};

/// A piece of a log file of a plug-in or, without a name, the names and sizes of all logs.
struct ReadLog {
    std::string plugin;              ///< empty: the first that has a log of this name
    std::string name;                ///< empty: all logs
    std::uint64_t inode = 0;         ///< of the file that an earlier piece came from; 0: none
    std::uint64_t offset = 0;        ///< of the first byte
    std::uint64_t milliseconds = 0;  ///< until its deadline
    BodyForm form = BodyForm::json;
    bool operator==(const ReadLog&) const = default;
};

/// A page of the audit.
struct ReadAudit {
    std::uint64_t since = 0;         ///< seconds since 1970
    std::string user;                ///< name or number of the account or of the login session's; empty: any
    std::string key;                 ///< of a change ("port", "cameras.users"); empty: any
    std::string after;               ///< `next` of an earlier page, which then counts instead of `since`; empty: none
    std::uint64_t milliseconds = 0;  ///< until its deadline
    BodyForm form = BodyForm::json;
    bool operator==(const ReadAudit&) const = default;
};

/// The reply to Begun: the beginning has been logged, and the operation may run.
struct Proceed {
    std::string request;
    bool operator==(const Proceed&) const = default;
};

/// The end of a request that had begun has been logged: the worker's note about it is not needed any more.
struct Recorded {
    std::string request;
    bool operator==(const Recorded&) const = default;
};

using ToWorker =
    std::variant<Configure, Perform, FindAccounts, ReadHistory, Diagnose, ReadLog, ReadAudit, Proceed, Recorded>;

// From the worker to the front.

/// The reply to Configure, unless that has probeDirectory.
struct Hello {
    std::vector<OfferedPlugin> plugins;
    std::vector<RefusedPlugin> refused;
    std::vector<std::string> problems;  ///< only if tryOnly: what commands need and is not usable
    bool operator==(const Hello&) const = default;
};

/// One event for the system log. Log, Change, NotDone and SecretPart are sent when they happen; while an operation runs
/// they belong to it.
struct Log {
    std::string event;
    bool operator==(const Log&) const = default;
};

/// An operation that may change something is about to run, and waits for Proceed.
struct Begun {
    std::string request;
    std::string user;       ///< the name of the caller's account; empty: not known
    std::string loginUser;  ///< and of its login session's
    std::string problem;    ///< why no note for the next daemon could be stored; empty if there is one
    bool operator==(const Begun&) const = default;
};

/// A request of an earlier worker whose end may not have been logged. Sent when no other process holds the lock for
/// changes; the reply is Recorded.
struct Unfinished {
    std::string request;
    std::string plugin;
    std::string command;
    Access access = Access::account;
    Caller caller;
    std::string user;
    std::string loginUser;
    std::vector<Change> changes;  ///< without secrets, and without what would undo them
    std::vector<NotDone> notDone;
    std::string end;  ///< what is known of its end, as a part of a sentence
    bool operator==(const Unfinished&) const = default;
};

/// The reply to every message that asks for something.
struct Answer {
    Outcome outcome = Outcome::broken;
    std::string error;               ///< a code
    std::string message;             ///< a sentence
    std::vector<Finding> findings;   ///< of refused
    std::vector<Diagnosis> checks;   ///< of checked
    std::string revision;            ///< after the operation; empty: not asked for, or not known
    BodyForm form = BodyForm::json;  ///< of bytes: JSON also where a property list cannot carry the answer
    std::string bytes;               ///< the whole body; the front passes it on unread
    // What the request took, for the metrics.
    std::uint64_t toolRuns = 0;
    std::uint64_t directoryLookups = 0;
    std::uint64_t residentBytes = 0;  ///< of the worker; 0: not known
    bool operator==(const Answer&) const = default;
};

using ToFront = std::variant<Hello, Log, Change, NotDone, SecretPart, Begun, Unfinished, Answer>;

[[nodiscard]] Frame frameOf(ToWorker message);
[[nodiscard]] Frame frameOf(ToFront message);
/// The message of a frame. Fails if the frame is not exactly one message to this side.
[[nodiscard]] Result<ToWorker> toWorker(Frame frame);
[[nodiscard]] Result<ToFront> toFront(Frame frame);

}  // namespace adminhost::protocol
