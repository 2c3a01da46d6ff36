#include "KalbLogClient.h"

#include "KalbLog.h"

#include <string>

#if defined(_WIN32)
#include <windows.h>
#else
#include <dlfcn.h>
#endif

namespace {

#if defined(_WIN32)
const char LIBRARY_NAME[] = "KalbLogUtl.dll";

std::string moduleFolder() {
    HMODULE self = nullptr;
    if (!GetModuleHandleExA(GET_MODULE_HANDLE_EX_FLAG_FROM_ADDRESS |
                                GET_MODULE_HANDLE_EX_FLAG_UNCHANGED_REFCOUNT,
                            reinterpret_cast<LPCSTR>(&moduleFolder), &self))
        return {};
    char path[MAX_PATH];
    const DWORD length = GetModuleFileNameA(self, path, MAX_PATH);
    if (length == 0 || length == MAX_PATH)
        return {};
    std::string folder(path, length);
    const auto slash = folder.find_last_of("\\/");
    return slash == std::string::npos ? std::string() : folder.substr(0, slash + 1);
}

void* openLibrary() {
    const std::string folder = moduleFolder();
    if (!folder.empty()) {
        if (HMODULE module = LoadLibraryExA((folder + LIBRARY_NAME).c_str(), nullptr,
                                            LOAD_WITH_ALTERED_SEARCH_PATH))
            return module;
    }
    return LoadLibraryExA(LIBRARY_NAME, nullptr, LOAD_LIBRARY_SEARCH_DEFAULT_DIRS);
}

void* librarySymbol(void* handle, const char* name) {
    return reinterpret_cast<void*>(GetProcAddress(static_cast<HMODULE>(handle), name));
}

void closeLibrary(void* handle) {
    FreeLibrary(static_cast<HMODULE>(handle));
}
#else
const char LIBRARY_NAME[] = "libKalbLogUtl.so";

std::string moduleFolder() {
    Dl_info info{};
    if (!dladdr(reinterpret_cast<void*>(&moduleFolder), &info) || !info.dli_fname)
        return {};
    const std::string path(info.dli_fname);
    const auto slash = path.rfind('/');
    return slash == std::string::npos ? std::string() : path.substr(0, slash + 1);
}

void* openLibrary() {
    const std::string folder = moduleFolder();
    if (!folder.empty()) {
        if (void* module = dlopen((folder + LIBRARY_NAME).c_str(), RTLD_NOW | RTLD_LOCAL))
            return module;
    }
    // A bare name: the search path of this module and of the system, not the working folder.
    return dlopen(LIBRARY_NAME, RTLD_NOW | RTLD_LOCAL);
}

void* librarySymbol(void* handle, const char* name) {
    return dlsym(handle, name);
}

void closeLibrary(void* handle) {
    dlclose(handle);
}
#endif

} // namespace

KalbLogClient::KalbLogClient(const char* moduleName) {
    handle = openLibrary();
    if (!handle)
        return;
    auto entry =
        reinterpret_cast<LogTrace_GetGlobalObjectFn>(librarySymbol(handle, KALBLOG_ENTRY_NAME));
    if (!entry)
        return;
    entry(0, &traceObject);
    if (traceObject && traceObject->RegisterModule)
        traceObject->RegisterModule(traceObject->context, KALBLOG_REGISTER_VERSION, moduleName,
                                    &moduleId);
}

KalbLogClient::~KalbLogClient() {
    traceObject = nullptr;
    if (handle)
        closeLibrary(handle);
}

void KalbLogClient::print(int level, const char* sourceFile, int line, const char* format,
                          ...) const {
    va_list args;
    va_start(args, format);
    vprint(level, sourceFile, line, format, args);
    va_end(args);
}

void KalbLogClient::vprint(int level, const char* sourceFile, int line, const char* format,
                           va_list args) const {
    const KalbTraceObject* object = traceObject;
    if (!object || !object->context || !object->Filter)
        return;
    const unsigned code = (moduleId << 8) | static_cast<unsigned>(level);
    if (object->Filter(object->context, code, 0, sourceFile, line) != 0 || !object->Print)
        return;
    object->Print(object->context, format, args);
}
