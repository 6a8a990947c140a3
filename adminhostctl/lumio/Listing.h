#pragma once

// Lists of cameras, workflows and properties as a person wants them: filtered, sorted, with chosen columns.

#include "adminhostctl/Verb.h"
#include "adminhostctl/lumio/ElementVerbs.h"
#include "platform/value/Value.h"

#include <string>
#include <string_view>

namespace adminhost::ctl {

inline constexpr std::string_view matchOption = "--match";
inline constexpr std::string_view statusOption = "--status";
inline constexpr std::string_view allowedOption = "--allowed";
inline constexpr std::string_view restrictedOption = "--restricted";
inline constexpr std::string_view sortOption = "--sort";
inline constexpr std::string_view columnsOption = "--columns";
inline constexpr std::string_view wideOption = "--wide";

/// The elements that the options --match (a pattern of the name, in any case), --status, --allowed (a person or group)
/// and --restricted leave, in the order of the column of --sort. Throws Failure(usage) for a column or a name that is
/// not known.
[[nodiscard]] Array chosenElements(const Context& context, const ElementKind& kind, const Description& listing,
                                   const Array& elements);

/// Writes the elements with the columns of --columns. In text, "everyone" stands for a list that does not count, and
/// --wide shows long lists in full and does not fit the table to the terminal.
void writeElements(const Context& context, const ElementKind& kind, const Description& listing, const Array& elements);

/// Writes one element for people: names in place of UUIDs of people, and dates with their age. In other formats, as the
/// service returns it.
void writeElement(const Context& context, const ElementKind& kind, const Description& listing,
                  const Dictionary& element);

}  // namespace adminhost::ctl
