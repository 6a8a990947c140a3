#pragma once

// The first steps of front and worker, after which they do not depend on how they were started.

namespace adminhost {

/// Sets every signal to its default action and unblocks it: an inherited SIGCHLD that is ignored would hide the end of
/// children. Opens /dev/null in place of closed standard streams, so that no descriptor of ours gets their numbers.
/// Marks all other inherited descriptors close-on-exec: a service that a tool starts would hold them for ever. Prevents
/// other processes of the same account from inspecting this one, and the kernel from writing its memory to disk,
/// because it holds secrets. Children that execute a program are not affected by the last.
void startProcess() noexcept;

}  // namespace adminhost
