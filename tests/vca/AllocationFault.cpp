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

void* operator new(std::size_t size) {
    return allocate(size, __builtin_return_address(0));
}

void* operator new[](std::size_t size) {
    return allocate(size, __builtin_return_address(0));
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
