#pragma once

// The lock that a worker holds while it changes something: a second worker, which a new daemon has started while the
// old one was finishing a write, must not write at the same time.
//
// It is a flock on a file of mode 0600 in /run/adminhostd/private, below the system root. That directory can be entered
// by the daemon's account only, so nobody else can hold the lock. Tools do not inherit it. Reading needs no lock.
//
// The file is created when a worker starts. From then on the lock needs no space on the disk: it can be held when the
// disk of /run is full or has become read-only, and a write whose files are elsewhere is carried out. Only if the file
// could never be created do changes fail, with the reason: without the lock two workers could overwrite each other.

#include "platform/files/FileDescriptor.h"
#include "platform/value/Result.h"

#include <utility>

namespace adminhost {

class WriteLock {
  public:
    /// The lock is held as long as the object exists.
    class Held {
      public:
        Held(Held&&) noexcept = default;
        Held(const Held&) = delete;
        Held& operator=(const Held&) = delete;
        Held& operator=(Held&&) = delete;
        ~Held();

      private:
        friend class WriteLock;
        explicit Held(FileDescriptor file) noexcept : _file(std::move(file)) {}
        FileDescriptor _file;
    };

    static constexpr const char* busy = "busy";  ///< the domain of the error if another process holds the lock

    /// Does not wait. Fails with the domain "busy" and a sentence that names the holder's process id, or with the
    /// domain "posix" if the lock cannot be used.
    [[nodiscard]] static Result<Held> tryToHold();
};

}  // namespace adminhost
