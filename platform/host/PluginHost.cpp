#include "PluginHost.h"

#include "HostFrameworkTools.h"
#include "HostLog.h"
#include "NullResponser.h"

#include <QDir>
#include <QJsonArray>
#include <QLibrary>
#include <QPluginLoader>

namespace {

QString fileName(const QString& path) {
    return QFileInfo(path).fileName();
}

QString pluginIdOf(const QJsonObject& metaData) {
    return metaData.value(QStringLiteral("MetaData"))
        .toObject()
        .value(QStringLiteral("PluginID"))
        .toString()
        .trimmed();
}

} // namespace

PluginHost::PluginHost()
    : mainThread(std::make_unique<QObject>())
    , pluginConnector(*this) {}

PluginHost::~PluginHost() {
    closeEventStreams();
    // Pending routed requests and their timers go first: they point at the plugin objects.
    mainThread.reset();
    for (auto plugin = loaded.rbegin(); plugin != loaded.rend(); ++plugin) {
        if (QPluginLoader* loader = (*plugin)->loader) {
            loader->unload();
            delete loader;
        }
    }
}

int PluginHost::loadFolder(const QString& folder) {
    const QDir dir(folder);
    if (!dir.exists()) {
        hostLog().print(
            KalbLogClient::Failure, __FILE__, __LINE__, "%s",
            qUtf8Printable(QStringLiteral("plugin folder %1 does not exist").arg(folder)));
        return 0;
    }
    int count = 0;
    for (const QFileInfo& entry : dir.entryInfoList(QDir::Files, QDir::Name)) {
        const QString path = entry.absoluteFilePath();
        if (!QLibrary::isLibrary(path))
            continue;
        auto loader = std::make_unique<QPluginLoader>(path);
        const QJsonObject metaData = loader->metaData();
        if (metaData.isEmpty()) {
            hostLog().print(KalbLogClient::Failure, __FILE__, __LINE__, "%s",
                            qUtf8Printable(QStringLiteral("skipping %1: not a Qt plugin (%2)")
                                               .arg(fileName(path), loader->errorString())));
            continue;
        }
        const QString iid = metaData.value(QStringLiteral("IID")).toString();
        if (iid != QStringLiteral(QUENVAR_PLUGIN_INTERFACE_IID)) {
            hostLog().print(
                KalbLogClient::Failure, __FILE__, __LINE__, "%s",
                qUtf8Printable(
                    QStringLiteral("skipping %1: its interface is \"%2\", not \"%3\"")
                        .arg(fileName(path), iid, QStringLiteral(QUENVAR_PLUGIN_INTERFACE_IID))));
            continue;
        }
        const QString id = pluginIdOf(metaData);
        if (id.isEmpty()) {
            hostLog().print(
                KalbLogClient::Failure, __FILE__, __LINE__, "%s",
                qUtf8Printable(QStringLiteral("skipping %1: its metadata has no PluginID")
                                   .arg(fileName(path))));
            continue;
        }
        if (const LoadedPlugin* other = plugin(id)) {
            hostLog().print(
                KalbLogClient::Failure, __FILE__, __LINE__, "%s",
                qUtf8Printable(QStringLiteral("skipping %1: PluginID %2 is already loaded from %3")
                                   .arg(fileName(path), id, fileName(other->origin))));
            continue;
        }
        QObject* instance = loader->instance();
        auto* object = qobject_cast<IPluginObjectBase*>(instance);
        if (!object) {
            hostLog().print(
                KalbLogClient::Failure, __FILE__, __LINE__, "%s",
                qUtf8Printable(QStringLiteral("skipping %1: %2")
                                   .arg(fileName(path),
                                        instance ? QStringLiteral("its instance does not implement "
                                                                  "the plugin interface")
                                                 : loader->errorString())));
            if (instance)
                loader->unload();
            continue;
        }
        auto entryRecord = std::make_unique<LoadedPlugin>();
        entryRecord->id = id;
        entryRecord->origin = path;
        entryRecord->metaData = metaData;
        entryRecord->object = object;
        entryRecord->loader = loader.release();
        if (admit(std::move(entryRecord)))
            ++count;
    }
    return count;
}

bool PluginHost::addPlugin(IPluginObjectBase* object, const QJsonObject& metaData,
                           const QString& origin) {
    const QString id = pluginIdOf(metaData);
    if (!object || id.isEmpty() || plugin(id))
        return false;
    auto entry = std::make_unique<LoadedPlugin>();
    entry->id = id;
    entry->origin = origin;
    entry->metaData = metaData;
    entry->object = object;
    return admit(std::move(entry));
}

bool PluginHost::admit(std::unique_ptr<LoadedPlugin> plugin) {
    const QJsonArray commands = plugin->metaData.value(QStringLiteral("MetaData"))
                                    .toObject()
                                    .value(QStringLiteral("Commands"))
                                    .toArray();
    for (const QJsonValue& command : commands) {
        const QString name = command.toString();
        if (name.isEmpty())
            continue;
        if (const LoadedPlugin* other = pluginServing(name)) {
            hostLog().print(
                KalbLogClient::Failure, __FILE__, __LINE__, "%s",
                qUtf8Printable(
                    QStringLiteral("plugin %1 also lists the command %2, which %3 serves")
                        .arg(plugin->id, name, other->id)));
            continue;
        }
        plugin->commands.append(name);
    }
    hostLog().print(KalbLogClient::Trace, __FILE__, __LINE__, "%s",
                    qUtf8Printable(QStringLiteral("loaded plugin %1 from %2, commands: %3")
                                       .arg(plugin->id, plugin->origin,
                                            plugin->commands.join(QLatin1Char(',')))));
    loaded.push_back(std::move(plugin));
    return true;
}

void PluginHost::start() {
    for (const auto& plugin : loaded) {
        tools.push_back(std::make_unique<HostFrameworkTools>(*this, plugin->id));
        if (!plugin->object->InitialPluginBase(tools.back().get()))
            hostLog().print(
                KalbLogClient::Failure, __FILE__, __LINE__, "%s",
                qUtf8Printable(
                    QStringLiteral("plugin %1 reported a failed initialisation").arg(plugin->id)));
    }
    for (const auto& plugin : loaded)
        plugin->object->AllPluginLoaded();
}

const LoadedPlugin* PluginHost::plugin(const QString& id) const {
    for (const auto& plugin : loaded) {
        if (plugin->id == id)
            return plugin.get();
    }
    return nullptr;
}

const LoadedPlugin* PluginHost::pluginServing(const QString& command) const {
    for (const auto& plugin : loaded) {
        if (plugin->commands.contains(command))
            return plugin.get();
    }
    return nullptr;
}

QList<const LoadedPlugin*> PluginHost::plugins() const {
    QList<const LoadedPlugin*> all;
    for (const auto& plugin : loaded)
        all.append(plugin.get());
    return all;
}

std::shared_ptr<EventQueue> PluginHost::openEventStream(const QString& subscriberId,
                                                        const RequestSenderInfo& sender) {
    auto queue = std::make_shared<EventQueue>();
    std::lock_guard<std::mutex> lock(subscriptionMutex);
    if (hub.attach(subscriberId, queue)) {
        hostLog().print(KalbLogClient::Trace, __FILE__, __LINE__, "%s",
                        qUtf8Printable(QStringLiteral("subscribing %1").arg(subscriberId)));
        NullResponser responser;
        for (const auto& plugin : loaded)
            plugin->object->SubscribeEventBlock(subscriberId, QString(), QVariant(), sender,
                                                responser);
    }
    return queue;
}

void PluginHost::closeEventStream(const QString& subscriberId,
                                  const std::shared_ptr<EventQueue>& queue) {
    std::lock_guard<std::mutex> lock(subscriptionMutex);
    if (hub.detach(subscriberId, queue)) {
        hostLog().print(KalbLogClient::Trace, __FILE__, __LINE__, "%s",
                        qUtf8Printable(QStringLiteral("unsubscribing %1").arg(subscriberId)));
        NullResponser responser;
        for (const auto& plugin : loaded)
            plugin->object->UnsubscribeEventBlock(subscriberId, QVariant(), responser);
    }
}

void PluginHost::closeEventStreams() {
    hub.closeAll();
}

QObject* PluginHost::context() const {
    return mainThread.get();
}

EventHub& PluginHost::events() {
    return hub;
}

HostPluginConnector& PluginHost::connector() {
    return pluginConnector;
}
