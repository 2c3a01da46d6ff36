#pragma once

#include "QuenvarExport.h"

#include <QByteArray>
#include <QStringView>

// Text that came from outside (a camera's answer, the VCA plugin's reply, a client's value) as it
// may stand in a log line: in the local 8-bit encoding, with control characters and backslashes
// escaped so that it cannot start a line of its own or pass for an escape, and cut to LIMIT
// bytes, the last three of which are then "...".
class QUENVAR_EXPORT LogText {
public:
    static const qsizetype LIMIT = 256;

    static QByteArray of(QStringView text);
    // An exception's what(), or "unknown exception" for null.
    static QByteArray ofError(const char* what);
};
