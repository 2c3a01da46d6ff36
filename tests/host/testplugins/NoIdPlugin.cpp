// A plugin of the host's interface whose metadata lacks its PluginID.
#include "PluginFramework.h"

class NoIdPlugin : public IPluginObjectBase {
    Q_OBJECT
    Q_PLUGIN_METADATA(IID QUENVAR_PLUGIN_INTERFACE_IID FILE "NoIdPlugin.json")
    Q_INTERFACES(IPluginObjectBase)

public:
    bool InitialPluginBase(IFrameworkTools*) override { return true; }
    void Request(const QString&, const QVariant&, const RequestSenderInfo&,
                 ResponseCallback) override {}
    void RequestBlock(const QString&, const QVariant&, const RequestSenderInfo&,
                      IResponser&) override {}
    void SubscribeEventBlock(const QString&, const QString&, const QVariant&,
                             const RequestSenderInfo&, IResponser&) override {}
    void UnsubscribeEventBlock(const QString&, const QVariant&, IResponser&) override {}
};

#include "NoIdPlugin.moc"
