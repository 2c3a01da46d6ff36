#include "HostRequestChannel.h"

#include "HostLog.h"
#include "PluginHost.h"
#include "RoutedRequest.h"

#include <QDeadlineTimer>
#include <QTimer>

#include <algorithm>
#include <memory>

namespace {

const QString STATUS_TIMEOUT = QStringLiteral("80000102");
const QString STATUS_NO_PLUGIN = QStringLiteral("80000404");

} // namespace

HostRequestChannel::HostRequestChannel(PluginHost& host, const QString& ownerId)
    : host(host)
    , ownerId(ownerId) {}

IPluginRequestChannel::Context HostRequestChannel::GetRequestContext() {
    return reinterpret_cast<Context>(++sequence);
}

bool HostRequestChannel::SendRequest(const QString& pluginID, Context context, int kind,
                                     const QString& command, PluginRequestInfo& info) {
    const auto number = reinterpret_cast<quintptr>(context);
    auto routed = std::make_shared<RoutedRequest>(info.callback);
    QObject* mainThread = host.context();
    const LoadedPlugin* target = host.pluginServing(command);
    if (!target) {
        hostLog().print(KalbLogClient::Trace, __FILE__, __LINE__, "%s",
                        qUtf8Printable(QStringLiteral("request %1 %2 from %3: no plugin serves it")
                                           .arg(number)
                                           .arg(command, pluginID)));
        QMetaObject::invokeMethod(
            mainThread,
            [routed]() {
                routed->deliver(false, QStringLiteral("no plugin serves the command"), QString(),
                                STATUS_NO_PLUGIN, QString(), false);
            },
            Qt::QueuedConnection);
        return false;
    }

    hostLog().print(KalbLogClient::Trace, __FILE__, __LINE__, "%s",
                    qUtf8Printable(QStringLiteral("request %1 %2 (kind %3) from %4 to %5")
                                       .arg(number)
                                       .arg(command)
                                       .arg(kind)
                                       .arg(pluginID, target->id)));
    const QDeadlineTimer deadline(info.timeoutMs > 0 ? info.timeoutMs : DEFAULT_TIMEOUT_MS);
    const RequestSenderInfo sender{pluginID.isEmpty() ? ownerId : pluginID, QString()};
    IPluginObjectBase* object = target->object;
    const QString targetId = target->id;
    const QString content = info.content;
    QMetaObject::invokeMethod(
        mainThread,
        [=]() {
            // Precise: a coarse timer may fire up to 5% before the record's time-out.
            QTimer::singleShot(
                std::max<qint64>(deadline.remainingTime(), 0), Qt::PreciseTimer, mainThread,
                [routed, number]() {
                    if (routed->deliver(false, QStringLiteral("timeout"), QString(), STATUS_TIMEOUT,
                                        QString(), false))
                        hostLog().print(
                            KalbLogClient::Trace, __FILE__, __LINE__, "%s",
                            qUtf8Printable(QStringLiteral("request %1 timed out").arg(number)));
                });
            // A plugin that throws is left to the time-out: the exception must not reach the
            // event loop.
            try {
                object->Request(
                    command, QVariant(content), sender,
                    [routed, targetId](bool handled, const QString& code, const QString& message,
                                       const QVariant& payload) {
                        routed->deliver(true, message, targetId, code, payload.toString(), handled);
                    });
            } catch (...) {
                hostLog().print(KalbLogClient::Failure, __FILE__, __LINE__, "%s",
                                qUtf8Printable(QStringLiteral("plugin %1 failed on the command %2")
                                                   .arg(targetId, command)));
            }
        },
        Qt::QueuedConnection);
    return true;
}
