#pragma once

#include "camera/ICameraProxy.h"

#include <QList>
#include <QString>
#include <QVariant>

#include <functional>

// Records every camera operation; a test completes one later with an outcome and a payload that
// is handed to the operation's own callback type (a map, nothing, a variant or a string list).
class FakeCameraProxy : public ICameraProxy {
public:
    struct Call {
        QString operation;
        QVariantMap params;
        std::function<void(bool, const QVariant&)> complete;
    };

    void getPTZIdleAction(const QVariantMap& params,
                          const std::function<void(bool, const QVariantMap&)>& callback) override;
    void setPTZIdleAction(const QVariantMap& params,
                          const std::function<void(bool)>& callback) override;
    void getPTZTrackingType(const QVariantMap& params,
                            const std::function<void(bool, const QVariantMap&)>& callback) override;
    void setPTZTrackingType(const QVariantMap& params,
                            const std::function<void(bool)>& callback) override;
    void stopPTZMovement(const QVariantMap& params,
                         const std::function<void(bool)>& callback) override;
    void areaZoom(const QVariantMap& params, const std::function<void(bool)>& callback) override;
    void
    gotoSmartTrackingAdvPreset(const QVariantMap& params,
                               const std::function<void(bool, const QVariant&)>& callback) override;
    void getSmartTrackingAdvPresetList(
        const QVariantMap& params,
        const std::function<void(bool, QList<QString>)>& callback) override;

    QList<Call> calls;
};
