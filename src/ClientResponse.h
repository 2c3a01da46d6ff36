#pragma once

#include "PluginFramework.h"
#include "QuenvarExport.h"

#include <QString>
#include <QVariant>

// How the plugin answers its clients: the result code "0" on success and "-1" on failure, and
// always an empty message. Camera answers are handled; rule answers carry the flag of the host's
// reply.
class QUENVAR_EXPORT ClientResponse {
public:
    static const QString CODE_OK;
    static const QString CODE_FAILED;

    static const QString& code(bool ok) { return ok ? CODE_OK : CODE_FAILED; }
    // An empty callback is not called.
    static void send(const ResponseCallback& callback, bool handled, bool ok,
                     const QVariant& payload);
};
