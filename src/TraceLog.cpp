#include "TraceLog.h"

#include "KalbLogClient.h"

#include <cstdarg>

namespace {

// Loaded with the module, freed when it is unloaded.
const KalbLogClient library("Quenvar");

} // namespace

void TraceLog::print(int level, const char* sourceFile, int line, const char* format, ...) {
    va_list args;
    va_start(args, format);
    library.print(level, sourceFile, line, format, args);
    va_end(args);
}
