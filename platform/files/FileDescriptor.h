#pragma once

// One open file descriptor, closed by its destructor. Move-only; a moved-from one is empty.

#include "platform/framework/Export.h"

#include <cerrno>
#include <utility>

#include <unistd.h>

namespace adminhost {

class ADMINHOST_EXPORT FileDescriptor {
  public:
    FileDescriptor() noexcept = default;
    /// Takes ownership; a negative number is an empty descriptor.
    explicit FileDescriptor(int number) noexcept : _number(number) {}
    FileDescriptor(FileDescriptor&& other) noexcept : _number(std::exchange(other._number, -1)) {}
    FileDescriptor& operator=(FileDescriptor&& other) noexcept {
        if (this != &other) {
            close();
            _number = std::exchange(other._number, -1);
        }
        return *this;
    }
    FileDescriptor(const FileDescriptor&) = delete;
    FileDescriptor& operator=(const FileDescriptor&) = delete;
    ~FileDescriptor() { close(); }

    /// The number, -1 when empty.
    [[nodiscard]] int get() const noexcept { return _number; }
    [[nodiscard]] bool isOpen() const noexcept { return _number >= 0; }

    /// Gives up ownership: the caller closes the descriptor.
    [[nodiscard]] int release() noexcept { return std::exchange(_number, -1); }

    /// Closes it if it is open. Returns the system's error number, 0 for success. errno keeps its value.
    int close() noexcept {
        const int before = errno;
        int failure = 0;
        if (_number >= 0 && ::close(std::exchange(_number, -1)) != 0) {
            failure = errno;
        }
        errno = before;
        return failure;
    }

  private:
    int _number = -1;
};

}  // namespace adminhost
