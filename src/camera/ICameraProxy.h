#pragma once

#include <QList>
#include <QString>
#include <QVariant>
#include <QVariantMap>

#include <functional>

// Camera control. Each operation takes the request's parameter map (with the camera's connection
// parameters "host", "port", "user", "pass", "useSSL"), starts the work and returns at once; the
// callback is called later, once, with the operation's success first.
class ICameraProxy {
public:
    virtual ~ICameraProxy() = default;
    virtual void
    getPTZIdleAction(const QVariantMap& params,
                     const std::function<void(bool, const QVariantMap&)>& callback) = 0;
    virtual void setPTZIdleAction(const QVariantMap& params,
                                  const std::function<void(bool)>& callback) = 0;
    virtual void
    getPTZTrackingType(const QVariantMap& params,
                       const std::function<void(bool, const QVariantMap&)>& callback) = 0;
    virtual void setPTZTrackingType(const QVariantMap& params,
                                    const std::function<void(bool)>& callback) = 0;
    virtual void stopPTZMovement(const QVariantMap& params,
                                 const std::function<void(bool)>& callback) = 0;
    virtual void areaZoom(const QVariantMap& params, const std::function<void(bool)>& callback) = 0;
    virtual void
    gotoSmartTrackingAdvPreset(const QVariantMap& params,
                               const std::function<void(bool, const QVariant&)>& callback) = 0;
    virtual void
    getSmartTrackingAdvPresetList(const QVariantMap& params,
                                  const std::function<void(bool, QList<QString>)>& callback) = 0;
};
