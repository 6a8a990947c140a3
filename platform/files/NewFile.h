#pragma once

// A file that is created anew, given to an owner, and removed again.

#include "platform/files/FileDescriptor.h"
#include "platform/files/FilePlace.h"
#include "platform/files/Path.h"
#include "platform/framework/Export.h"
#include "platform/value/Result.h"

#include <optional>
#include <string_view>
#include <utility>

#include <sys/types.h>

namespace adminhost {

class ADMINHOST_EXPORT NewFile {
  public:
    /// Creates a file of mode 0644 that holds these bytes; they are not flushed to the disk. A file or link of that
    /// name is removed first, never followed or written to; a directory of that name is an error, and stays. Links on
    /// the way are followed only where openPlace() allows it. On failure no new file is left. The error has the
    /// system's number.
    [[nodiscard]] static Result<NewFile> create(const DiskPath& path, std::string_view bytes);

    /// Sets the owner of this very file, whatever has its name by now. The group stays.
    [[nodiscard]] std::optional<Error> setOwner(uid_t owner) const;
    /// Closes it and removes what has its name.
    [[nodiscard]] std::optional<Error> remove();

  private:
    NewFile(FilePlace place, FileDescriptor file) : _place(std::move(place)), _file(std::move(file)) {}

    FilePlace _place;
    FileDescriptor _file;
};

}  // namespace adminhost
