#pragma once

#include "FakeRequestChannel.h"
#include "PluginFramework.h"

#include <QList>
#include <QObject>

// Framework tools for tests: records signal connections and events, and connects signals of a
// registered object for real.
class FakeFrameworkTools
    : public IFrameworkTools
    , public IPluginConnector {
public:
    struct Connection {
        QString pluginId;
        QByteArray signal;
        const QObject* receiver = nullptr;
        QByteArray method;
        int connectionType = -1;
        bool connected = false;
    };

    QString GetFrameworkVersion() const override { return QStringLiteral("test"); }
    IPluginConnector* GetPluginConnector() override { return this; }
    QVariantMap GetPluginMetaData(const QString&) const override { return {}; }
    IPluginRequestChannel* GetRequestChannel() override { return &channel; }
    EventEmitter& GetEventEmitter() override { return emitter; }

    bool ConnectPluginSignal(const QString& pluginId, const char* signal, const QObject* receiver,
                             const char* method, int connectionType) override;

    // The object that plays the plugin pluginId for ConnectPluginSignal.
    void registerPlugin(const QString& pluginId, QObject* plugin) {
        plugins.insert(pluginId, plugin);
    }

    FakeRequestChannel channel;
    EventEmitter emitter = [](PluginObjBase_EventInfoBase*) {};
    QList<Connection> connections;

private:
    QHash<QString, QObject*> plugins;
};
