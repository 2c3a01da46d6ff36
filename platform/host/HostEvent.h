#pragma once

#include <QString>
#include <QVariant>

// The host's own copy of an event record that a plugin handed to its event emitter.
struct HostEvent {
    qint64 timestamp = 0;
    QString eventName;
    QVariant eventData;
    QString sourcePluginId;
    QString subscriberId;
};
