// Trindle: XML text to a QVariant tree.
//
// The document is a map keyed by the root element's name. An element with child elements or
// attributes is a map: children under their names, attributes under "@name", its own text under
// "#text". A text-only element without attributes is its text. A repeated child is a list under
// its name, in document order. Text that is not well-formed XML gives an invalid QVariant.
#pragma once

#include <QList>
#include <QString>
#include <QVariant>


#if defined(_WIN32)
#if defined(TRINDLE_BUILD)
#define TRINDLE_EXPORT __declspec(dllexport)
#else
#define TRINDLE_EXPORT __declspec(dllimport)
#endif
#else
#define TRINDLE_EXPORT __attribute__((visibility("default")))
#endif

class TRINDLE_EXPORT Trindle {
public:
    Trindle();
    ~Trindle();

    QVariant parse(const QString& xml);

    // The entries of a list value, a one-entry list for any other valid value, and an empty
    // list for an invalid one.
    static QList<QVariant> transContentAsList(const QVariant& value);
};
