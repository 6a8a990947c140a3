#pragma once

// Paths and the system root.
//
// A HostPath is a path as the service's administrator knows it: in settings, responses and log lines. A DiskPath is the
// place of the file on this disk. Functions that touch the disk accept a DiskPath only; diskPath() is the one way from
// the first to the second. Both compare and copy as their text; neither is normalised.

#include "platform/framework/Export.h"

#include <compare>
#include <string>
#include <utility>

namespace adminhost {

class ADMINHOST_EXPORT HostPath {
  public:
    HostPath() = default;
    explicit HostPath(std::string text) : _text(std::move(text)) {}
    [[nodiscard]] const std::string& text() const noexcept { return _text; }
    friend auto operator<=>(const HostPath&, const HostPath&) = default;

  private:
    std::string _text;
};

class ADMINHOST_EXPORT DiskPath {
  public:
    DiskPath() = default;
    explicit DiskPath(std::string text) : _text(std::move(text)) {}
    [[nodiscard]] const std::string& text() const noexcept { return _text; }
    [[nodiscard]] const char* c_str() const noexcept { return _text.c_str(); }
    friend auto operator<=>(const DiskPath&, const DiskPath&) = default;

  private:
    std::string _text;
};

/// Sets the directory below which every absolute host path is: "/" at first. Set once, before requests are served.
ADMINHOST_EXPORT void setSystemRoot(std::string directory);
[[nodiscard]] ADMINHOST_EXPORT const std::string& systemRoot() noexcept;

/// The host path below the system root. While that is "/" a path stays as it is, and a relative one is relative to the
/// current directory. Below any other root a relative path begins at the root, and no step ".." of the text leads above
/// it: whatever the path, nothing outside the root is touched, unless a link inside leads there.
[[nodiscard]] ADMINHOST_EXPORT DiskPath diskPath(const HostPath& path);

/// The way back, for texts that people read: the host path of a place below the system root; any other path as it is.
[[nodiscard]] ADMINHOST_EXPORT HostPath hostPath(const DiskPath& path);

/// Returns true if a file system entry exists there (a link is followed). Returns false also if it cannot be known.
[[nodiscard]] ADMINHOST_EXPORT bool exists(const DiskPath& path) noexcept;

/// Returns true if the place that the path leads to, after all links, is below the system root, or the root itself.
/// Returns false for a place that does not exist, or that cannot be known.
[[nodiscard]] ADMINHOST_EXPORT bool isBelowSystemRoot(const DiskPath& path);

}  // namespace adminhost
