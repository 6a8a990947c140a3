#pragma once

// What front and worker do first, so that nothing depends on how they were started.

namespace adminhost {

/// Sets every signal to its default action and unblocks it: an inherited SIGCHLD that is ignored would hide the end of
/// children. Opens /dev/null in place of closed standard streams, so that no descriptor of ours takes their numbers.
/// Marks all other inherited descriptors close-on-exec: a service that a tool starts would hold them for ever. Denies
/// other processes of the same account to inspect this one, and the kernel to write its memory to disk: it holds
/// secrets. Children that execute a program are not affected by the last.
void startProcess() noexcept;

}  // namespace adminhost
