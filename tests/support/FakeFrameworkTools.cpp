#include "FakeFrameworkTools.h"

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
