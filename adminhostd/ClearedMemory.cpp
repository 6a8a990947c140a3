// Memory that front and worker free is cleared first.
//
// Requests and answers hold passwords, and parsers, strings and containers copy them to places that cannot be cleared
// by name. The front's and the worker's own new and delete do it for all of them. The plug-ins' memory goes through
// them, too. Linked into both programs as a source of their own: in an archive it would be left out.

#include <cstdlib>
#include <cstring>
#include <new>

#include <malloc.h>

// Sanitizers need their own: they fill freed memory themselves.
#ifndef ADMINHOST_SANITIZED

namespace {

void* allocate(std::size_t size) noexcept {
    return std::malloc(size == 0 ? 1 : size);
}

void release(void* block) noexcept {
    if (block != nullptr) {
        ::explicit_bzero(block, ::malloc_usable_size(block));
        std::free(block);
    }
}

}  // namespace

void* operator new(std::size_t size) {
    void* block = allocate(size);
    return block != nullptr ? block : throw std::bad_alloc();
}
void* operator new(std::size_t size, const std::nothrow_t&) noexcept {
    return allocate(size);
}
void operator delete(void* block) noexcept {
    release(block);
}
void operator delete(void* block, std::size_t) noexcept {
    release(block);
}
void operator delete(void* block, const std::nothrow_t&) noexcept {
    release(block);
}

#endif
