#pragma once

#include "camera/ICameraProxy.h"

#include <QList>
#include <QString>
#include <QVariant>

#include <functional>
#include <type_traits>

// Records every camera operation; a test completes one later with an outcome and a payload that
// is handed to the operation's own callback type (a map, nothing, a variant or a string list),
// or at once from onCall, which may also throw.
class FakeCameraProxy : public ICameraProxy {
public:
    struct Call {
        std::function<void(bool, const QVariant&)> complete;
    };

    void getPTZIdleAction(const QVariantMap&,
                          const std::function<void(bool, const QVariantMap&)>& callback) override {
        record(callback);
    }
    void setPTZIdleAction(const QVariantMap&, const std::function<void(bool)>& callback) override {
        record(callback);
    }
    void
    getPTZTrackingType(const QVariantMap&,
                       const std::function<void(bool, const QVariantMap&)>& callback) override {
        record(callback);
    }
    void setPTZTrackingType(const QVariantMap&,
                            const std::function<void(bool)>& callback) override {
        record(callback);
    }
    void stopPTZMovement(const QVariantMap&, const std::function<void(bool)>& callback) override {
        record(callback);
    }
    void areaZoom(const QVariantMap&, const std::function<void(bool)>& callback) override {
        record(callback);
    }
    void gotoSmartTrackingAdvPreset(
        const QVariantMap&, const std::function<void(bool, const QVariant&)>& callback) override {
        record(callback);
    }
    void getSmartTrackingAdvPresetList(
        const QVariantMap&, const std::function<void(bool, QList<QString>)>& callback) override {
        record(callback);
    }

    QList<Call> calls;
    std::function<void(const Call&)> onCall;

private:
    template <typename... Result>
    void record(const std::function<void(bool, Result...)>& callback) {
        calls.append({[callback](bool ok, const QVariant& payload) {
            callback(ok, qvariant_cast<std::decay_t<Result>>(payload)...);
        }});
        if (onCall)
            onCall(calls.last());
    }
};
