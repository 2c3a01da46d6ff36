// Loads the logging library at run time for the module it is linked into and prints through its
// trace object. A missing library, entry or trace-object word silences output; nothing else
// changes. The library is looked up beside the module first, then on the system's search path,
// never in the working directory, so a file planted there cannot be loaded into the process.
// Each module that logs holds one client, under its own module name.
#pragma once

#include <cstdarg>

struct KalbTraceObject;

class KalbLogClient {
public:
    enum Level { Failure = 2, Trace = 5 };

    // Registers moduleName with the library; it stays loaded until this object is destroyed.
    explicit KalbLogClient(const char* moduleName);
    ~KalbLogClient();

    KalbLogClient(const KalbLogClient&) = delete;
    KalbLogClient& operator=(const KalbLogClient&) = delete;

    // printf-style format; sourceFile (from the repository's top) and line go to the filter.
    void print(int level, const char* sourceFile, int line, const char* format, ...) const
#if defined(__GNUC__)
        __attribute__((format(printf, 5, 6)))
#endif
        ;
    void vprint(int level, const char* sourceFile, int line, const char* format,
                va_list args) const;

private:
    void* handle = nullptr;
    KalbTraceObject* traceObject = nullptr;
    unsigned moduleId = 0;
};
