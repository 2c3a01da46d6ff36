#include "ScopedTrace.h"

#include "TraceLog.h"

ScopedTrace::ScopedTrace(const char* function, const char* sourceFile, int line)
    : function(function)
    , sourceFile(sourceFile) {
    TraceLog::print(TraceLog::Trace, sourceFile, line, "%s, Enter", function);
}

ScopedTrace::~ScopedTrace() {
    TraceLog::print(TraceLog::Trace, sourceFile, 0, "%s, Leave", function);
}
