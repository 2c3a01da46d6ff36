// Trindle: XML text to a QVariant tree.
//
// The document is a map keyed by the root element's name. An element with child elements or
// attributes is a map: children under their names, attributes under "@name", its own text under
// "#text". A text-only element without attributes is its text (an empty element, empty text). A
// repeated child is a list under its name, in document order. Entities and CDATA sections are
// decoded; comments and processing instructions are skipped. Names stand as written, prefixes
// included, and namespace declarations are ordinary attributes.
//
// White space: an element without child elements keeps its text exactly, blanks included. In an
// element with child elements, white space outside CDATA sections that stands alone between
// tags is layout and is dropped; other text is joined as written into "#text".
//
// Text that is not well-formed XML, the empty text included, gives an invalid QVariant, and so
// does a document whose elements nest more than 256 deep.
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
