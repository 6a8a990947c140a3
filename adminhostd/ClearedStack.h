#pragma once

namespace adminhost {

/// Clears 64 KiB of the stack below the caller. Calls that have ended may have left parts of a request there, also
/// without a variable of their own: the dynamic linker saves the vector registers on the stack when a function of a
/// library is called for the first time, and a copy of the text may be in them.
void clearUnusedStack() noexcept;

}  // namespace adminhost
