#pragma once

#include "EventHub.h"
#include "HostPluginConnector.h"
#include "LoadedPlugin.h"

#include <QObject>

#include <memory>
#include <mutex>
#include <vector>

class HostFrameworkTools;

// The plugin server: loads the plugins, initialises them with framework tools of its own, finds
// them by id or by command, and keeps the event subscriptions of its fronts. Lives in the main
// thread, which must run a Qt event loop; lookups and event streams may be used from any thread
// once start() has run.
class PluginHost {
public:
    PluginHost();
    ~PluginHost(); // destroys the plugin objects, last loaded first
    PluginHost(const PluginHost&) = delete;
    PluginHost& operator=(const PluginHost&) = delete;

    // Loads every module of folder that is a Qt plugin of the host's interface with a
    // "PluginID"; anything else that looks like a library is skipped with a message. Returns
    // how many were loaded.
    int loadFolder(const QString& folder);
    // Adds a plugin object created elsewhere, which the host does not own.
    bool addPlugin(IPluginObjectBase* object, const QJsonObject& metaData, const QString& origin);
    // InitialPluginBase on every plugin, then AllPluginLoaded on every plugin.
    void start();

    const LoadedPlugin* plugin(const QString& id) const;
    const LoadedPlugin* pluginServing(const QString& command) const;
    QList<const LoadedPlugin*> plugins() const;

    // Opens an event stream for subscriberId; the plugins hear of the subscriber when its first
    // stream opens and of its leave when its last one closes.
    std::shared_ptr<EventQueue> openEventStream(const QString& subscriberId,
                                                const RequestSenderInfo& sender);
    void closeEventStream(const QString& subscriberId, const std::shared_ptr<EventQueue>& queue);
    // Ends every event stream, so that their threads can finish.
    void closeEventStreams();

    // An object in the main thread, for queued calls and timers.
    QObject* context() const;
    EventHub& events();
    HostPluginConnector& connector();

private:
    bool admit(std::unique_ptr<LoadedPlugin> plugin);

    std::unique_ptr<QObject> mainThread;
    EventHub hub;
    HostPluginConnector pluginConnector;
    std::vector<std::unique_ptr<LoadedPlugin>> loaded;
    std::vector<std::unique_ptr<HostFrameworkTools>> tools;
    // Keeps subscribe and unsubscribe calls to the plugins in the order of the table's changes.
    std::mutex subscriptionMutex;
};
