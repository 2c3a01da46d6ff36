#include "SubscriberList.h"

#include <QDateTime>

void SubscriberList::setEmitter(const EventEmitter& emitter) {
    std::lock_guard<std::mutex> lock(mutex);
    eventEmitter = emitter;
}

void SubscriberList::subscribe(const QString& subscriberId) {
    std::lock_guard<std::mutex> lock(mutex);
    subscribers.append(subscriberId);
}

void SubscriberList::unsubscribe(const QString& subscriberId) {
    std::lock_guard<std::mutex> lock(mutex);
    subscribers.removeAll(subscriberId);
}

void SubscriberList::emitToAll(const QVariant& data, const QString& eventName,
                               const QString& sourcePluginId) const {
    QStringList targets;
    EventEmitter emitter;
    {
        std::lock_guard<std::mutex> lock(mutex);
        if (subscribers.isEmpty() || !eventEmitter)
            return;
        targets = subscribers;
        emitter = eventEmitter;
    }
    for (const QString& subscriberId : std::as_const(targets)) {
        PluginObjBase_EventSignalInfo record;
        record.timestamp = QDateTime::currentMSecsSinceEpoch();
        record.eventName = eventName;
        record.eventData = data;
        record.sourcePluginId = sourcePluginId;
        record.subscriberId = subscriberId;
        emitter(&record);
    }
}
