#include "HostJson.h"

#include <QFileInfo>
#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>

namespace {

QByteArray compact(const QJsonObject& object) {
    return QJsonDocument(object).toJson(QJsonDocument::Compact);
}

} // namespace

QByteArray HostJson::answer(const ClientAnswer& answer) {
    return compact({{QStringLiteral("handled"), answer.handled},
                    {QStringLiteral("code"), answer.code},
                    {QStringLiteral("message"), answer.message},
                    {QStringLiteral("payload"), QJsonValue::fromVariant(answer.payload)}});
}

QByteArray HostJson::notAnswered() {
    return compact({{QStringLiteral("answered"), false}});
}

QByteArray HostJson::event(const HostEvent& event) {
    return compact({{QStringLiteral("timestamp"), event.timestamp},
                    {QStringLiteral("eventName"), event.eventName},
                    {QStringLiteral("eventData"), QJsonValue::fromVariant(event.eventData)},
                    {QStringLiteral("sourcePluginId"), event.sourcePluginId},
                    {QStringLiteral("subscriberId"), event.subscriberId}});
}

QByteArray HostJson::plugins(const QList<const LoadedPlugin*>& plugins) {
    QJsonArray list;
    for (const LoadedPlugin* plugin : plugins) {
        list.append(QJsonObject{
            {QStringLiteral("pluginId"), plugin->id},
            {QStringLiteral("file"), QFileInfo(plugin->origin).fileName()},
            {QStringLiteral("IID"), plugin->metaData.value(QStringLiteral("IID"))},
            {QStringLiteral("className"), plugin->metaData.value(QStringLiteral("className"))},
            {QStringLiteral("metaData"), plugin->metaData.value(QStringLiteral("MetaData"))}});
    }
    return QJsonDocument(list).toJson(QJsonDocument::Compact);
}

QVariant HostJson::parameter(const QJsonValue& value) {
    switch (value.type()) {
    case QJsonValue::Object:
        return value.toObject().toVariantMap();
    case QJsonValue::Array:
        return value.toArray().toVariantList();
    case QJsonValue::String:
        return value.toString();
    case QJsonValue::Double:
        return value.toDouble();
    case QJsonValue::Bool:
        return value.toBool();
    case QJsonValue::Null:
    case QJsonValue::Undefined:
        break;
    }
    return QVariant();
}

bool HostJson::parseParameter(const QByteArray& text, QVariant* parameter, QString* error) {
    // QJsonDocument takes only objects and arrays at the top, so a scalar is read as the one
    // element of an array.
    QJsonParseError parseError{};
    const QJsonDocument document = QJsonDocument::fromJson('[' + text + ']', &parseError);
    if (parseError.error != QJsonParseError::NoError) {
        *error = QStringLiteral("not JSON: %1").arg(parseError.errorString());
        return false;
    }
    const QJsonArray values = document.array();
    if (values.size() != 1) {
        *error = values.isEmpty() ? QStringLiteral("no JSON value")
                                  : QStringLiteral("more than one JSON value");
        return false;
    }
    *parameter = HostJson::parameter(values.first());
    return true;
}
