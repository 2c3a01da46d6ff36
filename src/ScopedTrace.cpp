#include "ScopedTrace.h"

#include "QuenvarLog.h"

ScopedTrace::ScopedTrace(const char* function, const char* sourceFile, int line)
    : function(function)
    , sourceFile(sourceFile) {
    quenvarLog.print(KalbLogClient::Trace, sourceFile, line, "%s, Enter", function);
}

ScopedTrace::~ScopedTrace() {
    quenvarLog.print(KalbLogClient::Trace, sourceFile, 0, "%s, Leave", function);
}
