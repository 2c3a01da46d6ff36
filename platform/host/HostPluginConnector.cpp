#include "HostPluginConnector.h"

#include "HostLog.h"
#include "PluginHost.h"

namespace {

// Drops the SIGNAL()/SLOT() code for messages.
QString signature(const char* encoded) {
    return encoded && *encoded ? QString::fromLatin1(encoded + 1) : QStringLiteral("(none)");
}

} // namespace

HostPluginConnector::HostPluginConnector(const PluginHost& host)
    : host(host) {}

bool HostPluginConnector::ConnectPluginSignal(const QString& pluginId, const char* signal,
                                              const QObject* receiver, const char* method,
                                              int connectionType) {
    const LoadedPlugin* source = host.plugin(pluginId);
    if (!source) {
        hostLog().print(
            KalbLogClient::Failure, __FILE__, __LINE__, "%s",
            qUtf8Printable(QStringLiteral("cannot connect %1 of plugin %2: no plugin with that id")
                               .arg(signature(signal), pluginId)));
        return false;
    }
    if (!signal || !receiver || !method) {
        hostLog().print(
            KalbLogClient::Failure, __FILE__, __LINE__, "%s",
            qUtf8Printable(QStringLiteral("cannot connect %1 of plugin %2: no receiver or method")
                               .arg(signature(signal), pluginId)));
        return false;
    }
    const bool connected = static_cast<bool>(QObject::connect(
        source->object, signal, receiver, method, static_cast<Qt::ConnectionType>(connectionType)));
    if (!connected) {
        hostLog().print(
            KalbLogClient::Failure, __FILE__, __LINE__, "%s",
            qUtf8Printable(QStringLiteral("cannot connect %1 of plugin %2 to %3 of %4")
                               .arg(signature(signal), pluginId, signature(method),
                                    QString::fromLatin1(receiver->metaObject()->className()))));
    } else {
        hostLog().print(KalbLogClient::Trace, __FILE__, __LINE__, "%s",
                        qUtf8Printable(QStringLiteral("connected %1 of plugin %2 to %3")
                                           .arg(signature(signal), pluginId, signature(method))));
    }
    return connected;
}
