#pragma once

#include <QString>

// The host's messages. Warnings are for the user and always go to standard error; traces go
// through the logging library at level 5 (shown with KALBLOG_LEVEL=5, which --verbose sets).
class HostLog {
public:
    static void warning(const QString& message);
    static void trace(const char* sourceFile, int line, const QString& message);
};
