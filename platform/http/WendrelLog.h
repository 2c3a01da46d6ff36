#pragma once

// Failure reports through the logging library (module "Wendrel", level 2). Never pass credentials.
class WendrelLog {
public:
    static void failure(const char* sourceFile, int line, const char* format, ...)
#if defined(__GNUC__)
        __attribute__((format(printf, 3, 4)))
#endif
        ;
};
