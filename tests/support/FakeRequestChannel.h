#pragma once

#include "PluginFramework.h"

#include <QList>

#include <mutex>

// Records every request sent to another plugin; a test answers one through its copied callback.
class FakeRequestChannel : public IPluginRequestChannel {
public:
    struct Sent {
        QString pluginID;
        Context context = nullptr;
        int kind = 0;
        QString command;
        PluginRequestInfo info;
    };

    Context GetRequestContext() override { return contextValue(); }
    bool SendRequest(const QString& pluginID, Context context, int kind, const QString& command,
                     PluginRequestInfo& info) override;

    QList<Sent> sent() const;
    int count() const { return static_cast<int>(sent().size()); }
    // Calls the callback of the index-th request with the six reply arguments.
    void reply(int index, bool success, const QString& message, const QString& relayPath,
               const QString& statusCode, const QString& replyText, bool flag) const;

    // What GetRequestContext hands out; SendRequest should receive it back.
    static Context contextValue() {
        static int tag;
        return &tag;
    }

private:
    mutable std::mutex mutex;
    QList<Sent> requests;
};
