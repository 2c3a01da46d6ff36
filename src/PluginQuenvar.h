#pragma once

#include "PluginFramework.h"
#include "QuenvarExport.h"

#include <QObject>

#include <memory>

class DeliveryGate;
class ICameraProxy;
class OpenRequests;
class SubscriberList;
class VcaRuleRetriever;

// The plugin's root object: the Qt plugin instance the host loads, initialises and then calls
// for every client request and subscription.
class QUENVAR_EXPORT PluginQuenvar : public IPluginObjectBase {
    Q_OBJECT
    Q_PLUGIN_METADATA(IID QUENVAR_PLUGIN_INTERFACE_IID FILE "PluginQuenvar.json")
    Q_INTERFACES(IPluginObjectBase)

public:
    PluginQuenvar();
    ~PluginQuenvar() override;

    bool InitialPluginBase(IFrameworkTools* tools) override;
    void Request(const QString& command, const QVariant& params, const RequestSenderInfo& sender,
                 ResponseCallback callback) override;
    void RequestBlock(const QString& command, const QVariant& params,
                      const RequestSenderInfo& sender, IResponser& responser) override;
    void SubscribeEventBlock(const QString& subscriberId, const QString& eventName,
                             const QVariant& params, const RequestSenderInfo& sender,
                             IResponser& responser) override;
    void UnsubscribeEventBlock(const QString& subscriberId, const QVariant& params,
                               IResponser& responser) override;
    void AllPluginLoaded() override;

    // Substitute a service after initialisation, while no request is being dispatched.
    void setCameraProxy(std::shared_ptr<ICameraProxy> proxy);
    void setVcaRuleRetriever(std::shared_ptr<VcaRuleRetriever> retriever);

    // Fetches the camera's live rules and pushes them to every subscriber.
    void handleVCAMetadataChanged(const QString& cameraID);

public slots:
    // Starts the fetch 2000 ms later, in this object's thread.
    void vcaMetadataChanged(const QString& cameraID);

private:
    std::shared_ptr<VcaRuleRetriever> vcaRuleRetriever;
    std::shared_ptr<ICameraProxy> cameraProxy;
    std::shared_ptr<SubscriberList> subscribers;
    // Shared with pending events: once this object is gone they deliver nothing.
    std::shared_ptr<DeliveryGate> gate;
    // Shared with the operations under way: the destructor answers what they have not, and
    // nothing they answer later reaches a client.
    std::shared_ptr<OpenRequests> requests;
    IPluginConnector* pluginConnector = nullptr;
};
