#pragma once

#include "EventQueue.h"
#include "PluginFramework.h"

#include <QHash>
#include <QList>

#include <memory>
#include <mutex>

// The host's subscription table: the event streams open for each subscriber, and the delivery
// of the plugins' event records to them. Safe to use from any thread.
class EventHub {
public:
    // Returns whether this is the subscriber's first open stream; false also once closed.
    bool attach(const QString& subscriberId, const std::shared_ptr<EventQueue>& queue);
    // Returns whether the subscriber's last open stream went.
    bool detach(const QString& subscriberId, const std::shared_ptr<EventQueue>& queue);
    // Copies the record to every stream of the subscriber it names; returns how many got it.
    int deliver(const PluginObjBase_EventInfoBase* record);
    // Closes every stream and refuses new ones, so that stream threads can end.
    void closeAll();

private:
    mutable std::mutex mutex;
    QHash<QString, QList<std::shared_ptr<EventQueue>>> streams;
    bool closed = false;
};
