#pragma once

#include "HostRequestChannel.h"
#include "PluginFramework.h"

class PluginHost;

// The framework tools the host hands to one plugin.
class HostFrameworkTools : public IFrameworkTools {
public:
    static const QString FRAMEWORK_VERSION;

    HostFrameworkTools(PluginHost& host, const QString& pluginId);

    QString GetFrameworkVersion() const override;
    IPluginConnector* GetPluginConnector() override;
    QVariantMap GetPluginMetaData(const QString& pluginId) const override;
    IPluginRequestChannel* GetRequestChannel() override;
    EventEmitter& GetEventEmitter() override;

private:
    PluginHost& host;
    HostRequestChannel channel;
    EventEmitter emitter;
};
