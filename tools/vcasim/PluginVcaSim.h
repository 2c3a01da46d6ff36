#pragma once

#include "PluginFramework.h"

#include <QObject>

#include <mutex>

class LiveRuleWatcher;

// A stand-in for the host's VCA plugin. Its data folder, VCASIM_DIR, holds the answers:
// live/C.xml (and live/C.status, the result code) for "GetVCARules" of camera C,
// recording/T.xml (and recording/T.status) for "GetRecordingVCARules" at time T. Every request
// is appended to requests.log in the folder, and a new or changed live/C.xml emits
// vcaMetadataChanged(C).
class PluginVcaSim : public IPluginObjectBase {
    Q_OBJECT
    Q_PLUGIN_METADATA(IID QUENVAR_PLUGIN_INTERFACE_IID FILE "PluginVcaSim.json")
    Q_INTERFACES(IPluginObjectBase)

public:
    PluginVcaSim();
    ~PluginVcaSim() override;

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

signals:
    void vcaMetadataChanged(const QString& cameraID);

private:
    struct Answer {
        bool handled = true;
        QString code;
        QString message;
        QString text;
    };

    Answer answer(const QString& command, const QString& content);
    Answer answerFromFiles(const QString& subfolder, const QString& name) const;
    void logRequest(const QString& command, const QString& content);

    QString dataDir;
    std::mutex logMutex;
    LiveRuleWatcher* watcher = nullptr;
};
