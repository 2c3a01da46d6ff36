#pragma once

#include "ICameraProxy.h"
#include "ISimpleHTTPClient.h"
#include "QuenvarExport.h"

#include <QByteArray>

#include <memory>

// Camera control over the camera's HTTP CGI interface. Keeps no camera state: every operation
// carries the camera's address and credentials in its own parameter map, so one proxy serves every
// camera and may be used from any thread at once.
//
// Each operation calls its callback exactly once: from the client's reply callback, or, when the
// map's "port" lies outside 0..65535, before it returns, with false and nothing sent.
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
    void
    gotoSmartTrackingAdvPreset(const QVariantMap& params,
                               const std::function<void(bool, const QVariant&)>& callback) override;
    void getSmartTrackingAdvPresetList(
        const QVariantMap& params,
        const std::function<void(bool, QList<QString>)>& callback) override;

    // Must not race with operations: set it before the proxy is shared between threads.
    void setHTTPClient(std::shared_ptr<ISimpleHTTPClient> client);

private:
    // The area-zoom steps hold the client weakly, not the proxy: a proxy released mid-zoom is
    // never touched again, and its client (with what it has pending) goes with it as usual.
    using WeakClient = std::weak_ptr<ISimpleHTTPClient>;
    static void getRatio(const WeakClient& client, const QVariantMap& params,
                         const std::function<void(bool)>& callback);
    static void setCenterPosition(const WeakClient& client, const QVariantMap& params,
                                  double currentRatio, double maxRatio,
                                  const std::function<void(bool)>& callback);
    static void setRatio(const WeakClient& client, const QVariantMap& params, double currentRatio,
                         double maxRatio, const std::function<void(bool)>& callback);

    void postData(const QVariantMap& params, const QByteArray& data, const QString& path,
                  const std::function<void(bool)>& callback) const;

    // Parsers and body builders read only their argument, so reply callbacks need no proxy.
    static QVariantMap getPTZIdleActionData(const QByteArray& answer);
    static QByteArray ptzIdleActionData(const QVariantMap& params);
    static QVariantMap getPTZTrackingTypeData(const QByteArray& answer);
    static QByteArray ptzTrackingTypeData(const QVariantMap& params);
    static QList<QString> handleGetSmartTrackingAdvPresetList(const QByteArray& answer);

    std::shared_ptr<ISimpleHTTPClient> httpClient;
};
