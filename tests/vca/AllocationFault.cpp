#include "AllocationFault.h"

#include <cstdlib>
#include <cstring>
#include <dlfcn.h>
#include <new>

namespace {

thread_local int countdown = -1;
thread_local bool failed = false;

bool calledFromFailingModule(const void* address) {
    Dl_info info;
    return dladdr(address, &info) != 0 && info.dli_fname &&
           (std::strstr(info.dli_fname, "libPluginQuenvar") ||
            std::strstr(info.dli_fname, "libTrindle"));
}

void* allocate(std::size_t size, const void* caller) {
    if (countdown >= 0 && calledFromFailingModule(caller) && countdown-- == 0) {
        failed = true;
        throw std::bad_alloc();
    }
    if (void* memory = std::malloc(size == 0 ? 1 : size))
        return memory;
    throw std::bad_alloc();
}

} // namespace

void AllocationFault::failAfter(int count) {
    countdown = count;
    failed = false;
}

void AllocationFault::disarm() {
    countdown = -1;
}

bool AllocationFault::happened() {
    return failed;
}

// The forms of new and delete that do not align are replaced, so that all memory they handle
// comes from malloc and goes back to free, whoever allocates it (a sanitizer's own forms would
// not match ours); the aligned forms are left as they are, a pair of their own. Only the plain
// forms, the ones that throw, fail on demand.

void* operator new(std::size_t size) {
    return allocate(size, __builtin_return_address(0));
}

void* operator new[](std::size_t size) {
    return allocate(size, __builtin_return_address(0));
}

void* operator new(std::size_t size, const std::nothrow_t&) noexcept {
    return std::malloc(size == 0 ? 1 : size);
}

void* operator new[](std::size_t size, const std::nothrow_t&) noexcept {
    return std::malloc(size == 0 ? 1 : size);
}

void operator delete(void* memory) noexcept {
    std::free(memory);
}

void operator delete[](void* memory) noexcept {
    std::free(memory);
}

void operator delete(void* memory, std::size_t) noexcept {
    std::free(memory);
}

void operator delete[](void* memory, std::size_t) noexcept {
    std::free(memory);
}

void operator delete(void* memory, const std::nothrow_t&) noexcept {
    std::free(memory);
}

void operator delete[](void* memory, const std::nothrow_t&) noexcept {
    std::free(memory);
}
