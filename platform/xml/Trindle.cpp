#include "Trindle.h"

Trindle::Trindle() = default;
Trindle::~Trindle() = default;

QVariant Trindle::parse(const QString&)
{
    return {};
}

QList<QVariant> Trindle::transContentAsList(const QVariant& value)
{
    if (!value.isValid())
        return {};
    if (value.typeId() == QMetaType::QVariantList)
        return value.toList();
    return {value};
}
