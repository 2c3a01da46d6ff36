// The plugin server's framework contract: what a plugin implements for the host and what it may
// call on the host's tools. Slot orders matter: hosts and plugins are built separately.
#pragma once

#include <QObject>
#include <QString>
#include <QVariant>

#include <functional>

#define QUENVAR_PLUGIN_INTERFACE_IID "com.MERIDOX.PluginServer.PluginInterface"

// Answer channel of IPluginObjectBase::Request: (handled, result code, message, payload).
using ResponseCallback = std::function<void(bool, const QString&, const QString&, const QVariant&)>;

class PluginObjBase_EventInfoBase {
public:
    virtual ~PluginObjBase_EventInfoBase() = default;

    qint64 timestamp = 0; // milliseconds since the epoch
    QString eventName;
    QVariant eventData;
};

class PluginObjBase_EventSignalInfo : public PluginObjBase_EventInfoBase {
public:
    QString sourcePluginId;
    QString subscriberId;
};

// Called once per delivered event; the record lives only during the call.
using EventEmitter = std::function<void(PluginObjBase_EventInfoBase*)>;

// Answer to an inter-plugin request: (success, message, relayPath, statusCode, replyText, flag).
using PluginReplyCallback =
    std::function<void(bool, const QString&, const QString&, const QString&, const QString&, bool)>;

// Lives only during IPluginRequestChannel::SendRequest; the host copies what it keeps.
struct PluginRequestInfo {
    bool flag = false;
    qint32 timeoutMs = 0;
    QString content;
    QString extra;
    PluginReplyCallback callback;
};

// Who sent a request; filled by the host's fronts.
struct RequestSenderInfo {
    QString senderId;
    QString address;
};

// Answer channel of the blocking operations.
class IResponser {
public:
    virtual ~IResponser() = default;
    virtual void Respond(bool handled, const QString& code, const QString& message,
                         const QVariant& payload) = 0;
};

class IPluginConnector {
public:
    virtual ~IPluginConnector() = default;
    // signal and method carry Qt's SIGNAL()/SLOT() encoding ("2..." and "1...").
    virtual bool ConnectPluginSignal(const QString& pluginId, const char* signal,
                                     const QObject* receiver, const char* method,
                                     int connectionType) = 0;
};

class IPluginRequestChannel {
public:
    using Context = void*; // opaque to plugins

    virtual ~IPluginRequestChannel() = default;
    virtual Context GetRequestContext() = 0;
    // Answers info.callback exactly once, later, on a thread of the host's choosing.
    virtual bool SendRequest(const QString& pluginID, Context context, int kind,
                             const QString& command, PluginRequestInfo& info) = 0;
};

class IFrameworkTools {
public:
    virtual ~IFrameworkTools() = default;
    virtual QString GetFrameworkVersion() const = 0;
    virtual IPluginConnector* GetPluginConnector() = 0;
    virtual QVariantMap GetPluginMetaData(const QString& pluginId) const = 0;
    virtual IPluginRequestChannel* GetRequestChannel() = 0;
    virtual EventEmitter& GetEventEmitter() = 0;
};

class IPluginObjectBase : public QObject {
public:
    using QObject::QObject;
    ~IPluginObjectBase() override = default;

    virtual bool InitialPluginBase(IFrameworkTools* tools) = 0;
    virtual void Request(const QString& command, const QVariant& params,
                         const RequestSenderInfo& sender, ResponseCallback callback) = 0;
    virtual void RequestBlock(const QString& command, const QVariant& params,
                              const RequestSenderInfo& sender, IResponser& responser) = 0;
    virtual void SubscribeEventBlock(const QString& subscriberId, const QString& eventName,
                                     const QVariant& params, const RequestSenderInfo& sender,
                                     IResponser& responser) = 0;
    virtual void UnsubscribeEventBlock(const QString& subscriberId, const QVariant& params,
                                       IResponser& responser) = 0;
    virtual void PluginStarted() {}
    virtual void AllPluginLoaded() {}
    virtual void PluginStopping() {}
    virtual void SettingsChanged() {}
    virtual QVariant QueryStatus(const QString& key) {
        Q_UNUSED(key);
        return {};
    }
    virtual void Heartbeat() {}
};

Q_DECLARE_INTERFACE(IPluginObjectBase, QUENVAR_PLUGIN_INTERFACE_IID)
