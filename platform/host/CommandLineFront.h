#pragma once

#include "PluginFramework.h"

// quenvar-host request: one client request, its answer as one line of JSON on standard output.
class CommandLineFront {
public:
    static const int EXIT_ANSWERED = 0;
    static const int EXIT_NOT_ANSWERED = 3;

    explicit CommandLineFront(IPluginObjectBase& plugin);

    // Runs the application's event loop until the answer comes or timeoutMs passes, or at once
    // when the plugin drops the request; returns the exit status.
    int run(const QString& command, const QVariant& params, int timeoutMs);

private:
    IPluginObjectBase& plugin;
};
