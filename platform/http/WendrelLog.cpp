#include "WendrelLog.h"

#include "KalbLogClient.h"

#include <cstdarg>

namespace {

const int FAILURE_LEVEL = 2;

} // namespace

void WendrelLog::failure(const char* sourceFile, int line, const char* format, ...) {
    static const KalbLogClient trace("Wendrel");
    va_list args;
    va_start(args, format);
    trace.print(FAILURE_LEVEL, sourceFile, line, format, args);
    va_end(args);
}
