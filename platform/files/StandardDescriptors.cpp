#include "platform/files/StandardDescriptors.h"

#include <fcntl.h>
#include <unistd.h>

namespace adminhost {

bool openStandardDescriptors() noexcept {
    for (int descriptor = STDIN_FILENO; descriptor <= STDERR_FILENO; ++descriptor) {
        // The lowest free number is used, and all below this one are open. A standard stream is inherited by children.
        if (::fcntl(descriptor, F_GETFD) < 0 && ::open("/dev/null", O_RDWR) != descriptor) {
            return false;
        }
    }
    return true;
}

}  // namespace adminhost
