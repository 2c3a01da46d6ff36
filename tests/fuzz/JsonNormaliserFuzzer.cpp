// JsonNormaliser against Qt's own JSON round trip on any text: the same output, byte for byte.
#include "QUILImplementation/JsonNormaliser.h"

#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>

#include <cstddef>
#include <cstdint>
#include <cstdlib>

namespace {

QByteArray compactByQt(const QJsonValue& value) {
    const QByteArray array = QJsonDocument(QJsonArray{value}).toJson(QJsonDocument::Compact);
    return array.mid(1, array.size() - 2);
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    const QByteArray text(reinterpret_cast<const char*>(data), static_cast<qsizetype>(size));
    const QJsonValue value =
        QJsonDocument::fromJson("{\"v\":" + text + "}").object().value(QLatin1String("v"));
    const std::optional<QByteArray> normalised = JsonNormaliser::wrappedValue(text);
    if (normalised.has_value() == value.isUndefined() ||
        (normalised && *normalised != compactByQt(value)))
        std::abort();

    const QString string = QString::fromUtf8(text);
    QByteArray quoted;
    JsonNormaliser::appendString(quoted, string);
    if (quoted != compactByQt(string))
        std::abort();
    return 0;
}
