#include "ListeningProcess.h"

#include "ChildProcess.h"

#include <QCoreApplication>
#include <QDeadlineTimer>
#include <QFile>
#include <QRegularExpression>

namespace {

const int START_TIMEOUT_MS = 10000;

} // namespace

ListeningProcess::~ListeningProcess() {
    stop();
}

bool ListeningProcess::start(const QString& program, const QStringList& arguments,
                             const QProcessEnvironment& environment) {
    process.setProcessEnvironment(environment);
    process.setStandardErrorFile(folder.filePath(QStringLiteral("stderr.log")));
    endWithTestProcess(process);
    process.start(program, arguments);
    if (!process.waitForStarted(START_TIMEOUT_MS))
        return false;
    QDeadlineTimer deadline(START_TIMEOUT_MS);
    while (!process.canReadLine()) {
        if (deadline.hasExpired() || !process.waitForReadyRead(deadline.remainingTime()))
            return false;
    }
    const QString line = QString::fromUtf8(process.readLine()).trimmed();
    const QRegularExpressionMatch match =
        QRegularExpression(QStringLiteral("^listening on https?://.+:(\\d+)$")).match(line);
    listenPort = static_cast<quint16>(match.captured(1).toUInt());
    return match.hasMatch() && listenPort != 0;
}

quint16 ListeningProcess::port() const {
    return listenPort;
}

QString ListeningProcess::errorOutput() const {
    QFile file(folder.filePath(QStringLiteral("stderr.log")));
    return file.open(QIODevice::ReadOnly) ? QString::fromUtf8(file.readAll()) : QString();
}

bool ListeningProcess::waitForErrorOutput(const QString& text, int timeoutMs) const {
    QDeadlineTimer deadline(timeoutMs);
    while (!errorOutput().contains(text)) {
        if (deadline.hasExpired())
            return false;
        QCoreApplication::processEvents(QEventLoop::WaitForMoreEvents, 20);
    }
    return true;
}

int ListeningProcess::stop() {
    if (process.state() == QProcess::NotRunning)
        return process.exitStatus() == QProcess::NormalExit ? process.exitCode() : -1;
    process.terminate();
    if (!process.waitForFinished(START_TIMEOUT_MS)) {
        process.kill();
        process.waitForFinished();
        return -1;
    }
    return process.exitStatus() == QProcess::NormalExit ? process.exitCode() : -1;
}
