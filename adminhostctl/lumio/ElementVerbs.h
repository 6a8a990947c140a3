#pragma once

// What the verbs of cameras, workflows and properties have in common. A person names an element by its name (a
// workflow's in the caller's language), its UUID or, for a workflow, the path of its bundle. A name that several
// elements have is a usage error that lists their UUIDs.

#include "adminhostctl/Verb.h"
#include "adminhostctl/desired/State.h"

#include <span>
#include <string>
#include <string_view>

namespace adminhost::ctl {

/// A kind of elements, by the words that are used for it.
struct ElementKind {
    const char* word;     ///< "camera"
    const char* section;  ///< of the state, and the list's key in the answer of the listing
    const char* listing;  ///< the command that lists them
};

/// The usage error for a name that no element of the list has; it suggests a similar one.
[[nodiscard]] Failure notFound(const ElementKind& kind, const std::string& name, const State& state,
                               const ListForm& list);

/// Prints the elements that the options of lists leave (Listing.h), or with --names one name of each.
[[nodiscard]] ExitStatus listElements(const Context& context, const ElementKind& kind);
[[nodiscard]] ExitStatus showElement(const Context& context, const ElementKind& kind, const std::string& name);

/// The names of all elements, for completion: of cameras and workflows from the quickest listing.
[[nodiscard]] std::vector<std::string> elementNames(const Context& context, const ElementKind& kind);

// These change elements that the service lists. The names of people and groups are looked up before anything is sent:
// Failure(usage) if the directory does not have one, or if it is a group's and --group was not given.

/// Adds users, or with --group groups, to the access lists of the elements, in one write. A name that the service does
/// not accept does not keep the others from being added.
[[nodiscard]] ExitStatus allowPeople(const Context& context, const ElementKind& kind,
                                     std::span<const std::string> elements, std::span<const std::string> people);
/// Removes users and groups, or with --group groups only, from the access lists. A single UUID of an account that the
/// directory does not know removes the entries of that account.
[[nodiscard]] ExitStatus denyPeople(const Context& context, const ElementKind& kind,
                                    std::span<const std::string> elements, std::span<const std::string> people);
/// Restricts the element to its list ("on"), or opens it to everyone ("off").
[[nodiscard]] ExitStatus switchAccess(const Context& context, const ElementKind& kind, const std::string& name,
                                      const std::string& onOrOff);
[[nodiscard]] ExitStatus removeElement(const Context& context, const ElementKind& kind, const std::string& name);

}  // namespace adminhost::ctl
