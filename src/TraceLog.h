#pragma once

// Output through the logging library, which the module loads when it is loaded and frees when it
// is unloaded. Without the library, its entry or a trace-object word, messages go nowhere.
class TraceLog {
public:
    enum Level { Failure = 2, Trace = 5 };

    // printf-style format with %s arguments; sourceFile and line are handed to the filter.
    static void print(int level, const char* sourceFile, int line, const char* format, ...)
#if defined(__GNUC__)
        __attribute__((format(printf, 4, 5)))
#endif
        ;
};
