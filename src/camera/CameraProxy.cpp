#include "CameraProxy.h"

#include "Wendrel.h"

CameraProxy::CameraProxy()
    : httpClient(std::make_shared<Wendrel>())
{
}
CameraProxy::CameraProxy(const CameraProxy& other) = default;
CameraProxy& CameraProxy::operator=(const CameraProxy& other) = default;
CameraProxy::~CameraProxy() = default;

void CameraProxy::getPTZIdleAction(const QVariantMap&,
                                   const std::function<void(bool, const QVariantMap&)>&)
{
}
void CameraProxy::setPTZIdleAction(const QVariantMap&, const std::function<void(bool)>&) {}
void CameraProxy::getPTZTrackingType(const QVariantMap&,
                                     const std::function<void(bool, const QVariantMap&)>&)
{
}
void CameraProxy::setPTZTrackingType(const QVariantMap&, const std::function<void(bool)>&) {}
void CameraProxy::stopPTZMovement(const QVariantMap&, const std::function<void(bool)>&) {}
void CameraProxy::areaZoom(const QVariantMap&, const std::function<void(bool)>&) {}
void CameraProxy::gotoSmartTrackingAdvPreset(const QVariantMap&,
                                             const std::function<void(bool, const QVariant&)>&)
{
}
void CameraProxy::getSmartTrackingAdvPresetList(const QVariantMap&,
                                                const std::function<void(bool, QList<QString>)>&)
{
}
void CameraProxy::setHTTPClient(std::shared_ptr<ISimpleHTTPClient> client)
{
    httpClient = std::move(client);
}
