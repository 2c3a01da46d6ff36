// Readable GoogleTest output for the Qt values the camera tests compare.
#pragma once

#include <QByteArray>
#include <QDebug>
#include <QString>
#include <QVariant>

#include <ostream>

QT_BEGIN_NAMESPACE

inline void PrintTo(const QString& text, std::ostream* out) {
    *out << '"' << text.toStdString() << '"';
}

inline void PrintTo(const QByteArray& bytes, std::ostream* out) {
    *out << '"' << bytes.toStdString() << '"';
}

inline void PrintTo(const QVariant& value, std::ostream* out) {
    QString text;
    QDebug(&text) << value;
    *out << text.toStdString();
}

inline void PrintTo(const QVariantMap& map, std::ostream* out) {
    PrintTo(QVariant(map), out);
}

QT_END_NAMESPACE
