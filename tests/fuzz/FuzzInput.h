// Splits a fuzz input into a short side value and the reply text it goes with.
#pragma once

#include <QByteArray>
#include <QString>

#include <cstddef>
#include <cstdint>

struct FuzzInput {
    QString first; // the first line, without its line feed; empty when there is no line feed
    QString rest;  // everything after the first line feed, or the whole input

    static FuzzInput split(const uint8_t* data, size_t size) {
        const QByteArray bytes(reinterpret_cast<const char*>(data), static_cast<qsizetype>(size));
        const qsizetype lineEnd = bytes.indexOf('\n');
        if (lineEnd < 0)
            return {QString(), QString::fromUtf8(bytes)};
        return {QString::fromUtf8(bytes.left(lineEnd)), QString::fromUtf8(bytes.mid(lineEnd + 1))};
    }
};
