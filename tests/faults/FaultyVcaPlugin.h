#pragma once

#include "PluginFramework.h"

#include <QList>

// A VCA plugin that misbehaves as the request asks: a camera or location identifier holding
// "silent" is never answered, "garbage" is answered with text that is no XML, and "twice" is
// answered twice, first for the camera or location "first", then for "second".
class FaultyVcaPlugin : public IPluginObjectBase {
    Q_OBJECT

public:
    bool InitialPluginBase(IFrameworkTools*) override { return true; }
    void Request(const QString& command, const QVariant& params, const RequestSenderInfo& sender,
                 ResponseCallback callback) override;
    void RequestBlock(const QString&, const QVariant&, const RequestSenderInfo&,
                      IResponser&) override {}
    void SubscribeEventBlock(const QString&, const QString&, const QVariant&,
                             const RequestSenderInfo&, IResponser&) override {}
    void UnsubscribeEventBlock(const QString&, const QVariant&, IResponser&) override {}

signals:
    void vcaMetadataChanged(const QString& cameraID);

private:
    QList<ResponseCallback> unanswered;
};
