#include "CamsimProcess.h"

#include "BuildPaths.h"
#include "ChildProcess.h"

#include <QDeadlineTimer>
#include <QEventLoop>
#include <QFile>
#include <QNetworkAccessManager>
#include <QNetworkReply>
#include <QNetworkRequest>
#include <QRegularExpression>
#include <QTimer>

namespace {

const int START_TIMEOUT_MS = 5000;
const int CONTROL_TIMEOUT_MS = 3000;

} // namespace

CamsimProcess::CamsimProcess(const QStringList& arguments) {
    process.setProcessChannelMode(QProcess::ForwardedErrorChannel);
    endWithTestProcess(process);
    process.start(BuildPaths::bin(QStringLiteral("quenvar-camsim")),
                  QStringList{QStringLiteral("--listen"), host() + QStringLiteral(":0"),
                              QStringLiteral("--log"),
                              folder.filePath(QStringLiteral("requests.log"))} +
                      arguments);
    const QDeadlineTimer deadline(START_TIMEOUT_MS);
    while (!process.canReadLine() && !deadline.hasExpired() &&
           process.state() != QProcess::NotRunning)
        process.waitForReadyRead(static_cast<int>(deadline.remainingTime()));
    const QString line = QString::fromUtf8(process.readLine()).trimmed();
    const QRegularExpressionMatch match =
        QRegularExpression(QStringLiteral("^listening on https?://[^ ]+:(\\d+)$")).match(line);
    if (match.hasMatch())
        listeningPort = match.captured(1).toUShort();
    else
        failure = QStringLiteral("quenvar-camsim did not start: \"%1\"").arg(line);
}

CamsimProcess::~CamsimProcess() {
    process.kill();
    process.waitForFinished(START_TIMEOUT_MS);
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
        QUrl(QStringLiteral("http://%1:%2%3").arg(host()).arg(listeningPort).arg(target)));
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
