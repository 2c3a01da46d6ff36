#pragma once

#include "PluginFramework.h"

#include <atomic>

class PluginHost;

// A plugin's channel to the other plugins: routes each command to the plugin whose metadata
// lists it under "Commands". Every request is answered through its record's callback exactly
// once and never from within SendRequest: with the answering plugin's answer, with "80000102"
// when the record's time-out passes first, or with "80000404" when no plugin serves the command.
// SendRequest may be called from any thread; the target's Request and the time-out run in the
// host's main thread.
class HostRequestChannel : public IPluginRequestChannel {
public:
    static const int DEFAULT_TIMEOUT_MS = 30000; // for a record without a positive time-out

    HostRequestChannel(PluginHost& host, const QString& ownerId);

    // A number counting this channel's requests, for the traces.
    Context GetRequestContext() override;
    bool SendRequest(const QString& pluginID, Context context, int kind, const QString& command,
                     PluginRequestInfo& info) override;

private:
    PluginHost& host;
    QString ownerId;
    std::atomic<quintptr> sequence{0};
};
