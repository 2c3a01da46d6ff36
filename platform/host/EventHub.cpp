#include "EventHub.h"

#include "HostLog.h"

bool EventHub::attach(const QString& subscriberId, const std::shared_ptr<EventQueue>& queue) {
    std::lock_guard<std::mutex> lock(mutex);
    if (closed) {
        queue->close();
        return false;
    }
    QList<std::shared_ptr<EventQueue>>& queues = streams[subscriberId];
    queues.append(queue);
    return queues.size() == 1;
}

bool EventHub::detach(const QString& subscriberId, const std::shared_ptr<EventQueue>& queue) {
    queue->close();
    std::lock_guard<std::mutex> lock(mutex);
    auto found = streams.find(subscriberId);
    if (found == streams.end() || !found->removeOne(queue))
        return false;
    if (!found->isEmpty())
        return false;
    streams.erase(found);
    return true;
}

int EventHub::deliver(const PluginObjBase_EventInfoBase* record) {
    if (!record)
        return 0;
    const auto* signalInfo = dynamic_cast<const PluginObjBase_EventSignalInfo*>(record);
    HostEvent event{record->timestamp, record->eventName, record->eventData,
                    signalInfo ? signalInfo->sourcePluginId : QString(),
                    signalInfo ? signalInfo->subscriberId : QString()};

    QList<std::shared_ptr<EventQueue>> targets;
    {
        std::lock_guard<std::mutex> lock(mutex);
        targets = streams.value(event.subscriberId);
    }
    for (const std::shared_ptr<EventQueue>& queue : targets)
        queue->push(event);
    hostLog().print(KalbLogClient::Trace, __FILE__, __LINE__, "%s",
                    qUtf8Printable(QStringLiteral("event %1 for subscriber %2: %3 stream(s)")
                                       .arg(event.eventName, event.subscriberId)
                                       .arg(targets.size())));
    return static_cast<int>(targets.size());
}

void EventHub::closeAll() {
    std::lock_guard<std::mutex> lock(mutex);
    closed = true;
    for (const QList<std::shared_ptr<EventQueue>>& queues : std::as_const(streams)) {
        for (const std::shared_ptr<EventQueue>& queue : queues)
            queue->close();
    }
}
