// A plugin of the host's interface whose metadata lacks its PluginID.
#include "PluginFramework.h"

class NoIdPlugin : public QObject {
    Q_OBJECT
    Q_PLUGIN_METADATA(IID QUENVAR_PLUGIN_INTERFACE_IID FILE "NoIdPlugin.json")
};

#include "NoIdPlugin.moc"
