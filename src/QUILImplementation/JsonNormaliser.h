#pragma once

#include "QuenvarExport.h"

#include <QByteArray>
#include <QStringView>

#include <optional>

// Writes JSON exactly as a round trip through Qt's JSON classes (QJsonDocument::fromJson, then
// toJson in compact form) writes it, several times faster: members of every object sorted by key
// with the last of equal keys kept, integral numbers within 64 bits written as integers, other
// numbers in Qt's shortest form, strings escaped as Qt escapes them. Parsing is RapidJSON's; a
// text it refuses, or one where Qt's result depends on how Qt stored a key, goes through Qt's
// classes, so the result never differs from theirs.
class QUENVAR_EXPORT JsonNormaliser {
public:
    // The compact text of the member NAME of the object {NAME:TEXT}, NAME written as a JSON string
    // (escaped) and TEXT, UTF-8, inserted as it is; nothing when that object does not parse. TEXT
    // may hold further members: the last one called NAME counts.
    static std::optional<QByteArray> memberValue(QStringView name, const QByteArray& text);
    // Appends text as a quoted JSON string, escaped as Qt's writer escapes it.
    static void appendString(QByteArray& out, QStringView text);
};
