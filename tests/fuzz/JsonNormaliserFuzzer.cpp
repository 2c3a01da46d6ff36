// JsonNormaliser against Qt's own JSON round trip on any text: the same output, byte for byte.
// The input's first line is the rule's name, the rest its text (the whole input, under the empty
// name, when there is no line feed).
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

void expectQtsEscaping(const QString& string) {
    QByteArray quoted;
    JsonNormaliser::appendString(quoted, string);
    if (quoted != compactByQt(string))
        std::abort();
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    const QByteArray input(reinterpret_cast<const char*>(data), static_cast<qsizetype>(size));
    const qsizetype lineEnd = input.indexOf('\n');
    const QString name = lineEnd < 0 ? QString() : QString::fromUtf8(input.left(lineEnd));
    const QByteArray text = lineEnd < 0 ? input : input.mid(lineEnd + 1);

    const QJsonValue value =
        QJsonDocument::fromJson('{' + compactByQt(name) + ':' + text + '}').object().value(name);
    const std::optional<QByteArray> normalised = JsonNormaliser::memberValue(name, text);
    if (normalised.has_value() == value.isUndefined() ||
        (normalised && *normalised != compactByQt(value)))
        std::abort();

    expectQtsEscaping(name);
    expectQtsEscaping(QString::fromUtf8(text));
    return 0;
}
