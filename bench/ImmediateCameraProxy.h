#pragma once

#include "camera/ICameraProxy.h"

// Completes every operation at once, successfully: what remains is the dispatcher's own cost.
class ImmediateCameraProxy : public ICameraProxy {
public:
    void getPTZIdleAction(const QVariantMap&,
                          const std::function<void(bool, const QVariantMap&)>& callback) override {
        callback(true, result);
    }
    void setPTZIdleAction(const QVariantMap&, const std::function<void(bool)>& callback) override {
        callback(true);
    }
    void
    getPTZTrackingType(const QVariantMap&,
                       const std::function<void(bool, const QVariantMap&)>& callback) override {
        callback(true, result);
    }
    void setPTZTrackingType(const QVariantMap&,
                            const std::function<void(bool)>& callback) override {
        callback(true);
    }
    void stopPTZMovement(const QVariantMap&, const std::function<void(bool)>& callback) override {
        callback(true);
    }
    void areaZoom(const QVariantMap&, const std::function<void(bool)>& callback) override {
        callback(true);
    }
    void gotoSmartTrackingAdvPreset(
        const QVariantMap&, const std::function<void(bool, const QVariant&)>& callback) override {
        callback(true, QVariant());
    }
    void getSmartTrackingAdvPresetList(
        const QVariantMap&, const std::function<void(bool, QList<QString>)>& callback) override {
        callback(true, {});
    }

private:
    const QVariantMap result;
};
