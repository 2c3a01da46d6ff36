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
        QString operation;
        QVariantMap params;
        std::function<void(bool, const QVariant&)> complete;
    };

    void getPTZIdleAction(const QVariantMap& params,
                          const std::function<void(bool, const QVariantMap&)>& callback) override {
        record("getPTZIdleAction", params, callback);
    }
    void setPTZIdleAction(const QVariantMap& params,
                          const std::function<void(bool)>& callback) override {
        record("setPTZIdleAction", params, callback);
    }
    void
    getPTZTrackingType(const QVariantMap& params,
                       const std::function<void(bool, const QVariantMap&)>& callback) override {
        record("getPTZTrackingType", params, callback);
    }
    void setPTZTrackingType(const QVariantMap& params,
                            const std::function<void(bool)>& callback) override {
        record("setPTZTrackingType", params, callback);
    }
    void stopPTZMovement(const QVariantMap& params,
                         const std::function<void(bool)>& callback) override {
        record("stopPTZMovement", params, callback);
    }
    void areaZoom(const QVariantMap& params, const std::function<void(bool)>& callback) override {
        record("areaZoom", params, callback);
    }
    void gotoSmartTrackingAdvPreset(
        const QVariantMap& params,
        const std::function<void(bool, const QVariant&)>& callback) override {
        record("gotoSmartTrackingAdvPreset", params, callback);
    }
    void getSmartTrackingAdvPresetList(
        const QVariantMap& params,
        const std::function<void(bool, QList<QString>)>& callback) override {
        record("getSmartTrackingAdvPresetList", params, callback);
    }

    QList<Call> calls;
    std::function<void(const Call&)> onCall;

private:
    template <typename... Result>
    void record(const char* operation, const QVariantMap& params,
                const std::function<void(bool, Result...)>& callback) {
        calls.append({operation, params, [callback](bool ok, const QVariant& payload) {
                          callback(ok, qvariant_cast<std::decay_t<Result>>(payload)...);
                      }});
        if (onCall)
            onCall(calls.last());
    }
};
