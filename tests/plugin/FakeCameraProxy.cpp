#include "FakeCameraProxy.h"

void FakeCameraProxy::getPTZIdleAction(
    const QVariantMap& params, const std::function<void(bool, const QVariantMap&)>& callback) {
    calls.append({QStringLiteral("getPTZIdleAction"), params,
                  [callback](bool ok, const QVariant& payload) { callback(ok, payload.toMap()); }});
}

void FakeCameraProxy::setPTZIdleAction(const QVariantMap& params,
                                       const std::function<void(bool)>& callback) {
    calls.append({QStringLiteral("setPTZIdleAction"), params,
                  [callback](bool ok, const QVariant&) { callback(ok); }});
}

void FakeCameraProxy::getPTZTrackingType(
    const QVariantMap& params, const std::function<void(bool, const QVariantMap&)>& callback) {
    calls.append({QStringLiteral("getPTZTrackingType"), params,
                  [callback](bool ok, const QVariant& payload) { callback(ok, payload.toMap()); }});
}

void FakeCameraProxy::setPTZTrackingType(const QVariantMap& params,
                                         const std::function<void(bool)>& callback) {
    calls.append({QStringLiteral("setPTZTrackingType"), params,
                  [callback](bool ok, const QVariant&) { callback(ok); }});
}

void FakeCameraProxy::stopPTZMovement(const QVariantMap& params,
                                      const std::function<void(bool)>& callback) {
    calls.append({QStringLiteral("stopPTZMovement"), params,
                  [callback](bool ok, const QVariant&) { callback(ok); }});
}

void FakeCameraProxy::areaZoom(const QVariantMap& params,
                               const std::function<void(bool)>& callback) {
    calls.append({QStringLiteral("areaZoom"), params,
                  [callback](bool ok, const QVariant&) { callback(ok); }});
}

void FakeCameraProxy::gotoSmartTrackingAdvPreset(
    const QVariantMap& params, const std::function<void(bool, const QVariant&)>& callback) {
    calls.append({QStringLiteral("gotoSmartTrackingAdvPreset"), params, callback});
}

void FakeCameraProxy::getSmartTrackingAdvPresetList(
    const QVariantMap& params, const std::function<void(bool, QList<QString>)>& callback) {
    calls.append(
        {QStringLiteral("getSmartTrackingAdvPresetList"), params,
         [callback](bool ok, const QVariant& payload) { callback(ok, payload.toStringList()); }});
}
