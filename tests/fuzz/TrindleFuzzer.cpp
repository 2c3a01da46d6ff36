// Trindle::parse on any text: a variant tree or an invalid variant, never a crash.
#include "Trindle.h"

#include <QByteArray>

#include <cstddef>
#include <cstdint>
#include <cstdlib>

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    const QString text =
        QString::fromUtf8(reinterpret_cast<const char*>(data), static_cast<qsizetype>(size));
    Trindle trindle;
    const QVariant tree = trindle.parse(text);
    // A document is a map with one entry, the root element.
    if (tree.isValid() && tree.toMap().size() != 1)
        std::abort();
    for (const QVariant& root : tree.toMap())
        Trindle::transContentAsList(root);
    return 0;
}
