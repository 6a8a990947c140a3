#pragma once

// Workflows: rows of the workflows table, each with a bundle on the shared file system that holds its texts.
//
// A bundle is on a file system that others write to. Reads are bounded, and a bundle outside the system root counts as
// missing. Missing or unreadable parts are not an error: texts fall back until they are empty.

#include "platform/bundle/Bundle.h"
#include "resources/Resource.h"

#include <cstddef>

namespace lumio {

class Workflow final : public ResourceClass<Workflow> {
  public:
    static constexpr std::size_t informationMaximumSize = std::size_t{1} << 20U;  ///< bytes of an information file

    /// Every enabled workflow, with its access list; nullopt, with the error, on failure.
    [[nodiscard]] static std::optional<std::vector<std::unique_ptr<Workflow>>> allWorkflowsWithError(
        std::optional<adminhost::Error>& error);

    [[nodiscard]] std::string_view resourceType() const noexcept override { return "workflow"; }
    /// The directory that "bundle_path" names below the shared file system, also if it begins with "/"; the empty text
    /// names the shared file system itself. Expands the access list if that has not happened.
    [[nodiscard]] std::optional<adminhost::Bundle> bundle();
    /// The information file; every call reads it again.
    [[nodiscard]] std::optional<adminhost::Dictionary> uncachedInfoDictionary();
    /// The bundle's texts in the best of the languages (names or codes, most preferred first), else in English.
    [[nodiscard]] std::optional<adminhost::Dictionary> localizedStrings(const std::vector<std::string>& languages);
    /// Sets "name", "description" and "notes" of the record, each empty if there is no text. Notes are never localized.
    void localizeUsingLanguages(const std::vector<std::string>& languages);

  protected:
    [[nodiscard]] std::string_view className() const noexcept override { return "Workflow"; }

  private:
    /// The information file's value under the key; the empty text if it has none.
    [[nodiscard]] adminhost::Value information(std::string_view key);
};

}  // namespace lumio
