#pragma once

#include "PluginFramework.h"

// Framework tools with no connector, no request channel and an empty event emitter: enough to
// initialise the plugin for dispatch alone.
class NullFrameworkTools : public IFrameworkTools {
public:
    QString GetFrameworkVersion() const override { return QStringLiteral("bench"); }
    IPluginConnector* GetPluginConnector() override { return nullptr; }
    QVariantMap GetPluginMetaData(const QString&) const override { return {}; }
    IPluginRequestChannel* GetRequestChannel() override { return nullptr; }
    EventEmitter& GetEventEmitter() override { return emitter; }

private:
    EventEmitter emitter;
};
