#pragma once

#include "PluginFramework.h"
#include "QuenvarExport.h"

#include <QStringList>

#include <mutex>

// The event subscribers and the host's emitter. Changed on the host's threads and read on the
// thread that delivers a rule answer, so every access is serialised; deliveries go to a snapshot
// taken under the lock, outside it, so an emitter may subscribe or unsubscribe without deadlock.
class QUENVAR_EXPORT SubscriberList {
public:
    void setEmitter(const EventEmitter& emitter);
    // Duplicates are kept: each subscription gets its own delivery.
    void subscribe(const QString& subscriberId);
    // Removes every entry equal to subscriberId.
    void unsubscribe(const QString& subscriberId);

    // One record per subscriber, in order of subscription, each with its own timestamp.
    void emitToAll(const QVariant& data, const QString& eventName,
                   const QString& sourcePluginId) const;

private:
    mutable std::mutex mutex;
    QStringList subscribers;
    EventEmitter eventEmitter;
};
