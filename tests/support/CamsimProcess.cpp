#include "CamsimProcess.h"

#include "BuildPaths.h"

#include <QEventLoop>
#include <QFile>
#include <QNetworkAccessManager>
#include <QNetworkReply>
#include <QNetworkRequest>
#include <QTimer>

namespace {

const int CONTROL_TIMEOUT_MS = 3000;

} // namespace

CamsimProcess::CamsimProcess(const QStringList& arguments) {
    process.start(BuildPaths::bin(QStringLiteral("quenvar-camsim")),
                  QStringList{QStringLiteral("--listen"), host() + QStringLiteral(":0"),
                              QStringLiteral("--log"),
                              folder.filePath(QStringLiteral("requests.log"))} +
                      arguments);
}

std::vector<std::string> CamsimProcess::logLines() const {
    QFile file(folder.filePath(QStringLiteral("requests.log")));
    std::vector<std::string> lines;
    if (file.open(QIODevice::ReadOnly)) {
        for (const QByteArray& line : file.readAll().split('\n')) {
            if (!line.isEmpty())
                lines.push_back(line.toStdString());
        }
    }
    return lines;
}

std::string CamsimProcess::state() const {
    return exchange("GET", QStringLiteral("/_sim/state")).body.toStdString();
}

bool CamsimProcess::setFault(const QByteArray& form) const {
    return exchange("POST", QStringLiteral("/_sim/fault"), form,
                    {{"Content-Type", "application/x-www-form-urlencoded"}})
               .status == 200;
}

CamsimProcess::Answer CamsimProcess::exchange(const QByteArray& method, const QString& target,
                                              const QByteArray& body,
                                              const Headers& headers) const {
    QNetworkAccessManager network;
    QNetworkRequest request(
        QUrl(QStringLiteral("http://%1:%2%3").arg(host()).arg(port()).arg(target)));
    for (const auto& header : headers)
        request.setRawHeader(header.first, header.second);
    QNetworkReply* reply = network.sendCustomRequest(request, method, body);
    QEventLoop loop;
    QObject::connect(reply, &QNetworkReply::finished, &loop, &QEventLoop::quit);
    QTimer::singleShot(CONTROL_TIMEOUT_MS, &loop, &QEventLoop::quit);
    loop.exec();
    Answer answer;
    if (reply->isFinished()) {
        answer.status = reply->attribute(QNetworkRequest::HttpStatusCodeAttribute).toInt();
        answer.challenge = reply->rawHeader("WWW-Authenticate");
        answer.body = reply->readAll();
    }
    delete reply;
    return answer;
}
