#include "AllocationFault.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <dlfcn.h>
#include <new>
#include <vector>

namespace {

thread_local int countdown = -1;
thread_local std::vector<const char*> failingModules;
thread_local bool failed = false;

bool calledFromFailingModule(const void* address) {
    Dl_info info;
    if (dladdr(address, &info) == 0 || !info.dli_fname)
        return false;
    return std::any_of(failingModules.begin(), failingModules.end(),
                       [&info](const char* module) { return std::strstr(info.dli_fname, module); });
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

void* allocateAligned(std::size_t size, std::align_val_t alignment) {
    const auto align = static_cast<std::size_t>(alignment);
    // aligned_alloc wants a size that is a multiple of the alignment.
    return std::aligned_alloc(align, (size + align - 1) / align * align);
}

} // namespace

void AllocationFault::failAfter(int count, std::initializer_list<const char*> modules) {
    failingModules.assign(modules);
    countdown = count;
    failed = false;
}

void AllocationFault::disarm() {
    countdown = -1;
}

bool AllocationFault::happened() {
    return failed;
}

// Every form of new and delete is replaced, so that all memory comes from malloc and goes back
// to free, whoever allocates it (a sanitizer's own forms would not match ours). Only the plain
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

void* operator new(std::size_t size, std::align_val_t alignment) {
    if (void* memory = allocateAligned(size, alignment))
        return memory;
    throw std::bad_alloc();
}

void* operator new[](std::size_t size, std::align_val_t alignment) {
    return operator new(size, alignment);
}

void* operator new(std::size_t size, std::align_val_t alignment, const std::nothrow_t&) noexcept {
    return allocateAligned(size, alignment);
}

void* operator new[](std::size_t size, std::align_val_t alignment, const std::nothrow_t&) noexcept {
    return allocateAligned(size, alignment);
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

void operator delete(void* memory, std::align_val_t) noexcept {
    std::free(memory);
}

void operator delete[](void* memory, std::align_val_t) noexcept {
    std::free(memory);
}

void operator delete(void* memory, std::size_t, std::align_val_t) noexcept {
    std::free(memory);
}

void operator delete[](void* memory, std::size_t, std::align_val_t) noexcept {
    std::free(memory);
}

void operator delete(void* memory, std::align_val_t, const std::nothrow_t&) noexcept {
    std::free(memory);
}

void operator delete[](void* memory, std::align_val_t, const std::nothrow_t&) noexcept {
    std::free(memory);
}
