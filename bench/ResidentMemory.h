// The process's resident memory, as the benchmarks that measure memory read it.
#pragma once

#include <QByteArray>
#include <QFile>
#include <QList>

#include <unistd.h>

// In bytes; 0 where /proc cannot be read.
inline qint64 residentBytes() {
    QFile statm(QStringLiteral("/proc/self/statm"));
    if (!statm.open(QIODevice::ReadOnly))
        return 0;
    const QList<QByteArray> fields = statm.readAll().split(' ');
    return fields.size() > 1 ? fields.at(1).toLongLong() * sysconf(_SC_PAGESIZE) : 0;
}
