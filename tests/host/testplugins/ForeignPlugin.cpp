// A Qt plugin of another host's interface.
#include <QObject>
#include <QtPlugin>

class ForeignPlugin : public QObject {
    Q_OBJECT
    Q_PLUGIN_METADATA(IID "org.example.OtherHost.Interface" FILE "ForeignPlugin.json")
};

#include "ForeignPlugin.moc"
