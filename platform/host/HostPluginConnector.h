#pragma once

#include "PluginFramework.h"

class PluginHost;

// Connects a signal of one plugin to a slot of another, by plugin id.
class HostPluginConnector : public IPluginConnector {
public:
    explicit HostPluginConnector(const PluginHost& host);

    // An unknown id or a failed connection is reported on standard error and returns false.
    bool ConnectPluginSignal(const QString& pluginId, const char* signal, const QObject* receiver,
                             const char* method, int connectionType) override;

private:
    const PluginHost& host;
};
