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
const wchar_t LIBRARY_NAME[] = L"KalbLogUtl.dll";

// Wide calls: a folder name outside the ANSI code page does not survive the ANSI ones.
std::wstring moduleFolder() {
    HMODULE self = nullptr;
    if (!GetModuleHandleExW(GET_MODULE_HANDLE_EX_FLAG_FROM_ADDRESS |
                                GET_MODULE_HANDLE_EX_FLAG_UNCHANGED_REFCOUNT,
                            reinterpret_cast<LPCWSTR>(&moduleFolder), &self))
        return {};
    wchar_t path[MAX_PATH];
    const DWORD length = GetModuleFileNameW(self, path, MAX_PATH);
    if (length == 0 || length == MAX_PATH)
        return {};
    std::wstring folder(path, length);
    const auto slash = folder.find_last_of(L"\\/");
    return slash == std::wstring::npos ? std::wstring() : folder.substr(0, slash + 1);
}

void* openLibrary() {
    const std::wstring folder = moduleFolder();
    if (!folder.empty()) {
        // Its own dependencies from its folder too, and like it never from the working folder.
        if (HMODULE module =
                LoadLibraryExW((folder + LIBRARY_NAME).c_str(), nullptr,
                               LOAD_LIBRARY_SEARCH_DLL_LOAD_DIR | LOAD_LIBRARY_SEARCH_DEFAULT_DIRS))
            return module;
    }
    return LoadLibraryExW(LIBRARY_NAME, nullptr, LOAD_LIBRARY_SEARCH_DEFAULT_DIRS);
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
