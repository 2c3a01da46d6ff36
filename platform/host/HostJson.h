#pragma once

#include "ClientAnswer.h"
#include "HostEvent.h"
#include "LoadedPlugin.h"

#include <QByteArray>
#include <QJsonValue>
#include <QList>

// The JSON of the host's fronts, all compact and on one line.
class HostJson {
public:
    // {"code":S,"handled":B,"message":S,"payload":P}, P through QJsonValue::fromVariant.
    static QByteArray answer(const ClientAnswer& answer);
    // {"answered":false}
    static QByteArray notAnswered();
    // {"eventData":..,"eventName":..,"sourcePluginId":..,"subscriberId":..,"timestamp":..}
    static QByteArray event(const HostEvent& event);
    // The loaded plugins, each with its file, interface, class and metadata.
    static QByteArray plugins(const QList<const LoadedPlugin*>& plugins);

    // A request's parameter variant: object to QVariantMap, array to QVariantList, string to
    // QString, number to double, boolean to bool, null or undefined to an invalid QVariant.
    static QVariant parameter(const QJsonValue& value);
    // Parses one JSON value of any kind, scalars included, into a parameter variant.
    static bool parseParameter(const QByteArray& text, QVariant* parameter, QString* error);
};
