#pragma once

#include "ICameraProxy.h"
#include "ISimpleHTTPClient.h"
#include "QuenvarExport.h"

#include <memory>

// Camera control over the camera's HTTP CGI interface. Keeps no camera state: every operation
// carries the camera's address and credentials in its own parameter map.
class QUENVAR_EXPORT CameraProxy : public ICameraProxy {
public:
    CameraProxy();
    CameraProxy(const CameraProxy& other);
    CameraProxy& operator=(const CameraProxy& other);
    ~CameraProxy() override;

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
    void gotoSmartTrackingAdvPreset(
        const QVariantMap& params,
        const std::function<void(bool, const QVariant&)>& callback) override;
    void getSmartTrackingAdvPresetList(
        const QVariantMap& params,
        const std::function<void(bool, QList<QString>)>& callback) override;

    void setHTTPClient(std::shared_ptr<ISimpleHTTPClient> client);

private:
    std::shared_ptr<ISimpleHTTPClient> httpClient;
};
