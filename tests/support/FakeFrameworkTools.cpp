#include "FakeFrameworkTools.h"

FakeFrameworkTools::FakeFrameworkTools()
    : emitter([](PluginObjBase_EventInfoBase*) {}) {}

QString FakeFrameworkTools::GetFrameworkVersion() const {
    return QStringLiteral("test");
}

IPluginConnector* FakeFrameworkTools::GetPluginConnector() {
    return this;
}

QVariantMap FakeFrameworkTools::GetPluginMetaData(const QString&) const {
    return {};
}

IPluginRequestChannel* FakeFrameworkTools::GetRequestChannel() {
    return &channel;
}

EventEmitter& FakeFrameworkTools::GetEventEmitter() {
    return emitter;
}

bool FakeFrameworkTools::ConnectPluginSignal(const QString& pluginId, const char* signal,
                                             const QObject* receiver, const char* method,
                                             int connectionType) {
    Connection connection{pluginId, signal, receiver, method, connectionType, false};
    if (QObject* plugin = plugins.value(pluginId))
        connection.connected = static_cast<bool>(QObject::connect(
            plugin, signal, receiver, method, static_cast<Qt::ConnectionType>(connectionType)));
    connections.append(connection);
    return connection.connected;
}

void FakeFrameworkTools::registerPlugin(const QString& pluginId, QObject* plugin) {
    plugins.insert(pluginId, plugin);
}
