#include "ListeningProcess.h"

#include <QDeadlineTimer>
#include <QFile>
#include <QRegularExpression>

#if defined(Q_OS_LINUX)
#include <csignal>
#include <sys/prctl.h>
#endif

namespace {

const int START_TIMEOUT_MS = 10000;

} // namespace

bool ListeningProcess::start(const QString& program, const QStringList& arguments,
                             const QProcessEnvironment& environment) {
    process.setProcessEnvironment(environment);
    process.setStandardErrorFile(folder.filePath(QStringLiteral("stderr.log")));
#if defined(Q_OS_LINUX)
    process.setChildProcessModifier([] { prctl(PR_SET_PDEATHSIG, SIGKILL); });
#endif
    process.start(program, arguments);
    const QRegularExpressionMatch match =
        QRegularExpression(QStringLiteral("^listening on https?://.+:(\\d+)$"))
            .match(readLine(START_TIMEOUT_MS));
    listenPort = static_cast<quint16>(match.captured(1).toUInt());
    return listenPort != 0;
}

QString ListeningProcess::readLine(int timeoutMs) {
    const QDeadlineTimer deadline(timeoutMs);
    while (!process.canReadLine()) {
        if (deadline.hasExpired() || !process.waitForReadyRead(deadline.remainingTime()))
            return QString();
    }
    return QString::fromUtf8(process.readLine()).trimmed();
}

QString ListeningProcess::errorOutput() const {
    QFile file(folder.filePath(QStringLiteral("stderr.log")));
    return file.open(QIODevice::ReadOnly) ? QString::fromUtf8(file.readAll()) : QString();
}

int ListeningProcess::stop() {
    if (process.state() != QProcess::NotRunning) {
        process.terminate();
        if (!process.waitForFinished(START_TIMEOUT_MS)) {
            process.kill();
            process.waitForFinished();
            return -1;
        }
    }
    return process.exitStatus() == QProcess::NormalExit ? process.exitCode() : -1;
}
