#include "HostFrameworkTools.h"

#include "PluginHost.h"

const QString HostFrameworkTools::FRAMEWORK_VERSION = QStringLiteral("1.0");

HostFrameworkTools::HostFrameworkTools(PluginHost& host, const QString& pluginId)
    : host(host)
    , channel(host, pluginId) {
    EventHub* hub = &host.events();
    emitter = [hub](PluginObjBase_EventInfoBase* record) { hub->deliver(record); };
}

QString HostFrameworkTools::GetFrameworkVersion() const {
    return FRAMEWORK_VERSION;
}

IPluginConnector* HostFrameworkTools::GetPluginConnector() {
    return &host.connector();
}

QVariantMap HostFrameworkTools::GetPluginMetaData(const QString& pluginId) const {
    const LoadedPlugin* plugin = host.plugin(pluginId);
    return plugin ? plugin->metaData.toVariantMap() : QVariantMap();
}

IPluginRequestChannel* HostFrameworkTools::GetRequestChannel() {
    return &channel;
}

EventEmitter& HostFrameworkTools::GetEventEmitter() {
    return emitter;
}
