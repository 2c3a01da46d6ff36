#include "CameraFuzzing.h"

#include <QCoreApplication>

#include <cstdlib>

namespace {

// Never destroyed: at exit, Qt's own statics may already be gone.
QCoreApplication* application = nullptr;
CameraProxy* cameraProxy = nullptr;
AnsweringHttpClient::Answer firstAnswer;
QStringList requested;

} // namespace

void CameraFuzzing::initialise(int* argc, char*** argv) {
    application = new QCoreApplication(*argc, *argv);
    cameraProxy = new CameraProxy();
    cameraProxy->setHTTPClient(std::make_shared<AnsweringHttpClient>([](const QString& path) {
        requested.append(path);
        return requested.size() == 1 ? firstAnswer : AnsweringHttpClient::Answer();
    }));
}

CameraProxy& CameraFuzzing::proxy() {
    return *cameraProxy;
}

void CameraFuzzing::prepare(QNetworkReply::NetworkError outcome, const QByteArray& body) {
    firstAnswer = {outcome, body};
    requested.clear();
}

QStringList CameraFuzzing::paths() {
    return requested;
}

QVariantMap CameraFuzzing::params() {
    return {{QStringLiteral("host"), QStringLiteral("10.0.0.5")},
            {QStringLiteral("port"), 80},
            {QStringLiteral("user"), QStringLiteral("admin")},
            {QStringLiteral("pass"), QStringLiteral("secret")},
            {QStringLiteral("useSSL"), false},
            {QStringLiteral("nodeID"), QStringLiteral("node1")},
            {QStringLiteral("zoomCenterX"), 320},
            {QStringLiteral("zoomCenterY"), 240},
            {QStringLiteral("viewCellWidth"), 640},
            {QStringLiteral("viewCellHeight"), 480},
            {QStringLiteral("resolutionWidth"), 1920},
            {QStringLiteral("resolutionHeight"), 1080},
            {QStringLiteral("zoomRatio"), 1.5}};
}

void CameraFuzzing::expectOneCall(int calls) {
    if (calls != 1)
        std::abort();
}
