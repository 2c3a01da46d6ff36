#pragma once

#include "DeliveryGate.h"
#include "PluginFramework.h"
#include "QuenvarExport.h"

#include <QString>
#include <QVariant>

#include <map>
#include <mutex>

// The client requests that the plugin has started and not answered yet. Each is answered exactly
// once: by its operation while the plugin lives, or with "-1" when the plugin closes first.
// Closing waits for answers under way on other threads, then fails every request still open on
// the closing thread, so that none is lost and none comes after; an answer under way on the
// closing thread itself (a callback that destroys the plugin) is not waited for. The callbacks
// are held here, not by the operations, so closing also lets go of every one of them.
class QUENVAR_EXPORT OpenRequests {
public:
    using Id = quint64;

    // command names the request in log lines.
    Id open(const QString& command, ResponseCallback callback);
    // Answers id unless it has been answered or closing has begun.
    void answer(Id id, bool handled, const QString& code, const QString& message,
                const QVariant& payload);
    // Answers id (true, "-1", "", invalid) unless it has been answered.
    void fail(Id id);

    void close();

private:
    struct Request {
        QString command;
        ResponseCallback callback;
    };

    bool take(Id id, Request& request);
    // No exception from the client's callback reaches the operation that answered.
    static void deliver(const Request& request, bool handled, const QString& code,
                        const QString& message, const QVariant& payload);

    DeliveryGate gate;
    std::mutex mutex;
    Id next = 0;
    std::map<Id, Request> requests;
};
